// Scaled decoding: the reduced transforms and entropy decoders at 1/2, 1/4,
// 1/8 and 3/8, the DC-only decimation beyond 1/8, and the choice of the
// reduction.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "drivers/decode.h"
#include "drivers/init.h"
#include "recon/idct.h"
#include "support/decoding.h"
#include "support/files.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

using vjtest::Bytes;
using vjtest::Decoded;

// Decodes into a buffer of exactly width x height with the stretch fit, so
// the output is the reduced picture itself when the size is a reduction.
Decoded decode_to(const Bytes& jpeg, int format, int width, int height, int mode = KOLVAVETA_MODE_BEST) {
  return vjtest::decode_bytes(jpeg, {.format = format, .width = width, .height = height,
                                     .options = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH,
                                     .mode = mode});
}

// The same through the frame decoder itself, which keeps the decode mode
// whatever the picture size (the public call resets it below 1024).
Decoded decode_frame(const Bytes& jpeg, int width, int height, int mode) {
  Decoded out;
  auto o = vjtest::open_memory(jpeg, KOLVAVETA_FMT_YUV420, KOLVAVETA_OPT_FIT_STRETCH);
  StreamWindow w;
  if (o == nullptr || !vj::window_open(&w, o->stream)) return out;
  o->decode_mode = mode;
  out.buffer.assign(size_t(width) * height * 4, 0xAA);
  out.ok = VETAJ_DecodeFrame(o.get(), &w, out.buffer.data(), width, height);
  vj::window_close(&w);
  return out;
}

#if VETAJ_HAVE_LIBJPEG

std::vector<std::string> scalable_fixtures() {
  return vjtest::fixtures_where([](const std::string&, const vjtest::OracleHeader& h) {
    return !h.progressive && (h.jpeg_color_space == 3 || h.jpeg_color_space == 1) &&
           h.width >= 16 && h.height >= 16;
  });
}

class ScaledLuma : public ::testing::TestWithParam<std::string> {};

