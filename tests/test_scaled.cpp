// Scaled decoding: the reduced transforms and entropy decoders at 1/2, 1/4,
// 1/8 and 3/8, the DC-only decimation beyond 1/8, and the choice of the
// reduction.
#include <gtest/gtest.h>

#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "drivers/decode.h"
#include "drivers/init.h"
#include "drivers/scaled.h"
#include "recon/idct.h"
#include "support/files.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

struct Decoded {
  int ok = 0;
  int out_w = 0, out_h = 0;
  std::vector<uint8_t> buf;
};

// Decodes into a buffer of exactly width x height in the given format with
// the stretch fit, so the output is the reduced picture itself when the
// size is a reduction of the picture.
Decoded decode_to(const std::vector<uint8_t>& jpeg, int format, int width, int height,
                  int mode = 0, uint32_t extra_options = 0) {
  Decoded out;
  DecInfo* o = KOLVAVETA_CreateDecInfo(
      1, const_cast<uint8_t*>(jpeg.data()), static_cast<uint32_t>(jpeg.size()), format,
      KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH | extra_options);
  if (o == nullptr) return out;
  KOLVAVETA_SetDecMode(o, mode);
  out.buf.assign(size_t(width) * height * 4 + 64, 0xAA);
  out.ok = KOLVAVETA_DecodeJPEG(o, out.buf.data(), width, height);
  out.out_w = o->output_width;
  out.out_h = o->output_height;
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
  return out;
}

// The same through the frame decoder itself, which keeps the decode mode
// whatever the picture size (the public call resets it below 1024).
Decoded decode_frame(const std::vector<uint8_t>& jpeg, int format, int width, int height,
                     int mode) {
  Decoded out;
  DecInfo* o = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg.data()),
                                       static_cast<uint32_t>(jpeg.size()), format,
                                       KOLVAVETA_OPT_FIT_STRETCH);
  if (o == nullptr) return out;
  o->decode_mode = mode;
  StreamWindow w;
  if (vj::window_open(&w, o->stream)) {
    out.buf.assign(size_t(width) * height * 4 + 64, 0xAA);
    out.ok = VETAJ_DecodeFrame(o, &w, out.buf.data(), width, height);
    out.out_w = o->output_width;
    out.out_h = o->output_height;
    vj::window_close(&w);
  }
  KOLVAVETA_DestroyDecInfo(o);
  return out;
}

TEST(ScaledHelpers, Arithmetic) {
  EXPECT_EQ(GCD(12, 18), 6u);
  EXPECT_EQ(GCD(7, 0), 7u);
  EXPECT_EQ(LCM(4, 6), 12u);
  EXPECT_EQ(VETAJ_GetGCD(-12, 0), 12);
  EXPECT_EQ(VETAJ_GetGCD(-12, 18), 6);
  EXPECT_EQ(round_up_pow2(33, 32), 64u);
  EXPECT_EQ(round_up_pow2(32, 32), 32u);
}

#if VETAJ_HAVE_LIBJPEG

std::vector<std::string> scalable_fixtures() {
  return vjtest::fixtures_where([](const std::string&, const vjtest::OracleHeader& h) {
    return !h.progressive && (h.jpeg_color_space == 3 || h.jpeg_color_space == 1) &&
           h.width >= 16 && h.height >= 16;
  });
}

class ScaledLuma : public ::testing::TestWithParam<std::string> {};

// Compares our luma plane (planar output of exactly the reduced size) with
// a reference plane over the reduced size.
void expect_same_luma(const std::string& name, const Decoded& d, int w, int h,
                      const vjtest::OraclePlanes& ref) {
  ASSERT_EQ(d.ok, 1) << name;
  ASSERT_EQ(d.out_w, w);
  ASSERT_EQ(d.out_h, h);
  for (int y = 0; y < h; ++y)
    for (int x = 0; x < w; ++x)
      ASSERT_EQ(d.buf[size_t(y) * w + x], ref.at(x, y, 0))
          << name << " at " << x << "," << y << " of " << w << "x" << h;
}

