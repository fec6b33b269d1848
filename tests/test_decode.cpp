// Whole-image decoding against libjpeg-turbo and independent references.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "support/files.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

struct Decoded {
  int ok = 0;
  int err = 0;
  std::vector<uint8_t> buf;
};

// Decodes a memory image into a width x height buffer of the given format.
Decoded decode(const std::vector<uint8_t>& jpeg, int format, int width, int height,
               uint32_t options = KOLVAVETA_OPT_THUMB_NEVER, int mode = 0, size_t bytes = 0,
               uint8_t fill = 0xAA) {
  Decoded out;
  DecInfo* o = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg.data()),
                                       static_cast<uint32_t>(jpeg.size()), format, options);
  if (o == nullptr) return out;
  KOLVAVETA_SetDecMode(o, mode);
  if (bytes == 0) bytes = size_t(width) * height * 4 + 64;
  out.buf.assign(bytes, fill);
  out.ok = KOLVAVETA_DecodeJPEG(o, out.buf.data(), width, height);
  out.err = gKOLVAVETA_Error;
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
  return out;
}

#if VETAJ_HAVE_LIBJPEG

int clamp255(int v) { return v < 0 ? 0 : (v > 255 ? 255 : v); }

// Reference colour conversion of one YCbCr sample (arithmetic shifts, no
// rounding term).
void ycc_to_rgb(int y, int cb, int cr, int rgb[3]) {
  cb -= 128;
  cr -= 128;
  rgb[0] = clamp255(y + ((91881 * cr) >> 16));
  rgb[1] = clamp255(y + ((-22554 * cb - 46802 * cr) >> 16));
  rgb[2] = clamp255(y + ((116130 * cb) >> 16));
}

std::vector<std::string> baseline_ycc_fixtures() {
  return vjtest::fixtures_where([](const std::string&, const vjtest::OracleHeader& h) {
    return !h.progressive && h.num_components == 3 && h.jpeg_color_space == 3 /* JCS_YCbCr */;
  });
}

class BaselineYcc : public ::testing::TestWithParam<std::string> {};

// Full size: the luma plane equals libjpeg-turbo's accurate-integer output
// and RGBA equals the conversion of its box-upsampled planes.
TEST_P(BaselineYcc, FullSizeMatchesLibjpeg) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  vjtest::OraclePlanes p;
  ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
  const int w = h.width, hh = h.height;
  const auto yuv = decode(jpeg, KOLVAVETA_FMT_YUV420, w, hh);
  ASSERT_EQ(yuv.ok, 1) << yuv.err;
  for (int y = 0; y < hh; ++y)
    for (int x = 0; x < w; ++x)
      ASSERT_EQ(yuv.buf[size_t(y) * w + x], p.at(x, y, 0)) << "Y at " << x << "," << y;
  const auto rgba = decode(jpeg, KOLVAVETA_FMT_RGBA8888, w, hh);
  ASSERT_EQ(rgba.ok, 1);
  for (int y = 0; y < hh; ++y) {
    for (int x = 0; x < w; ++x) {
      int rgb[3];
      ycc_to_rgb(p.at(x, y, 0), p.at(x, y, 1), p.at(x, y, 2), rgb);
      const uint8_t* px = &rgba.buf[(size_t(y) * w + x) * 4];
      ASSERT_EQ(px[0], rgb[0]) << x << "," << y;
      ASSERT_EQ(px[1], rgb[1]) << x << "," << y;
      ASSERT_EQ(px[2], rgb[2]) << x << "," << y;
      ASSERT_EQ(px[3], 255);
    }
  }
  // Nothing is written past the picture.
  for (size_t i = size_t(w) * hh * 4; i < rgba.buf.size(); ++i) ASSERT_EQ(rgba.buf[i], 0xAA);
}

INSTANTIATE_TEST_SUITE_P(Corpus, BaselineYcc, ::testing::ValuesIn(baseline_ycc_fixtures()),
                         vjtest::fixture_test_name);

std::vector<std::string> other_colour_fixtures() {
  return vjtest::fixtures_where([](const std::string&, const vjtest::OracleHeader& h) {
    return !h.progressive && h.jpeg_color_space != 3;
  });
}

class BaselineOther : public ::testing::TestWithParam<std::string> {};

// Grey, RGB, CMYK and YCCK: RGBA equals the colour formulas applied to
// libjpeg-turbo's raw planes.
TEST_P(BaselineOther, FullSizeMatchesLibjpeg) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  vjtest::OraclePlanes p;
  ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
  const int w = h.width, hh = h.height;
  const auto rgba = decode(jpeg, KOLVAVETA_FMT_RGBA8888, w, hh);
  ASSERT_EQ(rgba.ok, 1) << rgba.err;
  for (int y = 0; y < hh; ++y) {
    for (int x = 0; x < w; ++x) {
      int rgb[3];
      switch (h.jpeg_color_space) {
        case 1:  // grey
          rgb[0] = rgb[1] = rgb[2] = p.at(x, y, 0);
          break;
        case 2:  // RGB
          for (int c = 0; c < 3; ++c) rgb[c] = p.at(x, y, c);
          break;
        case 4: {  // CMYK (Adobe, inverted)
          const int k = p.at(x, y, 3);
          for (int c = 0; c < 3; ++c) rgb[c] = p.at(x, y, c) * k / 255;
          break;
        }
        default: {  // YCCK
          const int Y = p.at(x, y, 0), cb = p.at(x, y, 1), cr = p.at(x, y, 2), k = p.at(x, y, 3);
          rgb[0] = (k * clamp255(433 - Y - ((91881 * cr) >> 16))) >> 8;
          rgb[1] = (k * clamp255(120 - Y - ((-22554 * cb - 46802 * cr) >> 16))) >> 8;
          rgb[2] = (k * clamp255(481 - Y - ((116130 * cb) >> 16))) >> 8;
          break;
        }
      }
      const uint8_t* px = &rgba.buf[(size_t(y) * w + x) * 4];
      ASSERT_EQ(px[0], rgb[0]) << GetParam() << " " << x << "," << y;
      ASSERT_EQ(px[1], rgb[1]) << x << "," << y;
      ASSERT_EQ(px[2], rgb[2]) << x << "," << y;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, BaselineOther, ::testing::ValuesIn(other_colour_fixtures()),
                         vjtest::fixture_test_name);

TEST(Decode, SampleLumaMatchesLibjpeg) {
  const auto jpeg = vjtest::read_fixture("sample.jpg");
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  vjtest::OraclePlanes p;
  ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
  const auto d = decode(jpeg, KOLVAVETA_FMT_YUV420, h.width, h.height);
  ASSERT_EQ(d.ok, 1) << d.err;
  int bad = 0;
  for (int y = 0; y < h.height && bad < 10; ++y)
    for (int x = 0; x < h.width && bad < 10; ++x)
      if (d.buf[size_t(y) * h.width + x] != p.at(x, y, 0)) {
        ++bad;
        ADD_FAILURE() << "Y at " << x << "," << y << ": " << int(d.buf[size_t(y) * h.width + x])
                      << " vs " << int(p.at(x, y, 0));
      }
}

#endif

}  // namespace
