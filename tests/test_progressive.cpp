// Progressive (and multi-scan sequential) decoding against libjpeg-turbo and
// references built from the scans the decoder keeps.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "platform/common.h"
#include "support/files.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

struct Decoded {
  int ok = 0;
  std::vector<uint8_t> buf;
};

Decoded decode(const std::vector<uint8_t>& jpeg, int format, int width, int height,
               uint32_t options = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH) {
  Decoded out;
  DecInfo* o = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg.data()),
                                       static_cast<uint32_t>(jpeg.size()), format, options);
  if (o == nullptr) return out;
  out.buf.assign(size_t(width) * height * 4 + 64, 0xAA);
  out.ok = KOLVAVETA_DecodeJPEG(o, out.buf.data(), width, height);
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
  return out;
}

#if VETAJ_HAVE_LIBJPEG

std::vector<std::string> progressive_fixtures() {
  return vjtest::fixtures_where(
      [](const std::string&, const vjtest::OracleHeader& h) { return h.progressive != 0; });
}

class Progressive : public ::testing::TestWithParam<std::string> {};

// Full size: the luma plane equals libjpeg-turbo's accurate output (files of
// more than 30 scans are compared only where the decoder keeps every scan).
TEST_P(Progressive, FullSizeLumaMatchesLibjpeg) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  if (GetParam().find("33scans") != std::string::npos) GTEST_SKIP() << "more than 30 scans";
  vjtest::OraclePlanes p;
  ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
  const auto d = decode(jpeg, KOLVAVETA_FMT_YUV420, h.width, h.height);
  ASSERT_EQ(d.ok, 1);
  for (int y = 0; y < h.height; ++y)
    for (int x = 0; x < h.width; ++x)
      ASSERT_EQ(d.buf[size_t(y) * h.width + x], p.at(x, y, 0)) << x << "," << y;
}

INSTANTIATE_TEST_SUITE_P(Corpus, Progressive, ::testing::ValuesIn(progressive_fixtures()),
                         vjtest::fixture_test_name);

// Scan headers of a stream: Ss, Se and the frame indexes of the components.
struct ScanHeader {
  size_t sos = 0;  // offset of the SOS marker
  int ss = 0, se = 0;
  std::vector<int> comps;
};

std::vector<ScanHeader> scan_headers(const std::vector<uint8_t>& j) {
  std::vector<ScanHeader> out;
  std::vector<int> ids;
  for (size_t i = 2; i + 4 < j.size();) {
    if (j[i] != 0xFF) {
      ++i;
      continue;
    }
    const uint8_t m = j[i + 1];
    if (m == 0xFF || m == 0x00 || (m >= 0xD0 && m <= 0xD7)) {
      i += m == 0xFF ? 1 : 2;
      continue;
    }
    if (m == 0xD9) break;
    const size_t len = (size_t(j[i + 2]) << 8) | j[i + 3];
    if (m == 0xC0 || m == 0xC2) {
      for (int c = 0; c < j[i + 9]; ++c) ids.push_back(j[i + 10 + 3 * c]);
    }
    if (m == 0xDA) {
      ScanHeader h;
      h.sos = i;
      const int ns = j[i + 4];
      for (int c = 0; c < ns; ++c)
        for (size_t f = 0; f < ids.size(); ++f)
          if (ids[f] == j[i + 5 + 2 * c]) h.comps.push_back(static_cast<int>(f));
      h.ss = j[i + 5 + 2 * ns];
      h.se = j[i + 6 + 2 * ns];
      out.push_back(h);
    }
    i += 2 + len;
  }
  return out;
}

// The stream cut after its first n scans.
std::vector<uint8_t> first_scans(const std::vector<uint8_t>& j, size_t n) {
  const auto scans = scan_headers(j);
  if (n >= scans.size()) return j;
  std::vector<uint8_t> out(j.begin(), j.begin() + static_cast<long>(scans[n].sos));
  out.push_back(0xFF);
  out.push_back(0xD9);
  return out;
}

// Scans the decoder keeps at a reduction: until every component has a scan
// reaching past the coefficients the reduced transform reads.
size_t scans_kept(const std::vector<uint8_t>& j, int limit, int components) {
  const auto scans = scan_headers(j);
  std::vector<bool> covered(static_cast<size_t>(components), false);
  for (size_t s = 0; s < scans.size() && s < 30; ++s) {
    if (scans[s].se > limit)
      for (int c : scans[s].comps) covered[static_cast<size_t>(c)] = true;
    bool all = true;
    for (bool c : covered) all = all && c;
    if (all) return s + 1;
  }
  return std::min<size_t>(scans.size(), 30);
}