// 1/8 keeps the DC alone: exactly libjpeg-turbo's 1/8 output. 1/2 and 1/4
// keep the zig-zag ranges 0..18 and 0..4: exactly libjpeg-turbo's reduced
// transforms applied to coefficients truncated the same way.
TEST_P(ScaledLuma, MatchesTheReferenceAtEveryReduction) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  struct Case {
    int shift;
    int keep;
  } cases[] = {{1, 18}, {2, 4}, {3, 0}};
  for (const Case& c : cases) {
    const int w = h.width >> c.shift, hh = h.height >> c.shift;
    if (w < 2 || hh < 2) continue;
    vjtest::OraclePlanes ref;
    if (c.shift == 3) {
      ASSERT_TRUE(vjtest::oracle_planes(jpeg, 8, &ref));
    } else {
      ASSERT_TRUE(vjtest::oracle_truncated_planes(jpeg, c.keep, 1 << c.shift, &ref));
    }
    expect_same_luma(GetParam(), decode_to(jpeg, KOLVAVETA_FMT_YUV420, w, hh), w, hh, ref);
    // The fastest mode always takes 1/8.
    if (c.shift == 3) {
      expect_same_luma(GetParam(), decode_to(jpeg, KOLVAVETA_FMT_YUV420, w, hh, 4), w, hh, ref);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, ScaledLuma, ::testing::ValuesIn(scalable_fixtures()),
                         vjtest::fixture_test_name);

// 3/8 (decode modes 2 and 3): the 3x3 transform of the coefficients up to
// zig-zag index 8, with multipliers that carry the AAN factors, blocks 3
// samples apart.
TEST(ScaledDecoding, ThreeEighthsFollowsItsTransform) {
  const auto jpeg = vjtest::read_fixture("base_444_q90_64x48.jpg");
  ASSERT_FALSE(jpeg.empty());
  std::vector<vjtest::OracleComponent> coefs;
  ASSERT_TRUE(vjtest::oracle_coefficients(jpeg, &coefs));
  const auto& y = coefs[0];
  // Mode 2 steps the 1/2 reduction of this request on to 3/8: 24 x 18.
  const int w = 64 * 3 / 8, h = 48 * 3 / 8;
  const auto d = decode_frame(jpeg, KOLVAVETA_FMT_YUV420, w, h, 2);
  ASSERT_EQ(d.ok, 1);
  uint8_t table[kRangeLimitBytes];
  const uint8_t* centre = vj_range_limit_centre(vj_fill_range_limit(table));
  uint32_t mult[64];
  vj_build_aan_multipliers(y.quant, mult);
  static const int kZig[9] = {0, 1, 8, 16, 9, 2, 3, 10, 17};
  for (int by = 0; by < y.height_in_blocks; ++by) {
    for (int bx = 0; bx < y.width_in_blocks; ++bx) {
      int16_t block[64] = {};
      for (int k : kZig) block[k] = y.block(by, bx)[k];
      uint8_t out[3][3];
      uint8_t* rows[3] = {out[0], out[1], out[2]};
      VETAJ_DoIdct_8to3(centre, mult, block, rows, 0);
      for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 3; ++c) {
          const int px = bx * 3 + c, py = by * 3 + r;
          if (px < w && py < h) {
            ASSERT_EQ(d.buf[size_t(py) * w + px], out[r][c]) << px << "," << py;
          }
        }
    }
  }
}