// 1/8 keeps the DC alone: exactly libjpeg-turbo's 1/8 output (the fastest
// mode always takes it). 1/2 and 1/4 keep the zig-zag ranges 0..18 and 0..4:
// exactly libjpeg-turbo's reduced transforms of coefficients truncated the
// same way.
TEST_P(ScaledLuma, MatchesTheReferenceAtEveryReduction) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  const int keep[4] = {63, 18, 4, 63};
  for (int shift = 1; shift <= 3; ++shift) {
    const int w = h.width >> shift, hh = h.height >> shift;
    if (w < 2 || hh < 2) continue;
    vjtest::OraclePlanes ref;
    ASSERT_TRUE(vjtest::oracle_truncated_planes(jpeg, keep[shift], 1 << shift, &ref));
    for (int mode : {KOLVAVETA_MODE_BEST, KOLVAVETA_MODE_FASTEST}) {
      if (mode == KOLVAVETA_MODE_FASTEST && shift != 3) continue;
      const auto d = decode_to(jpeg, KOLVAVETA_FMT_YUV420, w, hh, mode);
      ASSERT_EQ(d.ok, 1) << shift;
      EXPECT_EQ(d.output_width * 10000 + d.output_height, w * 10000 + hh);
      EXPECT_TRUE(vjtest::same_luma(d.buffer, w, hh, ref)) << "mode " << mode;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, ScaledLuma, ::testing::ValuesIn(scalable_fixtures()),
                         vjtest::fixture_test_name);

// Coefficients as the library's transforms read them: natural order of
// component 0, with the AAN multipliers of its quantisation table.
struct Coefficients {
  vjtest::OracleComponent y;
  uint32_t mult[64];
  uint8_t table[kRangeLimitBytes];
  const uint8_t* centre = vj_range_limit_centre(vj_fill_range_limit(table));
  explicit Coefficients(const Bytes& jpeg) {
    std::vector<vjtest::OracleComponent> comps;
    EXPECT_TRUE(vjtest::oracle_coefficients(jpeg, &comps));
    if (!comps.empty()) y = comps[0];
    vj_build_aan_multipliers(y.quant, mult);
  }
};

// 3/8 (decode modes 2 and 3): the 3x3 transform of the coefficients up to
// zig-zag index 8, blocks 3 samples apart.
TEST(ScaledDecoding, ThreeEighthsFollowsItsTransform) {
  const auto jpeg = vjtest::read_fixture("base_444_q90_64x48.jpg");
  const Coefficients c(jpeg);
  // Mode 2 steps the 1/2 reduction of this request on to 3/8: 24 x 18.
  const auto d = decode_frame(jpeg, 24, 18, KOLVAVETA_MODE_FASTER);
  ASSERT_EQ(d.ok, 1);
  for (int by = 0; by < 6; ++by)
    for (int bx = 0; bx < 8; ++bx) {
      int16_t block[64] = {};
      for (int k : {0, 1, 8, 16, 9, 2, 3, 10, 17}) block[k] = c.y.block(by, bx)[k];
      uint8_t out[3][3];
      uint8_t* rows[3] = {out[0], out[1], out[2]};
      VETAJ_DoIdct_8to3(c.centre, c.mult, block, rows, 0);
      for (int r = 0; r < 3; ++r)
        for (int col = 0; col < 3; ++col)
          ASSERT_EQ(d.buffer[size_t(by * 3 + r) * 24 + bx * 3 + col], out[r][col]) << bx * 3 + col << "," << by * 3 + r;
    }
}

// Beyond 1/8 each kept block gives one sample from its DC value (the 1/8
// value). At 1/16 (mode 2 steps 1/8 on) a 4:2:0 picture averages the DC
// values of 2 x 2 MCUs; grey pictures keep every other MCU column.
TEST(ScaledDecoding, DcOnlyDecimationBeyondOneEighth) {
  const auto dc_sample = [](const Coefficients& c, int dc) {
    int16_t block[64] = {int16_t(dc)};
    uint32_t mult[64] = {c.y.quant[0]};  // the 1x1 transform takes the plain value
    uint8_t v;
    uint8_t* row = &v;
    VETAJ_DoIdct_1x1(c.centre, mult, block, &row, 0);
    return v;
  };
  const auto jpeg = vjtest::read_fixture("base_420_q90_1024x768.jpg");
  const Coefficients c(jpeg);
  const auto d = decode_frame(jpeg, 64, 48, KOLVAVETA_MODE_FASTER);
  ASSERT_EQ(d.ok, 1);
  for (int py = 0; py < 48; ++py)
    for (int px = 0; px < 64; ++px) {
      // Sample (px, py) is block (px & 1, py & 1) of the MCUs from
      // (px & ~1, py & ~1): the average of that block in 2 x 2 MCUs.
      int sum = 0;
      for (int dy = 0; dy < 2; ++dy)
        for (int dx = 0; dx < 2; ++dx)
          sum += (c.y.block(((py & ~1) + dy) * 2 + (py & 1), ((px & ~1) + dx) * 2 + (px & 1))[0] + 2) >> 2;
      ASSERT_EQ(d.buffer[size_t(py) * 64 + px], dc_sample(c, sum)) << px << "," << py;
    }
  // Grey 1023 x 17 at 1/16: of each pair of MCU columns the first is used;
  // column x holds the DC of the last used column c with (8 * c) >> 4 == x.
  const auto grey = vjtest::read_fixture("grey_q80_1023x17.jpg");
  const Coefficients g(grey);
  const auto e = decode_frame(grey, 63, 1, KOLVAVETA_MODE_FASTER);
  ASSERT_EQ(e.ok, 1);
  for (int col = 0; col < g.y.width_in_blocks && col / 2 < 63; col += 2)
    ASSERT_EQ(e.buffer[size_t(col / 2)], dc_sample(g, g.y.block(0, col)[0])) << col;
}

#endif  // VETAJ_HAVE_LIBJPEG

// The reduction follows the output size; modes 2, 3 and 4 take faster
// steps; progressive frames never use 3/8 or go beyond 1/8.
TEST(ScaledDecoding, DecodeModesChooseTheReduction) {
  const auto jpeg = vjtest::read_fixture("base_420_q90_1024x768.jpg");
  const struct {
    int w, h, mode, shift, num;
  } cases[] = {
      {128, 96, 0, 3, 1},  {512, 384, 0, 1, 1},  {513, 385, 0, 0, 1},  {512, 384, 2, 3, 3},
      {1024, 768, 2, 1, 1}, {128, 96, 2, 4, 1}, {1024, 768, 3, 3, 3}, {512, 384, 3, 2, 1},
      {1024, 768, 4, 3, 1},
  };
  for (const auto& c : cases) {
    auto o = vjtest::open_memory(jpeg, KOLVAVETA_FMT_RGBA8888);
    ASSERT_NE(o, nullptr);
    o->decode_mode = c.mode;
    StreamWindow w;
    ASSERT_TRUE(vj::window_open(&w, o->stream));
    std::vector<uint8_t> buf(size_t(c.w) * c.h * 4);
    OutputRequest req{0, 0, buf.data(), c.w, c.h};
    DecoderInfo* d = VETAJ_Initialize(o.get(), &w, &req);
    ASSERT_NE(d, nullptr);
    EXPECT_EQ(d->scale_shift * 10 + d->scale_num, uint32_t(c.shift * 10 + c.num)) << c.w << "x" << c.h << " mode " << c.mode;
    VETAJ_DeleteDecoderInfo(d);
    KOLVAVETA_OsFree(d);
    vj::window_close(&w);
  }
}

}  // namespace