// At 1/2 and 1/4 the reduced transform of the coefficients of the scans
// kept; at 1/8 the DC values of the first scan (or, when it does not carry
// every component, of the scans kept).
TEST_P(Progressive, ReducedSizesFollowTheScansKept) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  const auto scans = scan_headers(jpeg);
  ASSERT_FALSE(scans.empty());
  struct Case {
    int shift;
  } cases[] = {{1}, {2}, {3}};
  for (const Case& c : cases) {
    const int w = h.width >> c.shift, hh = h.height >> c.shift;
    if (w < 2 || hh < 2) continue;
    size_t kept;
    if (c.shift == 3 && scans[0].ss == 0 && static_cast<int>(scans[0].comps.size()) == h.num_components) {
      kept = 1;
    } else {
      kept = scans_kept(jpeg, c.shift == 1 ? 18 : c.shift == 2 ? 5 : 0, h.num_components);
    }
    vjtest::OraclePlanes ref;
    ASSERT_TRUE(vjtest::oracle_planes(first_scans(jpeg, kept), 1 << c.shift, &ref));
    const auto d = decode(jpeg, KOLVAVETA_FMT_YUV420, w, hh);
    ASSERT_EQ(d.ok, 1) << c.shift;
    for (int y = 0; y < hh; ++y)
      for (int x = 0; x < w; ++x)
        ASSERT_EQ(d.buf[size_t(y) * w + x], ref.at(x, y, 0))
            << "1/" << (1 << c.shift) << " at " << x << "," << y << ", " << kept << " scans";
  }
}

// More than 30 scans: the first 30 are decoded.
TEST(ProgressiveDecoding, OnlyTheFirstThirtyScansAreDecoded) {
  const auto jpeg = vjtest::read_fixture("prog_custom_33scans_420_q90_64x48.jpg");
  ASSERT_FALSE(jpeg.empty());
  ASSERT_GT(scan_headers(jpeg).size(), 30u);
  vjtest::OraclePlanes thirty, all;
  ASSERT_TRUE(vjtest::oracle_planes(first_scans(jpeg, 30), 1, &thirty));
  ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &all));
  const auto d = decode(jpeg, KOLVAVETA_FMT_YUV420, 64, 48);
  ASSERT_EQ(d.ok, 1);
  int differs = 0;
  for (int y = 0; y < 48; ++y)
    for (int x = 0; x < 64; ++x) {
      ASSERT_EQ(d.buf[size_t(y) * 64 + x], thirty.at(x, y, 0)) << x << "," << y;
      differs += thirty.at(x, y, 0) != all.at(x, y, 0);
    }
  EXPECT_GT(differs, 0);  // the rule is visible in this file
}

// A sequential frame split into one scan per component decodes through the
// same scan walk.
TEST(ProgressiveDecoding, SequentialFramesWithOneScanPerComponent) {
  for (const char* name : {"base_420_q90_64x48.jpg", "base_444_rst1_q90_48x32.jpg", "sample.jpg"}) {
    const auto src = vjtest::read_fixture(name);
    if (src.empty()) continue;
    std::vector<uint8_t> jpeg;
    ASSERT_TRUE(vjtest::oracle_sequential_scans(src, &jpeg));
    vjtest::OracleHeader h;
    ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
    ASSERT_EQ(scan_headers(jpeg).size(), 3u);
    vjtest::OraclePlanes p;
    ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
    const auto d = decode(jpeg, KOLVAVETA_FMT_RGBA8888, h.width, h.height);
    ASSERT_EQ(d.ok, 1) << name;
    for (int y = 0; y < h.height; ++y)
      for (int x = 0; x < h.width; ++x) {
        const int yy = p.at(x, y, 0), cr = p.at(x, y, 2) - 128;
        const int r = std::clamp(yy + ((91881 * cr) >> 16), 0, 255);
        ASSERT_EQ(d.buf[(size_t(y) * h.width + x) * 4], r) << name << " " << x << "," << y;
      }
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// A caller stream is read whole on a progressive frame and decodes as the
// same bytes in memory do.
struct Source {
  const std::vector<uint8_t>* data;
  size_t pos = 0;
};
int32_t src_read(void* s, void* buf, uint32_t n) {
  auto* src = static_cast<Source*>(s);
  const size_t k = std::min<size_t>(n, src->data->size() - src->pos);
  std::memcpy(buf, src->data->data() + src->pos, k);
  src->pos += k;
  return static_cast<int32_t>(k);
}
int32_t src_skip(void* s, void*, uint32_t n) {
  auto* src = static_cast<Source*>(s);
  src->pos = std::min(src->data->size(), src->pos + n);
  return static_cast<int32_t>(src->pos);
}
int32_t src_rewind(void* s, void*, uint32_t) {
  static_cast<Source*>(s)->pos = 0;
  return 0;
}

TEST(ProgressiveDecoding, CallerStreamDecodesLikeMemory) {
  for (const char* name : {"prog_420_q90_640x480.jpg", "prog_grey_q85_64x48.jpg"}) {
    const auto jpeg = vjtest::read_fixture(name);
    ASSERT_FALSE(jpeg.empty());
    const int w = 64, h = 48;
    const auto mem = decode(jpeg, KOLVAVETA_FMT_RGBA8888, w, h);
    ASSERT_EQ(mem.ok, 1);
    for (bool rewind : {true, false}) {
      Source src{&jpeg};
      DecInfo* o = KOLVAVETA_CreateDecInfoWithStream(
          &src, static_cast<uint32_t>(jpeg.size()), src_read, src_skip,
          rewind ? src_rewind : nullptr, KOLVAVETA_FMT_RGBA8888,
          KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH);
      ASSERT_NE(o, nullptr);
      std::vector<uint8_t> buf(mem.buf.size(), 0xAA);
      ASSERT_EQ(KOLVAVETA_DecodeJPEG(o, buf.data(), w, h), 1) << name;
      EXPECT_EQ(buf, mem.buf) << name;
      // The object now reads its own copy: a second decode works as well.
      std::vector<uint8_t> again(mem.buf.size(), 0xAA);
      EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, again.data(), w, h), 1);
      EXPECT_EQ(again, mem.buf);
      KOLVAVETA_DestroyDecInfo(o);
    }
  }
}

