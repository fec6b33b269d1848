// Progressive (and multi-scan sequential) decoding against libjpeg-turbo and
// references built from the scans the decoder keeps.
#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "entropy/bitreader.h"
#include "platform/common.h"
#include "support/decoding.h"
#include "support/files.h"
#include "support/segments.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

using vjtest::Bytes;

vjtest::Decoded decode(const Bytes& jpeg, int format, int width, int height) {
  return vjtest::decode_bytes(jpeg,
                              {.format = format,
                               .width = width,
                               .height = height,
                               .options = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH});
}

// Scan headers of a stream: offset of the SOS marker, Ss, Se and the frame
// indexes of the components.
struct ScanHeader {
  size_t sos = 0;
  int ss = 0, se = 0;
  std::vector<int> comps;
};

std::vector<ScanHeader> scan_headers(const Bytes& j) {
  std::vector<ScanHeader> out;
  std::vector<int> ids;
  for (size_t i = 2; i + 4 < j.size();) {
    const uint8_t m = j[i + 1];
    if (j[i] != 0xFF || m == 0xFF || m == 0x00 || (m >= 0xD0 && m <= 0xD7)) {  // entropy data
      i += j[i] == 0xFF && m != 0xFF ? 2 : 1;
      continue;
    }
    if (m == 0xD9) break;
    if (m == 0xC0 || m == 0xC2)
      for (int c = 0; c < j[i + 9]; ++c) ids.push_back(j[i + 10 + 3 * c]);
    if (m == 0xDA) {
      const int ns = j[i + 4];
      ScanHeader h{i, j[i + 5 + 2 * ns], j[i + 6 + 2 * ns], {}};
      for (int c = 0; c < ns; ++c)
        h.comps.push_back(int(std::find(ids.begin(), ids.end(), j[i + 5 + 2 * c]) - ids.begin()));
      out.push_back(h);
    }
    i += 2 + ((size_t(j[i + 2]) << 8) | j[i + 3]);
  }
  return out;
}

#if VETAJ_HAVE_LIBJPEG

// The stream cut after its first n scans.
Bytes first_scans(const Bytes& j, size_t n) {
  const auto scans = scan_headers(j);
  if (n >= scans.size()) return j;
  Bytes out(j.begin(), j.begin() + long(scans[n].sos));
  out.insert(out.end(), {0xFF, 0xD9});
  return out;
}

// Scans the decoder keeps (never more than 30): until every component has a
// scan reaching past zig-zag index `limit`, the last coefficient the reduced
// transform reads.
size_t scans_kept(const std::vector<ScanHeader>& scans, int limit, int components) {
  std::vector<bool> covered(size_t(components), false);
  for (size_t s = 0; s < scans.size() && s < 30; ++s) {
    for (int c : scans[s].comps) covered[size_t(c)] = covered[size_t(c)] || scans[s].se > limit;
    if (std::all_of(covered.begin(), covered.end(), [](bool c) { return c; })) return s + 1;
  }
  return std::min<size_t>(scans.size(), 30);
}

std::vector<std::string> progressive_fixtures() {
  return vjtest::fixtures_where(
      [](const std::string&, const vjtest::OracleHeader& h) { return h.progressive != 0; });
}

vjtest::ColourAt ycc_samples(const vjtest::OraclePlanes& p) {
  return [&p](int x, int y) {
    return vjtest::Colour{true, p.at(x, y, 0), p.at(x, y, 1), p.at(x, y, 2)};
  };
}

class Progressive : public ::testing::TestWithParam<std::string> {};