// Beyond 1/8 each kept block gives one sample from its DC value (the 1/8
// value). At 1/16 a 4:2:0 picture averages the DC values of 2 x 2 MCUs;
// grey pictures keep every other MCU column of every other MCU row.
TEST(ScaledDecoding, DcOnlyDecimationBeyondOneEighth) {
  const auto jpeg = vjtest::read_fixture("base_420_q90_1024x768.jpg");
  const auto grey = vjtest::read_fixture("grey_q80_1023x17.jpg");
  ASSERT_FALSE(jpeg.empty());
  uint8_t table[kRangeLimitBytes];
  const uint8_t* centre = vj_range_limit_centre(vj_fill_range_limit(table));
  auto dc_sample = [&](int dc, int q) {
    int16_t block[64] = {};
    block[0] = static_cast<int16_t>(dc);
    uint32_t mult[64] = {};
    mult[0] = static_cast<uint32_t>(q);
    uint8_t v;
    uint8_t* row = &v;
    VETAJ_DoIdct_1x1(centre, mult, block, &row, 0);
    return v;
  };
  {
    std::vector<vjtest::OracleComponent> coefs;
    ASSERT_TRUE(vjtest::oracle_coefficients(jpeg, &coefs));
    const auto& y = coefs[0];
    // Mode 2 steps the 1/8 reduction of this size on to 1/16.
    const int w = 1024 >> 4, h = 768 >> 4;
    const auto d = decode_frame(jpeg, KOLVAVETA_FMT_YUV420, w, h, 2);
    ASSERT_EQ(d.ok, 1);
    for (int py = 0; py < h; ++py) {
      for (int px = 0; px < w; ++px) {
        // Sample (px, py) is block position (px & 1, py & 1) of the MCU pair
        // (px / 2, py / 2): the average of that block in 2 x 2 MCUs.
        const int mx = (px / 2) * 2, my = (py / 2) * 2;
        int sum = 0;
        for (int dy = 0; dy < 2; ++dy)
          for (int dx = 0; dx < 2; ++dx)
            sum += (y.block((my + dy) * 2 + (py & 1), (mx + dx) * 2 + (px & 1))[0] + 2) >> 2;
        ASSERT_EQ(d.buf[size_t(py) * w + px], dc_sample(sum, y.quant[0])) << px << "," << py;
      }
    }
  }
  {
    std::vector<vjtest::OracleComponent> coefs;
    ASSERT_TRUE(vjtest::oracle_coefficients(grey, &coefs));
    const auto& g = coefs[0];
    // Grey at 1/16 (mode 2 from 1/8): runs of one used MCU column and one
    // passed over; column x holds the DC of the last used column c with
    // (8 * c) >> 4 == x.
    const int shift = 4, k = 1;
    const int w = 1023 >> shift;
    const auto e = decode_frame(grey, KOLVAVETA_FMT_YUV420, w, 17 >> shift, 2);
    ASSERT_EQ(e.ok, 1);
    std::vector<int> expect(static_cast<size_t>(w) + 1, -1);
    int run = 0;
    for (int c = 0; c < g.width_in_blocks; ++c) {
      if (run == k) {
        run = 0;
        continue;
      }
      ++run;
      const int x = (8 * c) >> shift;
      if (x < w) expect[static_cast<size_t>(x)] = dc_sample(g.block(0, c)[0], g.quant[0]);
    }
    for (int x = 0; x < w; ++x)
      if (expect[static_cast<size_t>(x)] >= 0) {
        ASSERT_EQ(e.buf[static_cast<size_t>(x)], expect[static_cast<size_t>(x)]) << x;
      }
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// The reduction follows the output size; modes 2, 3 and 4 take faster
// steps; progressive frames never use 3/8 or go beyond 1/8.
TEST(ScaledDecoding, DecodeModesChooseTheReduction) {
  const auto jpeg = vjtest::read_fixture("base_420_q90_1024x768.jpg");
  ASSERT_FALSE(jpeg.empty());
  struct Case {
    int w, h, mode;
    int shift, num;
  } cases[] = {
      {128, 96, 0, 3, 1},  {256, 192, 0, 2, 1},  {512, 384, 0, 1, 1}, {513, 385, 0, 0, 1},
      {512, 384, 2, 3, 3}, {1024, 768, 2, 1, 1}, {256, 192, 2, 3, 1}, {128, 96, 2, 4, 1},
      {1024, 768, 3, 3, 3}, {512, 384, 3, 2, 1}, {1024, 768, 4, 3, 1}, {64, 48, 0, 3, 1},
  };
  for (const Case& c : cases) {
    DecInfo* o = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg.data()),
                                         static_cast<uint32_t>(jpeg.size()), 7,
                                         KOLVAVETA_OPT_THUMB_NEVER);
    ASSERT_NE(o, nullptr);
    o->decode_mode = c.mode;
    StreamWindow w;
    ASSERT_TRUE(vj::window_open(&w, o->stream));
    std::vector<uint8_t> buf(size_t(c.w) * c.h * 4);
    OutputRequest req{0, 0, buf.data(), c.w, c.h};
    DecoderInfo* d = VETAJ_Initialize(o, &w, &req);
    ASSERT_NE(d, nullptr);
    EXPECT_EQ(d->scale_shift, static_cast<uint32_t>(c.shift)) << c.w << "x" << c.h << " mode " << c.mode;
    EXPECT_EQ(d->scale_num, static_cast<uint32_t>(c.num)) << c.w << "x" << c.h << " mode " << c.mode;
    VETAJ_DeleteDecoderInfo(d);
    KOLVAVETA_OsFree(d);
    vj::window_close(&w);
    KOLVAVETA_DestroyDecInfo(o);
  }
}

// Every scale, with restart markers and damaged data, never reads or writes
// outside its buffers (sanitizer builds), and fails only by result.
TEST(ScaledDecoding, DamagedDataAtEveryScale) {
  std::vector<std::string> names = {"base_420_opt_rst4_q92_63x65.jpg", "base_444_q90_64x48.jpg",
                                    "grey_rst2_q85_63x65.jpg", "base_422_q90_64x48.jpg"};
  std::mt19937 rng(77);
  for (const auto& name : names) {
    const auto jpeg = vjtest::read_fixture(name);
    if (jpeg.empty()) continue;
    for (int variant = 0; variant < 12; ++variant) {
      auto v = jpeg;
      if (variant % 2 == 0) {
        v.resize(v.size() * (4 + variant) / 18);
      } else {
        for (int k = 0; k < 6; ++k) v[v.size() / 3 + rng() % (v.size() * 2 / 3)] ^= uint8_t(1u << (rng() % 8));
      }
      for (int shift = 1; shift <= 6; ++shift) {
        const int w = std::max(1, 64 >> shift), h = std::max(1, 48 >> shift);
        (void)decode_to(v, shift % 2 ? KOLVAVETA_FMT_RGBA8888 : KOLVAVETA_FMT_RGB565, w, h,
                        shift > 3 ? 2 : 0);
      }
      (void)decode_to(v, KOLVAVETA_FMT_YUV420, 24, 18, 3);
    }
  }
}

}  // namespace