// Memory stays at one MCU row of coefficients: a 640x480 picture needs far
// less than its whole coefficient buffer (640 x 480 x 1.5 x 2 bytes).
TEST(ProgressiveDecoding, MemoryStaysAtOneRowOfCoefficients) {
  const auto jpeg = vjtest::read_fixture("prog_420_q90_640x480.jpg");
  ASSERT_FALSE(jpeg.empty());
  std::vector<uint8_t> buf(640 * 480 * 4);
  DecInfo* o = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg.data()),
                                       static_cast<uint32_t>(jpeg.size()), 7,
                                       KOLVAVETA_OPT_THUMB_NEVER);
  vj::reset_allocation_peak();
  const size_t before = vj::allocation_peak();
  ASSERT_EQ(KOLVAVETA_DecodeJPEG(o, buf.data(), 640, 480), 1);
  const size_t used = vj::allocation_peak() - before;
  KOLVAVETA_DestroyDecInfo(o);
  EXPECT_LT(used, size_t(640) * 480 * 3 / 4) << used;  // a quarter of the coefficients
  EXPECT_GT(used, size_t(640) * 16 * 3);               // at least one row of coefficients
}

// Damaged progressive data: bad spectral bands, refinements without a first
// pass, values overflowing 16 bits, truncation and bit flips never reach
// outside the workspace (sanitizer builds) and fail only by result.
TEST(ProgressiveDecoding, DamagedScansAreSurvived) {
  std::mt19937 rng(5);
  for (const auto& name : vjtest::list_fixtures(".jpg")) {
    if (name.rfind("prog_", 0) != 0) continue;
    const auto jpeg = vjtest::read_fixture(name);
    if (jpeg.size() > 20000) continue;
    std::vector<std::vector<uint8_t>> variants;
    for (int i = 1; i < 8; ++i) variants.emplace_back(jpeg.begin(), jpeg.begin() + static_cast<long>(jpeg.size() * i / 8));
    for (int i = 0; i < 6; ++i) {
      auto v = jpeg;
      for (int k = 0; k < 4; ++k) v[jpeg.size() / 4 + rng() % (jpeg.size() * 3 / 4)] ^= uint8_t(1u << (rng() % 8));
      variants.push_back(v);
    }
    // Scan headers rewritten: Ss > Se, Al and Ah raised, components changed.
    for (const auto& sh : scan_headers(jpeg)) {
      const size_t ns = jpeg[sh.sos + 4];
      const size_t params = sh.sos + 5 + 2 * ns;
      auto a = jpeg;
      a[params] = 40;
      a[params + 1] = 20;
      variants.push_back(a);
      auto b = jpeg;
      b[params + 2] = 0xDD;
      variants.push_back(b);
      auto c = jpeg;
      c[params + 2] = 0x0D;
      variants.push_back(c);
    }
    for (const auto& v : variants) {
      for (int shift = 0; shift <= 3; ++shift) {
        const int w = std::max(1, 64 >> shift), h = std::max(1, 48 >> shift);
        (void)decode(v, shift % 2 ? KOLVAVETA_FMT_RGB565 : KOLVAVETA_FMT_RGBA8888, w, h);
      }
    }
  }
}

}  // namespace
