// Whole-image decoding of every sequential fixture against libjpeg-turbo's
// component planes and the colour equations.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/decoding.h"
#include "support/files.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

#if VETAJ_HAVE_LIBJPEG

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
  vjtest::FullPicture picture;
  ASSERT_TRUE(vjtest::oracle_header(jpeg, &h));
  ASSERT_TRUE(vjtest::oracle_picture(jpeg, h.jpeg_color_space, &picture));
  for (const int format : {KOLVAVETA_FMT_RGBA8888, KOLVAVETA_FMT_YUV420}) {
    if (format == KOLVAVETA_FMT_YUV420 && h.jpeg_color_space != 3) continue;
    const auto decoded =
        vjtest::decode_bytes(jpeg, {.format = format, .width = h.width, .height = h.height});
    EXPECT_TRUE(vjtest::shows(
        decoded, vjtest::Placement::centred(format, h.width, h.height, h.width, h.height),
        picture.at))
        << "format " << format;
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, Sequential, ::testing::ValuesIn(sequential_fixtures()),
                         vjtest::fixture_test_name);

#endif

}  // namespace
