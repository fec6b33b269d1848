// Output geometry of whole-image decodes: centring, fit modes, cropping,
// rotation and placement in the caller's buffer, checked pixel by pixel
// against the full-size picture placed and resampled by the rules written
// in tests/support/pictures.h. Every byte outside the visible area must keep
// its fill value.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <tuple>
#include <vector>

#include "drivers/decode.h"
#include "support/decoding.h"
#include "support/encoder.h"
#include "support/files.h"

namespace {

using namespace vjtest;

const char* format_name(int format) {
  switch (format) {
    case 0:
      return "RGB565";
    case 1:
      return "RGB888";
    case 2:
      return "YUV420";
    case 5:
      return "ARGB";
    case 7:
      return "RGBA";
    case 8:
      return "BGRA";
    case 3:
      return "RGB888_3";
    case 9:
      return "RGB565_9";
    case 12:
      return "RGBA_12";
    default:
      return "other";
  }
}

// A stream with its full-size picture.
struct Source {
  Bytes jpeg;
  FullPicture full;
};

Source load(const std::string& fixture) {
  Source s;
  s.jpeg = read_fixture(fixture);
  EXPECT_TRUE(full_picture(s.jpeg, &s.full)) << fixture;
  return s;
}

// ---------------------------------------------------------------------------
// Full size, every packed and planar format, every rotation.

class Placed : public ::testing::TestWithParam<std::tuple<int, uint32_t>> {};

// At its own size a picture lands unchanged (turned by the rotation) in an
// exactly sized buffer and centred in a larger one. Packed formats are also
// compared with the unrotated decode turned in the test.
TEST_P(Placed, FullSizeInExactAndLargerBuffers) {
  const auto [format, rotation] = GetParam();
  const bool quarter = rotation == KOLVAVETA_OPT_ROTATE_90 || rotation == KOLVAVETA_OPT_ROTATE_270;
  for (const char* fixture :
       {"base_420_q90_96x64.jpg", "base_420_q95_63x65.jpg", "base_422_q85_64x48.jpg",
        "base_440_q80_64x48.jpg", "base_444_q89_7x9.jpg", "base_420_q75_1x1.jpg",
        "base_420_q82_2x2.jpg", "grey_q95_1x1.jpg", "grey_q85_33x17.jpg", "rgb_adobe_q85_33x17.jpg",
        "cmyk_adobe_444_q80_33x17.jpg", "ycck_adobe_444_q90_64x48.jpg"}) {
    SCOPED_TRACE(fixture);
    const Source src = load(fixture);
    const int w = src.full.width, h = src.full.height;
    ColourAt reference = src.full.at;
    Decoded upright;
    if (format != KOLVAVETA_FMT_YUV420) {
      upright = decode_full(src.jpeg, w, h, format);
      ASSERT_EQ(upright.ok, 1) << upright.error;
      reference = colours_of(upright.buffer, format, w);
    }
    const int box_w = quarter ? h : w, box_h = quarter ? w : h;
    for (const auto& [extra_w, extra_h] : {std::pair{0, 0}, std::pair{7, 4}, std::pair{2, 9}}) {
      DecodeRequest r;
      r.format = format;
      r.width = box_w + extra_w;
      r.height = box_h + extra_h;
      r.options = KOLVAVETA_OPT_THUMB_NEVER | rotation;
      const Decoded d = decode_bytes(src.jpeg, r);
      ASSERT_EQ(d.ok, 1) << d.error;
      EXPECT_EQ(d.output_width, w);
      EXPECT_EQ(d.output_height, h);
      EXPECT_TRUE(d.guard_intact);
      const Placement where = Placement::centred(format, r.width, r.height, w, h, rotation);
      EXPECT_TRUE(same_output(d.buffer, expected_buffer(where, reference), where))
          << "buffer " << r.width << "x" << r.height;
      if (format != KOLVAVETA_FMT_YUV420 && rotation == 0 && extra_w == 0) {
        // The unrotated decode itself is the full-size picture.
        EXPECT_TRUE(same_output(d.buffer, expected_buffer(where, src.full.at), where));
      }
    }
  }
}

INSTANTIATE_TEST_SUITE_P(
    FormatsAndRotations, Placed,
    ::testing::Combine(::testing::Values(KOLVAVETA_FMT_RGB565, KOLVAVETA_FMT_RGBA8888,
                                         KOLVAVETA_FMT_BGRA8888, KOLVAVETA_FMT_ARGB8888,
                                         KOLVAVETA_FMT_RGB888, KOLVAVETA_FMT_YUV420,
                                         KOLVAVETA_FMT_RGB888_ALT, KOLVAVETA_FMT_RGB565_B,
                                         KOLVAVETA_FMT_RGBA8888_B),
                       ::testing::Values(KOLVAVETA_OPT_ROTATE_0, KOLVAVETA_OPT_ROTATE_90,
                                         KOLVAVETA_OPT_ROTATE_180, KOLVAVETA_OPT_ROTATE_270)),
    [](const ::testing::TestParamInfo<std::tuple<int, uint32_t>>& param) {
      return std::string(format_name(std::get<0>(param.param))) + "_rot" +
             std::to_string(std::get<1>(param.param) / 4 * 90);
    });

// ---------------------------------------------------------------------------
// Fit modes, cropping and resizing on the full-size transform.

struct FitCase {
  const char* label;
  uint32_t options;                     // fit mode and rotation
  int buffer_w, buffer_h;               // requested size
  int out_w, out_h;                     // output_width and output_height reported
  int vis_w, vis_h;                     // visible size before rotation
  int src_left, src_top, src_w, src_h;  // source window that is resized onto it
  Sampling sampling;
  // Placement: centred in the buffer, at its top-left corner, or at its
  // top-left with the row length of the visible width (fit mode 0x100).
  enum Where { kCentred, kTopLeft, kRowLength } where;
};

// The 96x64 4:2:0 fixture. Outputs of at most 99x99 pixels take centre
// sampling, larger ones the quarter-point averages.
const FitCase kFitCases[] = {
    {"fit_inside_centred", 0x000, 80, 80, 80, 53, 80, 53, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"modes_4_to_6_as_0", 0x500, 80, 80, 80, 53, 80, 53, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"smaller_picture_centred", 0x000, 120, 90, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"smaller_picture_not_filled", 0x300, 120, 90, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"row_length_own_size", 0x100, 100, 90, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kRowLength},
    {"row_length_resized", 0x100, 80, 70, 80, 53, 80, 53, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kRowLength},
    {"top_left_own_size", 0x200, 100, 90, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kTopLeft},
    {"top_left_resized", 0x200, 80, 80, 80, 53, 80, 53, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kTopLeft},
    // Fill: 60 wide gives 40 rows, too few; 60 rows give 90 columns, of
    // which the middle (64 of 96 source columns, from column 16) is shown.
    {"fill_crops_width", 0x300, 60, 60, 90, 60, 60, 60, 16, 0, 64, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"stretch_up", 0x700, 120, 120, 120, 120, 120, 120, 0, 0, 96, 64, Sampling::kAverage,
     FitCase::kCentred},
    {"stretch_down", 0x700, 70, 30, 70, 30, 70, 30, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"stretch_same_size", 0x700, 96, 64, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    // Rotated requests swap the requested size before fitting.
    {"fit_rotated_90", 0x004, 53, 80, 80, 53, 80, 53, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"fill_rotated_270", 0x30C, 60, 60, 90, 60, 60, 60, 16, 0, 64, 64, Sampling::kCentre,
     FitCase::kCentred},
    {"stretch_rotated_180", 0x708, 120, 110, 120, 110, 120, 110, 0, 0, 96, 64, Sampling::kAverage,
     FitCase::kCentred},
    {"top_left_rotated_90", 0x204, 90, 100, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kTopLeft},
    {"row_length_rotated_90", 0x104, 100, 100, 96, 64, 96, 64, 0, 0, 96, 64, Sampling::kCentre,
     FitCase::kRowLength},
    // Fill with the picture narrower than the buffer but taller: centred
    // across, 50 of its 64 rows shown from row 7.
    {"fill_crops_height_only", 0x300, 120, 50, 96, 64, 96, 50, 0, 7, 96, 50, Sampling::kCentre,
     FitCase::kCentred},
};

void PrintTo(const FitCase& c, std::ostream* os) { *os << c.label; }

class FitModes : public ::testing::TestWithParam<std::tuple<FitCase, int>> {};

// The buffer a fit case should leave.
std::vector<uint8_t> expected_fit(const FitCase& c, int format, const FullPicture& full) {
  const uint32_t rotation = c.options & KOLVAVETA_OPT_ROTATE_MASK;
  const ColourAt colour =
      resampled(full.at, c.sampling, c.src_left, c.src_top, c.src_w, c.src_h, c.vis_w, c.vis_h);
  Placement where = Placement::centred(format, c.buffer_w, c.buffer_h, c.vis_w, c.vis_h, rotation);
  if (c.where == FitCase::kCentred) return expected_buffer(where, colour);
  where.left = where.top = 0;
  if (c.where == FitCase::kTopLeft) return expected_buffer(where, colour);
  // Row length = visible width: the visible picture fills the start of the
  // buffer as a buffer of its own size.
  const bool quarter = rotation == KOLVAVETA_OPT_ROTATE_90 || rotation == KOLVAVETA_OPT_ROTATE_270;
  where.buffer_width = quarter ? c.vis_h : c.vis_w;
  where.buffer_height = quarter ? c.vis_w : c.vis_h;
  std::vector<uint8_t> out = expected_buffer(where, colour);
  out.resize(buffer_bytes(format, c.buffer_w, c.buffer_h), kFill);
  return out;
}

TEST_P(FitModes, PlaceAndResampleTheVisiblePicture) {
  const auto& [c, format] = GetParam();
  const Source src = load("base_420_q90_96x64.jpg");
  DecodeRequest r;
  r.format = format;
  r.width = c.buffer_w;
  r.height = c.buffer_h;
  r.options = KOLVAVETA_OPT_THUMB_NEVER | c.options;
  const Decoded d = decode_bytes(src.jpeg, r);
  ASSERT_EQ(d.ok, 1) << d.error;
  EXPECT_EQ(d.output_width, c.out_w);
  EXPECT_EQ(d.output_height, c.out_h);
  EXPECT_TRUE(d.guard_intact);
  Placement where;
  where.format = format;
  where.buffer_width = c.buffer_w;
  where.buffer_height = c.buffer_h;
  EXPECT_TRUE(same_output(d.buffer, expected_fit(c, format, src.full), where));
}

INSTANTIATE_TEST_SUITE_P(Cases, FitModes,
                         ::testing::Combine(::testing::ValuesIn(kFitCases),
                                            ::testing::Values(KOLVAVETA_FMT_RGBA8888,
                                                              KOLVAVETA_FMT_RGB565,
                                                              KOLVAVETA_FMT_YUV420)),
                         [](const ::testing::TestParamInfo<std::tuple<FitCase, int>>& param) {
                           return std::string(std::get<0>(param.param).label) + "_" +
                                  format_name(std::get<1>(param.param));
                         });

// Format 4 is accepted and only counts rows: whatever the geometry, the
// decode succeeds and writes nothing.
TEST(FitModes, CountOnlyFormatWritesNothing) {
  for (const char* fixture :
       {"base_420_q90_96x64.jpg", "grey_q85_33x17.jpg", "cmyk_adobe_2x2_q85_64x48.jpg"}) {
    SCOPED_TRACE(fixture);
    const Bytes jpeg = read_fixture(fixture);
    for (const uint32_t options : {0x001u, 0x005u, 0x30Bu, 0x70Du, 0x101u}) {
      std::vector<uint8_t> buffer(96 * 96 * 4, kFill);
      DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                           uint32_t(jpeg.size()), KOLVAVETA_FMT_NONE, options);
      EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, buffer.data(), 90, 70), 1) << options;
      EXPECT_GT(o->output_width, 0);
      KOLVAVETA_DestroyJpegInfo(o);
      KOLVAVETA_DestroyDecInfo(o);
      EXPECT_TRUE(std::all_of(buffer.begin(), buffer.end(), [](uint8_t b) { return b == kFill; }))
          << options;
    }
  }
}

