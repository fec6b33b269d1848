// Output geometry of whole-image decodes: centring, fit modes, cropping,
// rotation and placement in the caller's buffer, checked pixel by pixel
// against the full-size picture placed and resampled by the rules written
// in tests/support/pictures.h. Every byte outside the visible area must keep
// its fill value.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <tuple>
#include <vector>

#include "drivers/decode.h"
#include "support/decoding.h"
#include "support/files.h"

namespace {

using namespace vjtest;
using enum Sampling;

// At its own size a picture lands unchanged (turned by the rotation) in an
// exactly sized buffer and centred in larger ones, in every format; format 4
// only counts rows and writes nothing.
class Placed : public ::testing::TestWithParam<std::tuple<int, uint32_t>> {};

TEST_P(Placed, FullSizeInExactAndLargerBuffers) {
  const auto [format, rotation] = GetParam();
  const bool quarter = rotation == KOLVAVETA_OPT_ROTATE_90 || rotation == KOLVAVETA_OPT_ROTATE_270;
  for (const char* fixture :
       {"base_420_q95_63x65.jpg", "base_422_rst2_q80_63x65.jpg", "base_440_q80_64x48.jpg",
        "base_444_q89_7x9.jpg", "base_420_q75_1x1.jpg", "grey_q85_33x17.jpg",
        "rgb_adobe_q85_33x17.jpg", "cmyk_adobe_444_q80_33x17.jpg"}) {
    SCOPED_TRACE(fixture);
    const Bytes jpeg = read_fixture(fixture);
    FullPicture full;
    ASSERT_TRUE(full_picture(jpeg, &full));
    const int w = full.width, h = full.height;
    for (const auto& [extra_w, extra_h] : {std::pair{0, 0}, std::pair{7, 4}, std::pair{2, 9}}) {
      const int bw = (quarter ? h : w) + extra_w, bh = (quarter ? w : h) + extra_h;
      const Decoded d = decode_bytes(jpeg, {.format = format,
                                            .width = bw,
                                            .height = bh,
                                            .options = KOLVAVETA_OPT_THUMB_NEVER | rotation});
      EXPECT_EQ(d.output_width, w);
      EXPECT_EQ(d.output_height, h);
      EXPECT_TRUE(shows(d, Placement::centred(format, bw, bh, w, h, rotation), full.at))
          << "buffer " << bw << "x" << bh;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(FormatsAndRotations, Placed,
                         ::testing::Combine(::testing::Range(0, 13),
                                            ::testing::Values(0u, 4u, 8u, 12u)));

// Fit modes, cropping and resizing (on the 96x64 4:2:0 fixture unless
// named). Outputs of at most 99x99 pixels take centre sampling, larger ones
// the averages.
struct FitCase {
  const char* label;
  uint32_t options;                     // fit mode and rotation
  int buffer_w, buffer_h;               // requested size
  int out_w, out_h;                     // output_width and output_height reported
  int vis_w, vis_h;                     // visible size before rotation
  int src_left, src_top, src_w, src_h;  // source window that is resized onto it
  Sampling sampling;
  // Centred in the buffer, at its top-left corner, or at its top-left with
  // the row length of the visible width (fit mode 0x100).
  enum Where { kCentred, kTopLeft, kRowLength } where;
  const char* fixture = "base_420_q90_96x64.jpg";
};
using enum FitCase::Where;

const FitCase kFitCases[] = {
    {"modes_4_to_6_as_0", 0x500, 80, 80, 80, 53, 80, 53, 0, 0, 96, 64, kCentre, kCentred},
    {"smaller_not_filled", 0x300, 120, 90, 96, 64, 96, 64, 0, 0, 96, 64, kCentre, kCentred},
    {"row_length_resized", 0x100, 80, 70, 80, 53, 80, 53, 0, 0, 96, 64, kCentre, kRowLength},
    {"top_left_resized", 0x200, 80, 80, 80, 53, 80, 53, 0, 0, 96, 64, kCentre, kTopLeft},
    // Fill: 60 wide gives 40 rows, too few; 60 rows give 90 columns, of
    // which the middle (64 of 96 source columns, from column 16) is shown.
    {"fill_crops_width", 0x300, 60, 60, 90, 60, 60, 60, 16, 0, 64, 64, kCentre, kCentred},
    {"stretch_up", 0x700, 120, 120, 120, 120, 120, 120, 0, 0, 96, 64, kAverage, kCentred},
    {"stretch_down", 0x700, 70, 30, 70, 30, 70, 30, 0, 0, 96, 64, kCentre, kCentred},
    // Rotated requests swap the requested size before fitting.
    {"fit_rotated_90", 0x004, 53, 80, 80, 53, 80, 53, 0, 0, 96, 64, kCentre, kCentred},
    {"fill_rotated_270", 0x30C, 60, 60, 90, 60, 60, 60, 16, 0, 64, 64, kCentre, kCentred},
    {"stretch_rotated_180", 0x708, 120, 110, 120, 110, 120, 110, 0, 0, 96, 64, kAverage, kCentred},
    {"top_left_rotated_90", 0x204, 90, 100, 96, 64, 96, 64, 0, 0, 96, 64, kCentre, kTopLeft},
    {"row_length_rotated_90", 0x104, 100, 100, 96, 64, 96, 64, 0, 0, 96, 64, kCentre, kRowLength},
    // Fill with the picture narrower than the buffer but taller: centred
    // across, 50 of its 64 rows shown from row 7.
    {"fill_crops_height_only", 0x300, 120, 50, 96, 64, 96, 50, 0, 7, 96, 50, kCentre, kCentred},
    // Fill shows a window of ceil(visible x picture / fitted size) source
    // pixels from the middle of the picture (at odd offsets too); the rows
    // above a vertical crop are decoded and dropped.
    {"fill_reduced_crops_rows", 0x300, 10, 10, 10, 602, 10, 10, 0, 503, 17, 17, kCentre, kCentred,
     "base_420_q88_17x1023.jpg"},
    {"fill_reduced_odd_column", 0x300, 701, 600, 800, 600, 701, 600, 63, 0, 898, 768, kAverage,
     kCentred, "base_420_q90_1024x768.jpg"},
    {"fill_crops_columns_only", 0x300, 100, 100, 1023, 17, 100, 17, 461, 0, 100, 17, kCentre,
     kCentred, "base_420_q81_1023x17.jpg"},
};

void PrintTo(const FitCase& c, std::ostream* os) { *os << c.label; }

class FitModes : public ::testing::TestWithParam<std::tuple<FitCase, int>> {};

TEST_P(FitModes, PlaceAndResampleTheVisiblePicture) {
  const auto& [c, format] = GetParam();
  const Bytes jpeg = read_fixture(c.fixture);
  FullPicture full;
  ASSERT_TRUE(full_picture(jpeg, &full));
  const Decoded d = decode_bytes(jpeg, {.format = format,
                                        .width = c.buffer_w,
                                        .height = c.buffer_h,
                                        .options = KOLVAVETA_OPT_THUMB_NEVER | c.options});
  EXPECT_EQ(d.output_width, c.out_w);
  EXPECT_EQ(d.output_height, c.out_h);
  const uint32_t rotation = c.options & KOLVAVETA_OPT_ROTATE_MASK;
  const bool quarter = rotation == KOLVAVETA_OPT_ROTATE_90 || rotation == KOLVAVETA_OPT_ROTATE_270;
  // With the row length of the visible width the picture fills the start of
  // the buffer as a buffer of its own size.
  const int bw = c.where == kRowLength ? (quarter ? c.vis_h : c.vis_w) : c.buffer_w;
  const int bh = c.where == kRowLength ? (quarter ? c.vis_w : c.vis_h) : c.buffer_h;
  Placement where = Placement::centred(format, bw, bh, c.vis_w, c.vis_h, rotation);
  if (c.where != kCentred) where.left = where.top = 0;
  Decoded start = d;
  start.buffer.resize(buffer_bytes(format, bw, bh));
  EXPECT_TRUE(shows(
      start, where,
      resampled(full.at, c.sampling, c.src_left, c.src_top, c.src_w, c.src_h, c.vis_w, c.vis_h)));
  EXPECT_TRUE(all_fill({d.buffer.begin() + std::ptrdiff_t(start.buffer.size()), d.buffer.end()}));
}

INSTANTIATE_TEST_SUITE_P(Cases, FitModes,
                         ::testing::Combine(::testing::ValuesIn(kFitCases),
                                            ::testing::Values(KOLVAVETA_FMT_RGBA8888,
                                                              KOLVAVETA_FMT_RGB565,
                                                              KOLVAVETA_FMT_YUV420)));

// Sizes that need the reduced transform (whose pixels the scaled tests
// check): the reported size follows the fit rules and exactly the visible
// box is written.
TEST(ReducedGeometry, OutputSizeAndPlacement) {
  struct Case {
    uint32_t options;
    int buffer_w, buffer_h, out_w, out_h;
  };
  const Bytes jpeg = read_fixture("base_420_q90_96x64.jpg");
  for (const Case& c : {Case{0x000, 40, 40, 40, 27}, Case{0x700, 30, 20, 30, 20},
                        Case{0x300, 40, 40, 60, 40}, Case{0x004, 27, 40, 40, 27}}) {
    SCOPED_TRACE(testing::Message() << "options " << c.options);
    const Decoded d = decode_bytes(jpeg, {.width = c.buffer_w,
                                          .height = c.buffer_h,
                                          .options = KOLVAVETA_OPT_THUMB_NEVER | c.options});
    ASSERT_EQ(d.ok, 1);
    EXPECT_EQ(d.output_width, c.out_w);
    EXPECT_EQ(d.output_height, c.out_h);
    EXPECT_TRUE(d.guard_intact);
    const bool quarter = (c.options & 0xC) == 4;
    const int vis_w = std::min(c.out_w, quarter ? c.buffer_h : c.buffer_w);
    const int vis_h = std::min(c.out_h, quarter ? c.buffer_w : c.buffer_h);
    const std::vector<uint8_t> box = expected_buffer(
        Placement::centred(7, c.buffer_w, c.buffer_h, vis_w, vis_h, c.options & 0xC),
        [](int, int) { return Colour{}; });
    for (size_t i = 0; i < box.size(); ++i)
      ASSERT_TRUE(box[i] != kFill || d.buffer[i] == kFill) << "byte " << i << " outside the box";
  }
}

// Rotation of a finished picture (thumbnails of the other orientation):
// clockwise, source pixel (x, y) of a w x h picture lands at (h - 1 - y, x)
// of the h-wide result; the counter-clockwise turn undoes it. Planar
// pictures turn plane by plane.
TEST(WholeBufferRotation, QuarterTurnsMovePixelsAndUndoEachOther) {
  const int w = 5, h = 3;
  for (const int format : {0, 7, 1, 2}) {
    SCOPED_TRACE(format);
    std::vector<uint8_t> picture(buffer_bytes(format, w, h));
    for (size_t i = 0; i < picture.size(); ++i) picture[i] = uint8_t(i * 7 + 1);
    std::vector<uint8_t> turned = picture;
    ASSERT_EQ(VETAJ_RotateImage90(turned.data(), w, h, format), 1);
    const size_t bpp = size_t(pixel_bytes(format));
    for (int y = 0; y < h; ++y)
      for (int x = 0; x < w; ++x)
        ASSERT_EQ(0, std::memcmp(&turned[(size_t(x) * h + size_t(h - 1 - y)) * bpp],
                                 &picture[(size_t(y) * w + size_t(x)) * bpp], bpp))
            << x << "," << y;
    ASSERT_EQ(VETAJ_RotateImage270(turned.data(), h, w, format), 1);
    EXPECT_EQ(turned, picture);
  }
  std::vector<uint8_t> untouched(64, kFill);
  EXPECT_EQ(VETAJ_RotateImage90(untouched.data(), 4, 4, 13), 0);
  EXPECT_EQ(VETAJ_RotateImage270(nullptr, 4, 4, 0), 0);
  EXPECT_EQ(VETAJ_RotateImage90(untouched.data(), 0, 4, 0), 0);
  EXPECT_TRUE(all_fill(untouched));
}

}  // namespace