// The luma plane (at full size the chroma too) equals libjpeg-turbo's
// accurate output of the scans kept: at full size the first 30, at 1/2 and
// 1/4 those the reduced transform needs, at 1/8 the DC values of the first
// scan when it carries every component.
TEST_P(Progressive, FollowsTheScansKeptAtEveryScale) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  const auto scans = scan_headers(jpeg);
  ASSERT_FALSE(scans.empty());
  const int limits[4] = {63, 18, 5, 0};
  for (int shift = 0; shift <= 3; ++shift) {
    const int w = h.width >> shift, hh = h.height >> shift;
    if (w < 2 || hh < 2) continue;
    const bool dc_first = scans[0].ss == 0 && int(scans[0].comps.size()) == h.num_components;
    const size_t kept =
        shift == 3 && dc_first ? 1 : scans_kept(scans, limits[shift], h.num_components);
    vjtest::OraclePlanes ref;
    ASSERT_TRUE(vjtest::oracle_planes(first_scans(jpeg, kept), 1 << shift, &ref));
    const auto d = decode(jpeg, KOLVAVETA_FMT_YUV420, w, hh);
    ASSERT_EQ(d.ok, 1) << shift;
    EXPECT_TRUE(vjtest::same_luma(d.buffer, w, hh, ref))
        << "1/" << (1 << shift) << ", " << kept << " scans";
    if (shift == 0 && h.jpeg_color_space == 3) {  // full size keeps the chroma samples too
      EXPECT_TRUE(vjtest::shows(d, vjtest::Placement::centred(KOLVAVETA_FMT_YUV420, w, hh, w, hh),
                                ycc_samples(ref)));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, Progressive, ::testing::ValuesIn(progressive_fixtures()),
                         vjtest::fixture_test_name);

// A sequential frame split into one scan per component decodes through the
// same scan walk.
TEST(ProgressiveDecoding, SequentialFramesWithOneScanPerComponent) {
  for (const char* name : {"base_420_q75_64x48.jpg", "base_422_rst2_q80_63x65.jpg", "sample.jpg"}) {
    Bytes jpeg;
    ASSERT_TRUE(vjtest::oracle_sequential_scans(vjtest::read_fixture(name), &jpeg)) << name;
    ASSERT_EQ(scan_headers(jpeg).size(), 3u);
    vjtest::OraclePlanes p;
    ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
    const auto d = decode(jpeg, KOLVAVETA_FMT_RGBA8888, p.width, p.height);
    EXPECT_TRUE(vjtest::shows(
        d, vjtest::Placement::centred(KOLVAVETA_FMT_RGBA8888, p.width, p.height, p.width, p.height),
        ycc_samples(p)))
        << name;
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// A caller stream is read whole on a progressive frame and decodes as the
// same bytes in memory do, also a second time, with or without rewinding.
TEST(ProgressiveDecoding, CallerStreamDecodesLikeMemory) {
  vjtest::CallbackSource src{vjtest::read_fixture("prog_420_q90_640x480.jpg")};
  const auto mem = decode(src.data, KOLVAVETA_FMT_RGBA8888, 64, 48);
  ASSERT_EQ(mem.ok, 1);
  for (bool rewind : {true, false}) {
    src.pos = 0;
    DecInfo* o = KOLVAVETA_CreateDecInfoWithStream(
        &src, uint32_t(src.data.size()), vjtest::CallbackSource::read, vjtest::CallbackSource::skip,
        rewind ? vjtest::CallbackSource::rewind : nullptr, KOLVAVETA_FMT_RGBA8888,
        KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH);
    ASSERT_NE(o, nullptr);
    for (int pass = 0; pass < 2; ++pass) {
      std::vector<uint8_t> buf(mem.buffer.size(), vjtest::kFill);
      EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, buf.data(), 64, 48), 1) << pass;
      EXPECT_EQ(buf, mem.buffer) << pass;
    }
    KOLVAVETA_DestroyDecInfo(o);
  }
}

// Memory stays at one MCU row of coefficients: a 640x480 picture needs far
// less than its whole coefficient buffer (640 x 480 x 1.5 x 2 bytes).
TEST(ProgressiveDecoding, MemoryStaysAtOneRowOfCoefficients) {
  const auto jpeg = vjtest::read_fixture("prog_420_q90_640x480.jpg");
  ASSERT_FALSE(jpeg.empty());
  std::vector<uint8_t> buf(640 * 480 * 4);
  auto o = vjtest::open_memory(jpeg);
  vj::reset_allocation_peak();
  const size_t before = vj::allocation_peak();
  ASSERT_EQ(KOLVAVETA_DecodeJPEG(o.get(), buf.data(), 640, 480), 1);
  const size_t used = vj::allocation_peak() - before;
  EXPECT_LT(used, size_t(640) * 480 * 3 / 4) << used;  // a quarter of the coefficients
  EXPECT_GT(used, size_t(640) * 16 * 3);               // at least one row of coefficients
}

// Damaged progressive data: bad spectral bands, refinements without a first
// pass, values overflowing 16 bits, truncation, bit flips and stray end
// markers never reach outside the workspace (sanitizer builds) and fail only
// by result; the fast and careful fetch policies give the same result.
TEST(ProgressiveDecoding, DamagedScansAreSurvived) {
  std::mt19937 rng(5);
  for (const auto& name : vjtest::list_fixtures(".jpg")) {
    const auto jpeg = vjtest::read_fixture(name);
    if (name.rfind("prog_", 0) != 0 || jpeg.size() > 20000) continue;
    std::vector<Bytes> variants;
    for (int i = 1; i < 8; ++i)
      variants.emplace_back(jpeg.begin(), jpeg.begin() + long(jpeg.size() * i / 8));
    for (int i = 0; i < 6; ++i) {
      variants.push_back(jpeg);
      for (int k = 0; k < 4; ++k)
        variants.back()[jpeg.size() / 4 + rng() % (jpeg.size() * 3 / 4)] ^=
            uint8_t(1u << (rng() % 8));
    }
    for (size_t at = jpeg.size() / 3; at + 2 < jpeg.size(); at += jpeg.size() / 5) {
      variants.push_back(jpeg);
      variants.back()[at] = 0xFF, variants.back()[at + 1] = 0xD9;
    }
    // Scan headers rewritten: Ss > Se, Al and Ah raised, components changed.
    for (const auto& sh : scan_headers(jpeg)) {
      const size_t params = sh.sos + 5 + 2 * size_t(jpeg[sh.sos + 4]);
      for (const auto& edits :
           {std::vector<std::pair<int, int>>{{0, 40}, {1, 20}}, {{2, 0xDD}}, {{2, 0x0D}}}) {
        variants.push_back(jpeg);
        for (const auto& [offset, value] : edits)
          variants.back()[params + size_t(offset)] = uint8_t(value);
      }
    }
    for (const auto& v : variants)
      for (int shift = 0; shift <= 3; ++shift) {
        const int format = shift % 2 ? KOLVAVETA_FMT_RGB565 : KOLVAVETA_FMT_RGBA8888;
        const auto fast = decode(v, format, 64 >> shift, 48 >> shift);
        vj::g_entropy_careful_only = true;
        const auto careful = decode(v, format, 64 >> shift, 48 >> shift);
        vj::g_entropy_careful_only = false;
        ASSERT_EQ(fast.ok, careful.ok) << name;
        ASSERT_EQ(fast.buffer, careful.buffer) << name;
      }
  }
}

}  // namespace
