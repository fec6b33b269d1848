// Whole-image decoding of every sequential fixture against libjpeg-turbo's
// component planes and the colour equations.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "support/decoding.h"
#include "support/files.h"
#include "support/pictures.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

#if VETAJ_HAVE_LIBJPEG

using vjtest::Colour;

std::vector<std::string> sequential_fixtures() {
  return vjtest::fixtures_where(
      [](const std::string&, const vjtest::OracleHeader& h) { return !h.progressive; });
}

class Sequential : public ::testing::TestWithParam<std::string> {};

// RGBA equals the colour equations applied to libjpeg-turbo's accurate-integer
// planes (box upsampling); for YCbCr frames the planar output also carries
// its luma plane unchanged and the chroma of the even pixels.
TEST_P(Sequential, FullSizeMatchesLibjpeg) {
  const auto jpeg = vjtest::read_fixture(GetParam());
  vjtest::OracleHeader h;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  vjtest::OraclePlanes p;
  ASSERT_TRUE(vjtest::oracle_planes(jpeg, 1, &p));
  const int space = h.jpeg_color_space;
  const vjtest::ColourAt colour = [&](int x, int y) -> Colour {
    const auto v = [&](int c) { return int(p.at(x, y, c)); };
    switch (space) {
      case 1: return {false, v(0), v(0), v(0)};                   // grey
      case 2: return {false, v(0), v(1), v(2)};                   // RGB
      case 3: return {true, v(0), v(1), v(2)};                    // YCbCr
      case 4: return vjtest::cmyk_colour(v(0), v(1), v(2), v(3)); // Adobe CMYK, inverted
      default: return vjtest::ycck_colour(v(0), v(1), v(2), v(3));
    }
  };
  std::vector<int> formats{KOLVAVETA_FMT_RGBA8888};
  if (space == 3) formats.push_back(KOLVAVETA_FMT_YUV420);
  for (const int format : formats) {
    vjtest::DecodeRequest request;
    request.format = format;
    request.width = h.width;
    request.height = h.height;
    const auto decoded = vjtest::decode_bytes(jpeg, request);
    EXPECT_TRUE(vjtest::shows(
        decoded, vjtest::Placement::centred(format, h.width, h.height, h.width, h.height), colour))
        << "format " << format;
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, Sequential, ::testing::ValuesIn(sequential_fixtures()),
                         vjtest::fixture_test_name);

#endif

}  // namespace