#if VETAJ_HAVE_LIBJPEG

// Fill mode on pictures whose overhang is cropped in either direction: a
// 400x300 picture into 200x200 is fitted at 267x200 and shows 300 of its
// columns from column 50; a 300x400 picture shows 300 rows from row 50 (the
// rows above are decoded and dropped); a 303x200 picture into 100x100 shows
// 200 columns from the odd column 51.
TEST(FillMode, CropsHalfTheOverhangOnEachSide) {
  struct Case {
    int w, h, buffer, out_w, out_h, left, top, window;
  };
  for (const Case& c :
       {Case{400, 300, 200, 267, 200, 50, 0, 300}, Case{300, 400, 200, 200, 267, 0, 50, 300},
        Case{303, 200, 100, 152, 100, 51, 0, 200}}) {
    SCOPED_TRACE(testing::Message() << c.w << "x" << c.h);
    SyntheticPicture picture;
    picture.width = c.w;
    picture.height = c.h;
    const Bytes jpeg = encode_synthetic(picture);
    FullPicture full;
    ASSERT_TRUE(full_picture(jpeg, &full));
    for (const int format : {KOLVAVETA_FMT_RGBA8888, KOLVAVETA_FMT_YUV420}) {
      DecodeRequest r;
      r.format = format;
      r.width = r.height = c.buffer;
      r.options = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_FILL;
      const Decoded d = decode_bytes(jpeg, r);
      ASSERT_EQ(d.ok, 1) << d.error;
      EXPECT_EQ(d.output_width, c.out_w);
      EXPECT_EQ(d.output_height, c.out_h);
      const Placement where = Placement::centred(format, c.buffer, c.buffer, c.buffer, c.buffer);
      EXPECT_TRUE(
          same_output(d.buffer,
                      expected_buffer(where, resampled(full.at, Sampling::kAverage, c.left, c.top,
                                                       c.window, c.window, c.buffer, c.buffer)),
                      where));
    }
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// Sizes that need the reduced transform: the reported output size follows
// the fit rules at once; the pixels need the scaled decoder.
TEST(ReducedGeometry, OutputSizeAndPlacement) {
  struct Case {
    uint32_t options;
    int buffer_w, buffer_h, out_w, out_h;
  };
  const Bytes jpeg = read_fixture("base_420_q90_96x64.jpg");
  int not_decoded = 0;
  for (const Case& c : {Case{0x000, 40, 40, 40, 27}, Case{0x700, 30, 20, 30, 20},
                        Case{0x300, 40, 40, 60, 40}, Case{0x004, 27, 40, 40, 27}}) {
    SCOPED_TRACE(testing::Message()
                 << "options " << c.options << " " << c.buffer_w << "x" << c.buffer_h);
    DecodeRequest r;
    r.width = c.buffer_w;
    r.height = c.buffer_h;
    r.options = KOLVAVETA_OPT_THUMB_NEVER | c.options;
    const Decoded d = decode_bytes(jpeg, r);
    EXPECT_EQ(d.output_width, c.out_w);
    EXPECT_EQ(d.output_height, c.out_h);
    EXPECT_TRUE(d.guard_intact);
    if (d.ok != 1) {
      ++not_decoded;
      continue;
    }
    // Every pixel of the visible box is written and nothing else.
    const bool quarter = (c.options & 0xC) == 4 || (c.options & 0xC) == 12;
    const int vis_w = std::min(c.out_w, quarter ? c.buffer_h : c.buffer_w);
    const int vis_h = std::min(c.out_h, quarter ? c.buffer_w : c.buffer_h);
    const Placement where =
        Placement::centred(r.format, c.buffer_w, c.buffer_h, vis_w, vis_h, c.options & 0xC);
    const std::vector<uint8_t> box = expected_buffer(where, [](int, int) { return Colour{}; });
    for (size_t i = 0; i < box.size(); ++i) {
      if (box[i] == kFill) {
        ASSERT_EQ(d.buffer[i], kFill) << "byte " << i << " outside the picture";
      }
    }
  }
  if (not_decoded > 0) GTEST_SKIP() << not_decoded << " sizes need the reduced transform";
}

// ---------------------------------------------------------------------------
// Rotation of a finished picture (thumbnails of the other orientation).

// Clockwise, source pixel (x, y) of a w x h picture lands at (h - 1 - y, x)
// of the h-wide result; the counter-clockwise turn undoes it. Planar
// pictures turn plane by plane.
TEST(WholeBufferRotation, QuarterTurnsMovePixelsAndUndoEachOther) {
  const int w = 5, h = 3;
  for (const int format : {0, 9, 7, 5, 1, 2}) {
    SCOPED_TRACE(format_name(format));
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
  EXPECT_EQ(VETAJ_RotateImage90(untouched.data(), 4, 4, KOLVAVETA_FMT_NONE), 1);
  EXPECT_EQ(VETAJ_RotateImage90(untouched.data(), 4, 4, 13), 0);
  EXPECT_EQ(VETAJ_RotateImage270(nullptr, 4, 4, 0), 0);
  EXPECT_EQ(VETAJ_RotateImage90(untouched.data(), 0, 4, 0), 0);
  EXPECT_TRUE(
      std::all_of(untouched.begin(), untouched.end(), [](uint8_t b) { return b == kFill; }));
}

}  // namespace
