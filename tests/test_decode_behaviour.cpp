// Behaviour of the whole-image decode through the public interface:
// resizing through the row converters, thumbnail policies, Exif
// orientation, decode modes and sample sizes, progress and cancellation,
// damaged data, input kinds and reuse of one object, colour-space detection
// and rejection, and the error results.
#include <gtest/gtest.h>

#include <algorithm>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <random>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "support/decoding.h"
#include "support/encoder.h"
#include "support/files.h"
#include "support/manifest.h"
#include "support/segments.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

#if defined(__SANITIZE_ADDRESS__)
extern "C" size_t __sanitizer_get_current_allocated_bytes(void);
#endif

namespace {

using namespace vjtest;

// Heap bytes in use, where the allocator can tell (address sanitizer
// builds); 0 elsewhere.
size_t live_heap_bytes() {
#if defined(__SANITIZE_ADDRESS__)
  return __sanitizer_get_current_allocated_bytes();
#else
  return 0;
#endif
}

Placement centred(int format, int buffer_w, int buffer_h, int out_w, int out_h,
                  uint32_t rotation = 0) {
  return Placement::centred(format, buffer_w, buffer_h, out_w, out_h, rotation);
}

// The frame size from the header summary; false when there is none.
bool frame_size(const Bytes& jpeg, int* width, int* height) {
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                       uint32_t(jpeg.size()), KOLVAVETA_FMT_RGBA8888,
                                       KOLVAVETA_OPT_THUMB_NEVER);
  if (o == nullptr) return false;
  JpegInfo info{};
  const bool known = KOLVAVETA_JpgParser(o, &info) == 1 && info.width > 0 && info.height > 0;
  KOLVAVETA_DestroyDecInfo(o);
  *width = info.width;
  *height = info.height;
  return known;
}

// Offset of the first segment with the given marker code before the scan
// data (the 0xFF byte), or npos.
size_t segment(const Bytes& jpeg, uint8_t code) {
  size_t p = 2;
  while (p + 4 <= jpeg.size() && jpeg[p] == 0xFF) {
    if (jpeg[p + 1] == code) return p;
    if (jpeg[p + 1] == 0xDA) break;
    p += 2 + ((size_t(jpeg[p + 2]) << 8) | jpeg[p + 3]);
  }
  return std::string::npos;
}

Bytes with_component_ids(Bytes jpeg, std::initializer_list<uint8_t> ids) {
  const size_t sof = segment(jpeg, 0xC0), sos = segment(jpeg, 0xDA);
  size_t k = 0;
  for (const uint8_t id : ids) {
    jpeg[sof + 10 + 3 * k] = id;
    jpeg[sos + 5 + 2 * k] = id;
    ++k;
  }
  return jpeg;
}

Bytes with_adobe_transform(Bytes jpeg, uint8_t transform) {
  const size_t at = segment(jpeg, 0xEE);
  if (at < jpeg.size() && jpeg.size() - at > 15) jpeg[at + 15] = transform;
  return jpeg;
}

Bytes without_segment(Bytes jpeg, uint8_t code) {
  const size_t at = segment(jpeg, code);
  const size_t length = 2 + ((size_t(jpeg[at + 2]) << 8) | jpeg[at + 3]);
  jpeg.erase(jpeg.begin() + std::ptrdiff_t(at), jpeg.begin() + std::ptrdiff_t(at + length));
  return jpeg;
}

// Drops the last component from the frame and scan headers.
Bytes without_last_component(Bytes jpeg) {
  for (const uint8_t code : {uint8_t(0xDA), uint8_t(0xC0)}) {
    const size_t at = segment(jpeg, code);
    const size_t count_at = at + (code == 0xC0 ? 9 : 4), entry_size = code == 0xC0 ? 3 : 2;
    const size_t n = jpeg[count_at];
    const size_t last = count_at + 1 + (n - 1) * entry_size;
    jpeg.erase(jpeg.begin() + std::ptrdiff_t(last), jpeg.begin() + std::ptrdiff_t(last + entry_size));
    jpeg[count_at] = uint8_t(n - 1);
    const size_t length = ((size_t(jpeg[at + 2]) << 8) | jpeg[at + 3]) - entry_size;
    jpeg[at + 2] = uint8_t(length >> 8);
    jpeg[at + 3] = uint8_t(length);
  }
  return jpeg;
}

// A fixture, its frame size and its RGBA decode at that size.
struct Whole {
  Bytes jpeg;
  int width = 0, height = 0;
  Decoded decoded;
};
Whole whole(const std::string& fixture) {
  Whole out;
  out.jpeg = read_fixture(fixture);
  if (frame_size(out.jpeg, &out.width, &out.height))
    out.decoded = decode_full(out.jpeg, out.width, out.height);
  return out;
}

// A packed buffer of w x h pixels turned 90 degrees clockwise (h x w).
std::vector<uint8_t> turned_clockwise(const std::vector<uint8_t>& src, int w, int h, int bpp) {
  std::vector<uint8_t> out(src.size());
  for (int y = 0; y < h; ++y)
    for (int x = 0; x < w; ++x)
      std::memcpy(&out[(size_t(x) * size_t(h) + size_t(h - 1 - y)) * size_t(bpp)],
                  &src[(size_t(y) * size_t(w) + size_t(x)) * size_t(bpp)], size_t(bpp));
  return out;
}

#if VETAJ_HAVE_LIBJPEG

// ---------------------------------------------------------------------------
// Resizing through the row converters, on the full-size transform.

struct ResizeCase {
  const char* fixture;
  uint32_t fit;  // with thumbnail policy 0: the header is read
  int mode;      // decode mode set by the caller
  int buffer_w, buffer_h;
  int out_w, out_h;
  int mode_after;     // decode mode left in the object
  Sampling sampling;  // centre sampling or quarter-point averages
};

void PrintTo(const ResizeCase& c, std::ostream* os) {
  *os << c.fixture << " " << c.buffer_w << "x" << c.buffer_h << " mode " << c.mode;
}

// YCbCr outputs of at most 99x99 pixels, and mode 1 within 12/7 of the
// picture, take centre sampling; other YCbCr outputs, enlargements in modes
// 0 and 1, and every grey, RGB, CMYK and YCCK picture take the averages.
const ResizeCase kResizeCases[] = {
    {"sample.jpg", 0x000, 0, 500, 375, 500, 375, 0, Sampling::kAverage},
    {"base_420_q90_96x64.jpg", 0x000, 0, 80, 60, 80, 53, 0, Sampling::kCentre},
    {"base_420_q90_96x64.jpg", 0x700, 0, 150, 100, 150, 100, 0, Sampling::kAverage},
    {"base_420_q90_96x64.jpg", 0x700, 0, 90, 70, 90, 70, 0, Sampling::kAverage},
    {"base_420_q90_96x64.jpg", 0x700, 2, 90, 70, 90, 70, 0, Sampling::kAverage},  // mode reset
    {"base_420_q75_1024x1024.jpg", 0x000, 1, 700, 700, 700, 700, 1, Sampling::kCentre},
    {"base_420_q75_1024x1024.jpg", 0x000, 0, 700, 700, 700, 700, 0, Sampling::kAverage},
    {"base_420_q75_1024x1024.jpg", 0x000, 1, 598, 598, 598, 598, 1, Sampling::kCentre},
    {"base_420_q75_1024x1024.jpg", 0x000, 1, 597, 597, 597, 597, 1, Sampling::kAverage},
    {"base_420_q90_1024x768.jpg", 0x000, 1, 700, 525, 700, 525, 0, Sampling::kAverage},
    {"base_422_q70_100x75.jpg", 0x700, 0, 77, 60, 77, 60, 0, Sampling::kCentre},
    {"base_422_q70_100x75.jpg", 0x700, 0, 130, 90, 130, 90, 0, Sampling::kAverage},
    {"base_444_q95_63x65.jpg", 0x000, 0, 50, 50, 48, 50, 0, Sampling::kCentre},
    {"base_mixed_y22_cb12_cr21_q85_64x48.jpg", 0x700, 0, 50, 40, 50, 40, 0, Sampling::kCentre},
    {"grey_q100_40x30.jpg", 0x700, 0, 33, 25, 33, 25, 0, Sampling::kAverage},
    {"grey_q100_40x30.jpg", 0x700, 0, 70, 50, 70, 50, 0, Sampling::kAverage},
    {"rgb_adobe_q90_64x48.jpg", 0x700, 0, 50, 37, 50, 37, 0, Sampling::kAverage},
    {"rgb_adobe_q90_64x48.jpg", 0x700, 0, 90, 60, 90, 60, 0, Sampling::kAverage},
    {"cmyk_adobe_444_q90_64x48.jpg", 0x700, 0, 100, 70, 100, 70, 0, Sampling::kAverage},
    {"cmyk_adobe_2x2_q85_64x48.jpg", 0x700, 0, 40, 30, 40, 30, 0, Sampling::kAverage},
    {"ycck_adobe_y22_k22_q85_63x65.jpg", 0x700, 0, 40, 50, 40, 50, 0, Sampling::kAverage},
};

class Resizing : public ::testing::TestWithParam<std::tuple<ResizeCase, int>> {};

TEST_P(Resizing, MatchesTheSamplingRulesOnTheFullSizePicture) {
  const auto& [c, format] = GetParam();
  const Bytes jpeg = read_fixture(c.fixture);
  FullPicture full;
  ASSERT_TRUE(full_picture(jpeg, &full));
  const Decoded d = decode_bytes(jpeg, {.format = format,
                                        .width = c.buffer_w,
                                        .height = c.buffer_h,
                                        .options = c.fit,
                                        .mode = c.mode});
  ASSERT_EQ(d.ok, 1) << d.error;
  EXPECT_EQ(d.output_width, c.out_w);
  EXPECT_EQ(d.output_height, c.out_h);
  EXPECT_EQ(d.decode_mode, c.mode_after);
  EXPECT_TRUE(d.guard_intact);
  const Placement where = centred(format, c.buffer_w, c.buffer_h, c.out_w, c.out_h);
  EXPECT_TRUE(same_output(d.buffer,
                          expected_buffer(where, resampled(full.at, c.sampling, 0, 0, full.width,
                                                           full.height, c.out_w, c.out_h)),
                          where));
}

INSTANTIATE_TEST_SUITE_P(Cases, Resizing,
                         ::testing::Combine(::testing::ValuesIn(kResizeCases),
                                            ::testing::Values(KOLVAVETA_FMT_RGBA8888,
                                                              KOLVAVETA_FMT_RGB565,
                                                              KOLVAVETA_FMT_YUV420)));

// ---------------------------------------------------------------------------
// Thumbnails. The embedded pictures have red and blue swapped and a yellow
// frame: a decode that matches the thumbnail's own picture cannot come from
// the main one.

// The embedded JPEG stream of a given size inside a file (from its SOI).
Bytes embedded(const Bytes& file, int width, int height) {
  for (size_t i = 1; i + 2 < file.size(); ++i) {
    if (file[i] != 0xFF || file[i + 1] != 0xD8 || file[i + 2] != 0xFF) continue;
    const Bytes tail(file.begin() + std::ptrdiff_t(i), file.end());
    OracleHeader h;
    if (oracle_header(tail, &h) && h.width == width && h.height == height) return tail;
  }
  return {};
}

struct Pictures {
  Bytes file;
  FullPicture main, thumb;
};

Pictures load_with_thumbnail(const char* fixture, int thumb_w, int thumb_h) {
  Pictures p;
  p.file = read_fixture(fixture);
  EXPECT_TRUE(full_picture(p.file, &p.main));
  EXPECT_TRUE(full_picture(embedded(p.file, thumb_w, thumb_h), &p.thumb));
  return p;
}

// The thumbnail decodes with centre sampling; the main picture by the rules
// of its size.
std::vector<uint8_t> expected_picture(const FullPicture& picture, Sampling sampling, int format,
                                      int buffer_w, int buffer_h, int out_w, int out_h) {
  return expected_buffer(
      centred(format, buffer_w, buffer_h, out_w, out_h),
      resampled(picture.at, sampling, 0, 0, picture.width, picture.height, out_w, out_h));
}

struct ThumbCase {
  const char* fixture;
  int thumb_w, thumb_h;
  uint32_t options;  // thumbnail policy, with a fit mode
  int buffer_w, buffer_h;
  bool thumbnail;  // the thumbnail is decoded, else the main picture
  int out_w, out_h;
};

void PrintTo(const ThumbCase& c, std::ostream* os) {
  *os << c.fixture << " options " << c.options << " " << c.buffer_w << "x" << c.buffer_h;
}

const ThumbCase kThumbCases[] = {
    // Exif thumbnail of 160x120: used when it covers the request.
    {"exif_thumb_ii_640x480.jpg", 160, 120, 0, 160, 120, true, 160, 120},
    {"exif_thumb_ii_640x480.jpg", 160, 120, 3, 160, 120, true, 160, 120},
    {"exif_thumb_ii_640x480.jpg", 160, 120, 0, 150, 100, true, 133, 100},
    {"exif_thumb_ii_640x480.jpg", 160, 120, 0, 480, 360, false, 480, 360},
    {"exif_thumb_ii_640x480.jpg", 160, 120, 1, 400, 300, false, 400, 300},
    // Policy 2 takes the thumbnail whatever its size: smaller than the
    // request, it is decoded at its own size.
    {"exif_thumb_ii_640x480.jpg", 160, 120, 2, 400, 300, true, 160, 120},
    // Stretched, the thumbnail is enlarged by centre sampling (thumbnails
    // decode in the fast mode).
    {"exif_thumb_ii_640x480.jpg", 160, 120, 0x702, 330, 250, true, 330, 250},
    {"exif_thumb_mm_320x240.jpg", 80, 60, 0, 80, 60, true, 80, 60},
    {"exif_thumb_mm_320x240.jpg", 80, 60, 0, 200, 150, false, 200, 150},
    {"exif_thumb_mm_320x240.jpg", 80, 60, 2, 200, 150, true, 80, 60},
    {"thumb_jfxx_jpeg_128x96.jpg", 32, 24, 0, 32, 24, true, 32, 24},
    {"thumb_jfxx_jpeg_128x96.jpg", 32, 24, 0, 100, 75, false, 100, 75},
    // An image-resource thumbnail must be strictly larger than the request.
    {"thumb_app13_jpeg_640x480.jpg", 160, 120, 0, 150, 100, true, 133, 100},
    {"thumb_app13_jpeg_640x480.jpg", 160, 120, 0, 159, 119, true, 159, 119},
    {"thumb_app13_jpeg_640x480.jpg", 160, 120, 2, 400, 300, true, 160, 120},
};

class Thumbnails : public ::testing::TestWithParam<ThumbCase> {};

TEST_P(Thumbnails, PolicyChoosesThePicture) {
  const ThumbCase& c = GetParam();
  const Pictures p = load_with_thumbnail(c.fixture, c.thumb_w, c.thumb_h);
  for (const int format : {KOLVAVETA_FMT_RGBA8888, KOLVAVETA_FMT_RGB565}) {
    const Decoded d = decode_bytes(
        p.file, {.format = format, .width = c.buffer_w, .height = c.buffer_h, .options = c.options});
    ASSERT_EQ(d.ok, 1) << d.error;
    EXPECT_EQ(d.output_width, c.out_w);
    EXPECT_EQ(d.output_height, c.out_h);
    EXPECT_EQ(d.decode_mode, 0);
    const FullPicture& picture = c.thumbnail ? p.thumb : p.main;
    const Sampling sampling =
        c.thumbnail || (c.out_w <= 99 && c.out_h <= 99) ? Sampling::kCentre : Sampling::kAverage;
    Placement where;
    where.format = format;
    where.buffer_width = c.buffer_w;
    where.buffer_height = c.buffer_h;
    EXPECT_TRUE(same_output(
        d.buffer,
        expected_picture(picture, sampling, format, c.buffer_w, c.buffer_h, c.out_w, c.out_h),
        where))
        << (c.thumbnail ? "thumbnail" : "main picture") << " expected";
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, Thumbnails, ::testing::ValuesIn(kThumbCases));

// A thumbnail smaller than the request leaves the main picture, reduced to
// the request (by the scaled transform once it is there).
TEST(Thumbnails, SmallThumbnailLeavesTheReducedMainPicture) {
  const Bytes file = read_fixture("exif_thumb_ii_640x480.jpg");
  const Decoded d = decode_bytes(file, {.width = 320, .height = 240, .options = 0});
  EXPECT_EQ(d.output_width, 320);
  EXPECT_EQ(d.output_height, 240);
  EXPECT_TRUE(d.guard_intact);
  if (d.ok != 1) GTEST_SKIP() << "a 640x480 picture at 320x240 needs the reduced transform";
  EXPECT_EQ(d.image_width, 640);
  EXPECT_EQ(d.image_height, 480);
}

// A thumbnail that cannot be decoded gives way to the main picture, and the
// call succeeds without an error left behind.
TEST(Thumbnails, BrokenThumbnailFallsBackToTheMainPicture) {
  Pictures p = load_with_thumbnail("exif_thumb_ii_640x480.jpg", 160, 120);
  const Bytes thumb = embedded(p.file, 160, 120);
  const size_t at = p.file.size() - thumb.size();
  size_t sof = at + 2;
  while (!(p.file[sof] == 0xFF && p.file[sof + 1] == 0xC0)) ++sof;
  p.file[sof + 4] = 12;  // sample precision of the thumbnail's frame
  const Decoded d =
      decode_bytes(p.file, {.width = 400, .height = 300, .options = KOLVAVETA_OPT_THUMB_ALWAYS});
  ASSERT_EQ(d.ok, 1);
  EXPECT_EQ(d.error, 0);
  EXPECT_EQ(d.output_width, 400);
  EXPECT_EQ(d.image_width, 640);
  EXPECT_TRUE(same_output(d.buffer,
                          expected_picture(p.main, Sampling::kAverage, 7, 400, 300, 400, 300),
                          centred(7, 400, 300, 400, 300)));
}

// Uncompressed thumbnails are never decoded: the main picture is.
TEST(Thumbnails, UncompressedThumbnailsLeaveTheMainPicture) {
  for (const char* fixture :
       {"thumb_jfxx_rgb_128x96.jpg", "thumb_jfxx_pal_128x96.jpg", "thumb_jfif_rgb4x3_64x48.jpg"}) {
    SCOPED_TRACE(fixture);
    const Bytes file = read_fixture(fixture);
    FullPicture main;
    ASSERT_TRUE(full_picture(file, &main));
    for (const uint32_t policy : {0u, 2u, 3u}) {
      const Decoded d =
          decode_bytes(file, {.width = main.width, .height = main.height, .options = policy});
      ASSERT_EQ(d.ok, 1) << d.error;
      EXPECT_EQ(d.output_width, main.width);
      const Placement where = centred(7, main.width, main.height, main.width, main.height);
      EXPECT_TRUE(same_output(d.buffer, expected_buffer(where, main.at), where))
          << "policy " << policy;
    }
  }
}

// Policy 3: a portrait picture whose thumbnail is landscape decodes the
// thumbnail into the transposed buffer and turns it 90 degrees clockwise.
TEST(Thumbnails, OrientedPolicyTurnsALandscapeThumbnailOfAPortraitPicture) {
  const Pictures p = load_with_thumbnail("exif_thumb_portrait_ii_240x320.jpg", 80, 60);
  for (const int format : {KOLVAVETA_FMT_RGBA8888, KOLVAVETA_FMT_RGB565, KOLVAVETA_FMT_RGB565_B}) {
    for (const auto& [w, h] : {std::pair{45, 60}, std::pair{50, 60}}) {
      SCOPED_TRACE(testing::Message() << "format " << format << " " << w << "x" << h);
      const Decoded d = decode_bytes(
          p.file,
          {.format = format, .width = w, .height = h, .options = KOLVAVETA_OPT_THUMB_ORIENTED});
      ASSERT_EQ(d.ok, 1) << d.error;
      // The thumbnail fitted into the transposed buffer (h x w), turned.
      const std::vector<uint8_t> upright =
          expected_picture(p.thumb, Sampling::kCentre, format, h, w, 60, 45);
      Placement where;
      where.format = format;
      where.buffer_width = w;
      where.buffer_height = h;
      EXPECT_TRUE(
          same_output(d.buffer, turned_clockwise(upright, h, w, pixel_bytes(format)), where));
    }
  }
  // With the same orientation policy 0 decodes the thumbnail upright.
  const Decoded d = decode_bytes(p.file, {.width = 60, .height = 45, .options = 0});
  ASSERT_EQ(d.ok, 1);
  EXPECT_TRUE(same_output(d.buffer, expected_picture(p.thumb, Sampling::kCentre, 7, 60, 45, 60, 45),
                          centred(7, 60, 45, 60, 45)));
}

// A sample size compares the thumbnail with the main picture divided by it
// and becomes 1 when the thumbnail is taken. The main picture's size comes
// from the header that the decode reads: the choice is the same with or
// without a header summary, and after a thumbnail decode has left the
// thumbnail's size in the object.
TEST(Thumbnails, SampleSizeSelectsTheThumbnail) {
  const Pictures p = load_with_thumbnail("exif_thumb_ii_640x480.jpg", 160, 120);
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(p.file.data()),
                                       uint32_t(p.file.size()), KOLVAVETA_FMT_RGBA8888, 0);
  ASSERT_NE(o, nullptr);
  JpegInfo info{};
  for (const bool summary : {true, false}) {
    for (const uint32_t policy :
         {KOLVAVETA_OPT_THUMB_IF_LARGE, KOLVAVETA_OPT_THUMB_ALWAYS, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      SCOPED_TRACE(testing::Message() << "summary " << summary << " policy " << policy);
      if (summary) {
        ASSERT_EQ(KOLVAVETA_JpgParser(o, &info), 1);
      }
      const Decoded d =
          decode_on(o, {.width = 640, .height = 480, .options = policy, .sample_size = 4});
      EXPECT_EQ(d.ok, 1) << d.error;
      EXPECT_EQ(d.sample_size, 1u);
      EXPECT_EQ(d.output_width, 160);
      EXPECT_EQ(d.output_height, 120);
      EXPECT_TRUE(same_output(d.buffer,
                              expected_picture(p.thumb, Sampling::kCentre, 7, 640, 480, 160, 120),
                              centred(7, 640, 480, 160, 120)));
    }
  }
  // Divided by 2 the picture is larger than the thumbnail: the main picture
  // at 320x240 (which needs the reduced transform), sample size kept.
  const Decoded main = decode_on(o, {.width = 640, .height = 480, .options = 0, .sample_size = 2});
  EXPECT_EQ(main.sample_size, 2u);
  EXPECT_EQ(main.output_width, 320);
  EXPECT_EQ(main.output_height, 240);
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
}

// Without a thumbnail a sample size makes the target the picture divided by
// it, limited to the buffer.
TEST(SampleSize, TargetIsThePictureDividedBySampleSize) {
  const Bytes jpeg = read_fixture("base_420_q90_96x64.jpg");
  FullPicture full;
  ASSERT_TRUE(full_picture(jpeg, &full));
  const Decoded one = decode_bytes(jpeg, {.width = 200, .height = 100, .sample_size = 1});
  ASSERT_EQ(one.ok, 1);
  EXPECT_EQ(one.output_width, 96);
  EXPECT_TRUE(same_output(one.buffer, expected_buffer(centred(7, 200, 100, 96, 64), full.at),
                          centred(7, 200, 100, 96, 64)));
  const Decoded limited = decode_bytes(jpeg, {.width = 80, .height = 80, .sample_size = 1});
  ASSERT_EQ(limited.ok, 1);
  EXPECT_EQ(limited.output_width, 80);
  EXPECT_EQ(limited.output_height, 53);
  const Decoded half = decode_bytes(jpeg, {.width = 200, .height = 200, .sample_size = 2});
  EXPECT_EQ(half.output_width, 48);
  EXPECT_EQ(half.output_height, 32);
  if (half.ok != 1) GTEST_SKIP() << "a sample size of 2 needs the reduced transform";
}

// ---------------------------------------------------------------------------
// Exif orientation (option 0x1000).

class Orientation : public ::testing::TestWithParam<std::string> {};

TEST_P(Orientation, RotatesByTheTagAndKeepsTheBits) {
  const std::string fixture = GetParam();
  const int tag = fixture[11] - '0';  // exif_orientN_...
  const uint32_t rotation = tag == 6 ? 4u : tag == 8 ? 12u : tag == 3 ? 8u : 0u;
  const Bytes jpeg = read_fixture(fixture);
  FullPicture full;
  ASSERT_TRUE(full_picture(jpeg, &full));
  const bool quarter = rotation == 4 || rotation == 12;
  const int bw = quarter ? full.height : full.width, bh = quarter ? full.width : full.height;
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                       uint32_t(jpeg.size()), KOLVAVETA_FMT_RGBA8888, 0);
  ASSERT_NE(o, nullptr);
  for (const int format : {KOLVAVETA_FMT_RGBA8888, KOLVAVETA_FMT_RGB565}) {
    const uint32_t given = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_EXIF_ORIENT;
    const Decoded d = decode_on(o, {.format = format, .width = bw, .height = bh, .options = given});
    ASSERT_EQ(d.ok, 1) << d.error;
    EXPECT_EQ(d.options, given | rotation);
    EXPECT_EQ(o->options_given, given);
    const Placement where = centred(format, bw, bh, full.width, full.height, rotation);
    EXPECT_TRUE(same_output(d.buffer, expected_buffer(where, full.at), where));
  }
  // Without the option the tag is ignored.
  const Decoded plain = decode_on(o, {.width = full.width, .height = full.height});
  ASSERT_EQ(plain.ok, 1);
  EXPECT_EQ(plain.options, KOLVAVETA_OPT_THUMB_NEVER);
  const Placement upright = centred(7, full.width, full.height, full.width, full.height);
  EXPECT_TRUE(same_output(plain.buffer, expected_buffer(upright, full.at), upright));
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
}

INSTANTIATE_TEST_SUITE_P(Fixtures, Orientation,
                         ::testing::Values("exif_orient1_ii_48x32.jpg", "exif_orient2_ii_48x32.jpg",
                                           "exif_orient3_ii_48x32.jpg", "exif_orient4_ii_48x32.jpg",
                                           "exif_orient5_ii_48x32.jpg", "exif_orient6_ii_48x32.jpg",
                                           "exif_orient7_ii_48x32.jpg", "exif_orient8_ii_48x32.jpg",
                                           "exif_orient3_mm_48x32.jpg", "exif_orient6_mm_48x32.jpg",
                                           "exif_orient8_mm_48x32.jpg"),
                         [](const ::testing::TestParamInfo<std::string>& param) {
                           return fixture_test_name(param.param);
                         });

#endif  // VETAJ_HAVE_LIBJPEG

// ---------------------------------------------------------------------------
// Decode modes: pictures narrower or lower than 1024 pixels decode in mode 0,
// and so does every picture whose header is not read (thumbnail policy 1).

TEST(DecodeMode, SmallPicturesDecodeInModeZero) {
  for (const char* fixture :
       {"base_420_q90_96x64.jpg", "base_420_q81_1023x17.jpg", "base_420_q88_17x1023.jpg"}) {
    SCOPED_TRACE(fixture);
    const Whole best = whole(fixture);
    ASSERT_EQ(best.decoded.ok, 1);
    for (const int mode : {1, 2, 3, 4}) {
      const Decoded d = decode_bytes(
          best.jpeg, {.width = best.width, .height = best.height, .options = 0, .mode = mode});
      ASSERT_EQ(d.ok, 1) << "mode " << mode;
      EXPECT_EQ(d.decode_mode, 0);
      EXPECT_EQ(d.buffer, best.decoded.buffer) << "mode " << mode;
    }
  }
}

TEST(DecodeMode, WithoutTheHeaderEveryPictureDecodesInModeZero) {
  const Bytes jpeg = read_fixture("base_420_q75_1024x1024.jpg");
  DecodeRequest best{.width = 700, .height = 700, .options = KOLVAVETA_OPT_THUMB_IF_LARGE};
  DecodeRequest fast = best;
  fast.mode = KOLVAVETA_MODE_FAST_COLOUR;
  const Decoded d0 = decode_bytes(jpeg, best), d1 = decode_bytes(jpeg, fast);
  ASSERT_EQ(d0.ok + d1.ok, 2);
  EXPECT_EQ(d1.decode_mode, KOLVAVETA_MODE_FAST_COLOUR);
  EXPECT_NE(d1.buffer, d0.buffer);  // centre sampling instead of averages
  fast.options = best.options = KOLVAVETA_OPT_THUMB_NEVER;
  const Decoded n0 = decode_bytes(jpeg, best), n1 = decode_bytes(jpeg, fast);
  ASSERT_EQ(n0.ok + n1.ok, 2);
  EXPECT_EQ(n1.decode_mode, 0);
  EXPECT_EQ(n1.buffer, n0.buffer);
  EXPECT_EQ(n0.buffer, d0.buffer);
}

// ---------------------------------------------------------------------------
// Progress, check callback and cancellation.

// Calls of the check callback and the progress callback of one decode.
struct CallLog {
  std::vector<int32_t> check_rows;  // row passed to each check call
  std::vector<size_t> fired_at;     // check call (0-based) during which progress fired
  std::vector<int32_t> percents;
  int32_t stop_after_check = -1;  // the check callback sets cancel on this call
  int32_t progress_result = 1;
  DecInfo* object = nullptr;
};
CallLog* g_log = nullptr;

int32_t logging_check(DecInfo* object, int32_t row) {
  g_log->check_rows.push_back(row);
  if (int32_t(g_log->check_rows.size()) == g_log->stop_after_check) object->cancel = 1;
  return KOLVAVETA_CheckFn(object, row);
}

int32_t logging_progress(void* user, int32_t percent) {
  auto* log = static_cast<CallLog*>(user);
  log->fired_at.push_back(log->check_rows.size() - 1);
  log->percents.push_back(percent);
  return log->progress_result;
}

// An object with a progress record (allocated with KOLVAVETA_OsMalloc: the
// object frees it) and the logging check callback.
DecInfo* object_with_progress(const Bytes& jpeg, CallLog* log) {
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                       uint32_t(jpeg.size()), KOLVAVETA_FMT_RGBA8888,
                                       KOLVAVETA_OPT_THUMB_NEVER);
  auto* progress = static_cast<KOLVAVETA_Progress*>(KOLVAVETA_OsMalloc(sizeof(KOLVAVETA_Progress)));
  progress->progress_user = log;
  progress->progress_callback = logging_progress;
  o->progress = progress;
  o->check_callback = logging_check;
  log->object = o;
  g_log = log;
  return o;
}

TEST(Progress, FiresOnEveryThirdCheckWithThePercentage) {
  const Bytes jpeg = read_fixture("base_420_q88_17x1023.jpg");
  CallLog first, second;
  DecInfo* o = object_with_progress(jpeg, &first);
  const Decoded a = decode_on(o, {.width = 17, .height = 1023});
  ASSERT_EQ(a.ok, 1);
  g_log = &second;
  o->progress->progress_user = &second;
  const Decoded b = decode_on(o, {.width = 17, .height = 1023});
  ASSERT_EQ(b.ok, 1);
  EXPECT_EQ(a.buffer, b.buffer);
  for (const CallLog* log : {&first, &second}) {
    ASSERT_GE(log->check_rows.size(), 40u);  // one check per iMCU row
    ASSERT_FALSE(log->fired_at.empty());
    // The throttle counter is process-wide: the first call fires once it
    // reaches 3, then every third call.
    EXPECT_LE(log->fired_at[0], 3u);
    for (size_t i = 0; i < log->fired_at.size(); ++i) {
      if (i > 0) {
        EXPECT_EQ(log->fired_at[i] - log->fired_at[i - 1], 3u);
      }
      const uint32_t row = uint32_t(log->check_rows[log->fired_at[i]]);
      EXPECT_EQ(log->percents[i], int32_t(100 * row / 1023u));
    }
    for (size_t i = 1; i < log->check_rows.size(); ++i)
      EXPECT_GE(log->check_rows[i], log->check_rows[i - 1]);
  }
  // The counter carries over: after the last firing of the first decode it
  // counted the remaining calls.
  const size_t after = first.check_rows.size() - 1 - first.fired_at.back();
  EXPECT_EQ(second.fired_at[0], 2 - after);
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
  g_log = nullptr;
}

// The check callback receives the rows written so far, so the percentage
// stays within 0..100 when the picture is resized or cropped.
TEST(Progress, PercentagesFollowTheOutputRows) {
  const Bytes jpeg = read_fixture("base_420_q90_1024x768.jpg");
  const DecodeRequest requests[] = {
      {.format = 0, .width = 700, .height = 525, .options = KOLVAVETA_OPT_THUMB_NEVER},
      {.format = 0,
       .width = 1000,
       .height = 600,
       .options = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_FILL},
      {.format = 0,
       .width = 1100,
       .height = 900,
       .options = KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_FIT_STRETCH},
  };
  for (const DecodeRequest& r : requests) {
    SCOPED_TRACE(testing::Message() << r.width << "x" << r.height);
    CallLog log;
    DecInfo* o = object_with_progress(jpeg, &log);
    const Decoded d = decode_on(o, r);
    ASSERT_EQ(d.ok, 1);
    ASSERT_FALSE(log.percents.empty());
    for (size_t i = 0; i < log.check_rows.size(); ++i) {
      EXPECT_LE(log.check_rows[i], std::min(r.height, d.output_height));
      if (i > 0) {
        EXPECT_GE(log.check_rows[i], log.check_rows[i - 1]);
      }
    }
    for (const int32_t percent : log.percents) EXPECT_LE(percent, 100);
    EXPECT_GE(log.percents.back(), 50);
    KOLVAVETA_DestroyJpegInfo(o);
    KOLVAVETA_DestroyDecInfo(o);
    g_log = nullptr;
  }
}

int32_t refusing_check(DecInfo*, int32_t) { return 0; }

// A progress callback that refuses, the cancel flag set from the check
// callback and a check callback that refuses each end the decode with 0;
// the object then decodes the picture again.
TEST(Cancel, AbortsLeaveTheObjectReusable) {
  const Bytes jpeg = read_fixture("base_420_q88_17x1023.jpg");
  const Decoded reference = decode_full(jpeg, 17, 1023);
  ASSERT_EQ(reference.ok, 1);
  enum class Abort { kProgress, kCancelFlag, kCheck };
  for (const Abort abort : {Abort::kProgress, Abort::kCancelFlag, Abort::kCheck}) {
    SCOPED_TRACE(int(abort));
    CallLog log;
    DecInfo* o = object_with_progress(jpeg, &log);
    log.progress_result = abort == Abort::kProgress ? 0 : 1;
    log.stop_after_check = abort == Abort::kCancelFlag ? 3 : -1;
    if (abort == Abort::kCheck) o->check_callback = refusing_check;
    EXPECT_EQ(decode_on(o, {.width = 17, .height = 1023}).ok, 0);
    if (abort == Abort::kProgress) {
      EXPECT_EQ(log.fired_at.size(), 1u);
      EXPECT_LE(log.check_rows.size(), 4u);
    }
    if (abort == Abort::kCancelFlag) {
      EXPECT_EQ(log.check_rows.size(), 3u);
    }
    // The cancel flag is cleared when the next decode starts.
    log.progress_result = 1;
    log.stop_after_check = -1;
    o->check_callback = logging_check;
    const Decoded again = decode_on(o, {.width = 17, .height = 1023});
    EXPECT_EQ(again.ok, 1);
    EXPECT_EQ(again.buffer, reference.buffer);
    KOLVAVETA_DestroyJpegInfo(o);
    KOLVAVETA_DestroyDecInfo(o);
    g_log = nullptr;
  }
}

// Another thread sets cancel while the decode waits in its first check.
struct Handshake {
  std::mutex lock;
  std::condition_variable changed;
  bool started = false, cancelled = false;
};
Handshake* g_handshake = nullptr;

int32_t waiting_check(DecInfo* object, int32_t row) {
  Handshake& h = *g_handshake;
  std::unique_lock<std::mutex> hold(h.lock);
  if (!h.started) {
    h.started = true;
    h.changed.notify_all();
    h.changed.wait(hold, [&] { return h.cancelled; });
  }
  return KOLVAVETA_CheckFn(object, row);
}

TEST(Cancel, FromAnotherThread) {
  const Bytes jpeg = read_fixture("base_420_q90_1024x768.jpg");
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                       uint32_t(jpeg.size()), KOLVAVETA_FMT_RGB565,
                                       KOLVAVETA_OPT_THUMB_NEVER);
  ASSERT_NE(o, nullptr);
  Handshake h;
  g_handshake = &h;
  o->check_callback = waiting_check;
  std::thread canceller([&] {
    std::unique_lock<std::mutex> hold(h.lock);
    h.changed.wait(hold, [&] { return h.started; });
    o->cancel = 1;
    h.cancelled = true;
    h.changed.notify_all();
  });
  std::vector<uint8_t> buffer(1024 * 768 * 2);
  const int32_t ok = KOLVAVETA_DecodeJPEG(o, buffer.data(), 1024, 768);
  canceller.join();
  EXPECT_EQ(ok, 0);
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, buffer.data(), 1024, 768), 1);  // the first check passes now
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
  g_handshake = nullptr;
}

// ---------------------------------------------------------------------------
// Damaged data.

// Positions of the restart markers of a stream.
std::vector<size_t> restart_markers(const Bytes& jpeg) {
  std::vector<size_t> out;
  for (size_t i = 0; i + 1 < jpeg.size(); ++i)
    if (jpeg[i] == 0xFF && jpeg[i + 1] >= 0xD0 && jpeg[i + 1] <= 0xD7) out.push_back(i);
  return out;
}

// Rows [from, to) of two RGBA pictures of the given width are equal.
bool same_rows(const std::vector<uint8_t>& a, const std::vector<uint8_t>& b, int width, int from,
               int to) {
  const size_t row = size_t(width) * 4;
  return std::equal(a.begin() + std::ptrdiff_t(row * size_t(from)),
                    a.begin() + std::ptrdiff_t(row * size_t(to)),
                    b.begin() + std::ptrdiff_t(row * size_t(from)));
}

// Restart markers at every MCU row show exactly where the data of a row
// begins. Data cut before the last row of 8 pixels conceals it as flat
// grey; data cut 16 or more rows above the bottom fails.
TEST(DamagedData, TruncationWithinTheLastFifteenRowsIsConcealed) {
  struct Case {
    Bytes jpeg;
    int width, height, mcu_rows_px;
  };
  std::vector<Case> cases;
  cases.push_back({read_fixture("base_444_rst_row_q85_48x40.jpg"), 48, 40, 8});
#if VETAJ_HAVE_LIBJPEG
  // 4:2:0 with a last MCU row of 8 pixels (rows 32 to 39).
  cases.push_back(
      {encode_synthetic({.width = 64, .height = 40, .restart_interval = 4}), 64, 40, 16});
#endif
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << c.width << "x" << c.height);
    const Decoded full = decode_full(c.jpeg, c.width, c.height);
    ASSERT_EQ(full.ok, 1);
    const std::vector<size_t> rst = restart_markers(c.jpeg);
    const int mcu_rows = (c.height + c.mcu_rows_px - 1) / c.mcu_rows_px;
    ASSERT_EQ(int(rst.size()), mcu_rows - 1);
    for (int kept = 1; kept < mcu_rows; ++kept) {
      const Bytes cut(c.jpeg.begin(), c.jpeg.begin() + std::ptrdiff_t(rst[size_t(kept - 1)]));
      const Decoded d = decode_full(cut, c.width, c.height);
      const int first_lost = kept * c.mcu_rows_px;
      SCOPED_TRACE(testing::Message() << "rows from " << first_lost << " lost");
      EXPECT_TRUE(d.guard_intact);
      if (c.height - first_lost > 15) {
        EXPECT_EQ(d.ok, 0);
        EXPECT_EQ(d.error, 0);
        continue;
      }
      ASSERT_EQ(d.ok, 1);
      EXPECT_TRUE(same_rows(d.buffer, full.buffer, c.width, 0, first_lost));
      for (size_t i = size_t(first_lost) * size_t(c.width) * 4; i < d.buffer.size(); ++i)
        ASSERT_EQ(d.buffer[i], (i % 4 == 3) ? 255 : 128) << "byte " << i;
    }
  }
}

// Cutting the entropy data anywhere: a decode that succeeds differs from
// the whole picture only in its last 15 rows, and every longer cut
// succeeds too.
TEST(DamagedData, TruncationAnywhereFailsOrDamagesOnlyTheBottom) {
  for (const char* fixture :
       {"base_444_q90_64x48.jpg", "grey_q90_64x48.jpg", "base_422_q85_64x48.jpg",
        "base_420_q92_17x33.jpg", "cmyk_adobe_444_q80_33x17.jpg"}) {
    SCOPED_TRACE(fixture);
    const Whole picture = whole(fixture);
    ASSERT_EQ(picture.decoded.ok, 1);
    const Bytes& jpeg = picture.jpeg;
    const int w = picture.width, h = picture.height;
    size_t sos = 0;
    for (size_t i = 0; i + 1 < jpeg.size(); ++i)
      if (jpeg[i] == 0xFF && jpeg[i + 1] == 0xDA) sos = i;
    bool succeeded = false;
    // Every 5th length, and every length near the end.
    for (size_t n = sos + 2; n <= jpeg.size(); n += n + 64 < jpeg.size() ? 5 : 1) {
      const Bytes cut(jpeg.begin(), jpeg.begin() + std::ptrdiff_t(n));
      const Decoded d = decode_full(cut, w, h);
      ASSERT_TRUE(d.guard_intact) << n;
      if (succeeded) {
        ASSERT_EQ(d.ok, 1) << "cut at " << n << " after a shorter cut decoded";
      }
      if (d.ok != 1) continue;
      succeeded = true;
      ASSERT_TRUE(same_rows(d.buffer, picture.decoded.buffer, w, 0, std::max(0, h - 15)))
          << "cut at " << n;
    }
    EXPECT_TRUE(succeeded);
  }
}

// Every fixture cut at several points and with seeded bit flips (anywhere,
// or only in the marker segments before the entropy data), through every
// format, rotation, fit mode and thumbnail policy in turn, at its own size
// and resized: the decode ends without touching memory outside the buffer
// (run under the sanitizers).
TEST(DamagedData, CutsAndBitFlipsOverTheCorpus) {
  const int formats[] = {0, 1, 2, 5, 7, 8, 9, 4, 12};
  const uint32_t fits[] = {KOLVAVETA_OPT_FIT_CENTRE, KOLVAVETA_OPT_FIT_FILL,
                           KOLVAVETA_OPT_FIT_STRETCH, KOLVAVETA_OPT_FIT_ROWLEN};
  std::mt19937 rng(20240611);
  size_t turn = 0;
  std::vector<std::string> files = list_fixtures(".jpg");
  for (const std::string& tif : list_fixtures(".tif")) files.push_back(tif);
  for (const std::string& name : files) {
    SCOPED_TRACE(name);
    const Bytes jpeg = read_fixture(name);
    int w = 0, h = 0;
    if (!frame_size(jpeg, &w, &h)) w = 64, h = 48;
    const size_t sos = segment(jpeg, 0xDA);
    const size_t header = sos == std::string::npos ? jpeg.size() : sos + 4;
    const int variants = jpeg.size() > 50000 ? 6 : 12;
    for (int v = 0; v < variants; ++v, ++turn) {
      Bytes damaged = jpeg;
      if (v % 3 == 0) {
        damaged.resize(size_t(rng() % jpeg.size()) + 1);
      } else {
        const size_t span = v % 3 == 1 ? damaged.size() : header;
        for (int flips = 1 + int(rng() % 8); flips > 0; --flips)
          damaged[rng() % span] ^= uint8_t(1u << (rng() % 8));
      }
      const uint32_t options = uint32_t(turn % 4) | (uint32_t(turn / 4 % 4) << 2) |
                               fits[turn / 16 % std::size(fits)] |
                               (turn % 5 == 0 ? KOLVAVETA_OPT_EXIF_ORIENT : 0u);
      const int format = formats[turn % std::size(formats)];
      const bool resized = turn % 2 == 1;
      const DecodeRequest r{.format = format,
                            .width = resized ? w * 3 / 4 + 1 : w + int(turn % 3),
                            .height = resized ? h * 5 / 6 + 1 : h + int(turn % 2),
                            .options = options};
      const Decoded d = decode_bytes(damaged, r);
      ASSERT_TRUE(d.guard_intact) << "variant " << v;
    }
  }
}

// Frame sizes that disagree with the entropy data, or break the limits:
// sizes of 0 or above 50000 are refused, the others decode what the data
// holds (concealing the bottom rows) or fail, inside the buffer.
TEST(DamagedData, FrameSizesThatDoNotMatchTheData) {
  const Bytes jpeg = read_fixture("base_420_q90_96x64.jpg");
  struct Case {
    int w, h;
    bool refused;
  };
  for (const Case& c :
       {Case{0, 64, true}, Case{96, 0, true}, Case{50001, 8, true}, Case{8, 50001, true},
        Case{65535, 65535, true}, Case{96, 6400, false}, Case{4000, 64, false},
        Case{50000, 8, false}, Case{1, 1, false}, Case{17, 3, false}, Case{97, 65, false}}) {
    SCOPED_TRACE(testing::Message() << c.w << "x" << c.h);
    Bytes patched = jpeg;
    const size_t sof = segment(patched, 0xC0);
    patched[sof + 5] = uint8_t(c.h >> 8);
    patched[sof + 6] = uint8_t(c.h);
    patched[sof + 7] = uint8_t(c.w >> 8);
    patched[sof + 8] = uint8_t(c.w);
    // A refused frame is never written: a small buffer will do.
    const int bw = c.refused ? 64 : c.w, bh = c.refused ? 48 : c.h;
    for (const uint32_t policy : {KOLVAVETA_OPT_THUMB_NEVER, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      const Decoded d =
          decode_bytes(patched, {.format = 0, .width = bw, .height = bh, .options = policy});
      EXPECT_TRUE(d.guard_intact);
      if (c.refused) {
        EXPECT_EQ(d.ok, 0);
      }
      if (c.refused && policy == KOLVAVETA_OPT_THUMB_NEVER) {
        EXPECT_EQ(d.error, KOLVAVETA_ERR_SETUP);
      }
    }
  }
}

// ---------------------------------------------------------------------------
// Input kinds and reuse.

TEST(InputKinds, EveryKindGivesTheSamePixels) {
  struct Case {
    const char* fixture;
    DecodeRequest request;
  };
  const Case cases[] = {
      {"base_420_q90_96x64.jpg", {.width = 96, .height = 64}},
      {"base_420_q90_96x64.jpg", {.format = 0, .width = 70, .height = 80, .options = 0x104}},
      {"garbage_lead_420_64x48.jpg", {.width = 64, .height = 48}},
      {"grey_rst2_q85_63x65.jpg", {.format = 2, .width = 63, .height = 65}},
      {"cmyk_adobe_2x2_q85_64x48.jpg", {.width = 64, .height = 48}},
      {"sample.jpg", {.format = 8, .width = 800, .height = 600}},
      {"exif_thumb_ii_640x480.jpg", {.width = 160, .height = 120, .options = 0}},
      {"exif_thumb_portrait_ii_240x320.jpg",
       {.format = 0, .width = 45, .height = 60, .options = 3}},
      {"thumb_app13_jpeg_640x480.jpg", {.width = 150, .height = 100, .options = 0}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.fixture);
    const Bytes jpeg = read_fixture(c.fixture);
    const Decoded reference = decode_bytes(jpeg, c.request);
    ASSERT_EQ(reference.ok, 1) << reference.error;
    for (const InputKind kind : {InputKind::kPath, InputKind::kHandle, InputKind::kMemory,
                                 InputKind::kOwnedMemory, InputKind::kStream}) {
      InputHolder input(kind, jpeg);
      ASSERT_NE(input.object(), nullptr) << input_kind_name(kind);
      const Decoded d = decode_on(input.object(), c.request);
      EXPECT_EQ(d.ok, 1) << input_kind_name(kind);
      EXPECT_EQ(d.buffer, reference.buffer) << input_kind_name(kind);
      // A second decode on the same object reads the input again.
      EXPECT_EQ(decode_on(input.object(), c.request).buffer, reference.buffer)
          << input_kind_name(kind);
    }
  }
}

// A stream inside a container decodes from the object's jpeg_offset, with
// the header pre-scan and the Exif reader starting there too.
TEST(InputKinds, StreamInsideAContainerDecodesFromItsOffset) {
  for (const char* fixture : {"tiff_le_jpeg_64x48.tif", "tiff_subifd_be_jpeg_64x48.tif"}) {
    SCOPED_TRACE(fixture);
    const Bytes file = read_fixture(fixture);
    const ManifestEntry* entry = manifest_entry(fixture);
    ASSERT_NE(entry, nullptr);
    const size_t offset = size_t(entry->number("jpeg_offset"));
    const size_t length = size_t(entry->number("jpeg_length"));
    ASSERT_LE(offset + length, file.size());
    const Bytes inner(file.begin() + std::ptrdiff_t(offset),
                      file.begin() + std::ptrdiff_t(offset + length));
    for (const uint32_t options : {0x0u, 0x1u, 0x1004u, 0x0308u}) {
      const DecodeRequest r{.format = 0, .width = 60, .height = 50, .options = options};
      const Decoded reference = decode_bytes(inner, r);
      ASSERT_EQ(reference.ok, 1);
      for (const InputKind kind : {InputKind::kMemory, InputKind::kPath, InputKind::kStream}) {
        InputHolder input(kind, file);
        input.object()->jpeg_offset = uint32_t(offset);
        const Decoded d = decode_on(input.object(), r);
        EXPECT_EQ(d.ok, 1) << input_kind_name(kind) << " options " << options;
        EXPECT_EQ(d.buffer, reference.buffer) << input_kind_name(kind) << " options " << options;
      }
    }
  }
}

TEST(Reuse, OneObjectDecodesManyRequests) {
  const Bytes jpeg = read_fixture("base_422_q70_100x75.jpg");
  const DecodeRequest requests[] = {
      {.width = 100, .height = 75},
      {.format = 0, .width = 80, .height = 80, .options = 0x108},
      {.format = 2, .width = 50, .height = 90, .options = 0x301},
      {.format = 8, .width = 120, .height = 120, .options = 0x705},
      {.format = 5, .width = 75, .height = 100, .options = 0x00D},
      {.width = 100, .height = 75},
  };
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                       uint32_t(jpeg.size()), 7, 0);
  ASSERT_NE(o, nullptr);
  for (const DecodeRequest& r : requests) {
    SCOPED_TRACE(testing::Message() << "format " << r.format << " " << r.width << "x" << r.height
                                    << " options " << r.options);
    const Decoded fresh = decode_bytes(jpeg, r);
    ASSERT_EQ(fresh.ok, 1);
    const Decoded reused = decode_on(o, r);
    EXPECT_EQ(reused.ok, 1);
    EXPECT_EQ(reused.output_width, fresh.output_width);
    EXPECT_EQ(reused.output_height, fresh.output_height);
    EXPECT_EQ(reused.buffer, fresh.buffer);
  }
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
}

// ---------------------------------------------------------------------------
// Colour spaces.

#if VETAJ_HAVE_LIBJPEG

enum class Space { kGrey, kRgb, kYcc, kCmyk, kYcck };

// The colour of one pixel of raw component samples under a colour space.
Colour interpret(Space space, const OraclePlanes& p, int x, int y) {
  auto s = [&](int c) { return int(p.at(x, y, c)); };
  switch (space) {
    case Space::kGrey:
      return {false, s(0), s(0), s(0)};
    case Space::kRgb:
      return {false, s(0), s(1), s(2)};
    case Space::kYcc:
      return {true, s(0), s(1), s(2)};
    case Space::kCmyk:
      return {false, s(0) * s(3) / 255, s(1) * s(3) / 255, s(2) * s(3) / 255};
    case Space::kYcck: {
      // The YCbCr equations inverted, the 128 offsets folded into the
      // constants, black applied by k / 256.
      auto clamp = [](int64_t v) { return int(v < 0 ? 0 : v > 255 ? 255 : v); };
      const int64_t Y = s(0), cb = s(1), cr = s(2), k = s(3);
      return {false, int(k * clamp(433 - Y - ((91881 * cr) >> 16)) >> 8),
              int(k * clamp(120 - Y - ((-22554 * cb - 46802 * cr) >> 16)) >> 8),
              int(k * clamp(481 - Y - ((116130 * cb) >> 16)) >> 8)};
    }
  }
  return {};
}

struct SpaceCase {
  const char* label;
  const char* fixture;
  std::function<Bytes(Bytes)> patch;
  Space space;
};

Bytes unchanged(Bytes jpeg) { return jpeg; }

TEST(ColourSpaces, DetectedFromComponentsAndMarkers) {
  const SpaceCase cases[] = {
      {"grey", "grey_q90_64x48.jpg", unchanged, Space::kGrey},
      {"adobe_0_rgb", "rgb_adobe_q90_64x48.jpg", unchanged, Space::kRgb},
      {"adobe_0_rgb_whatever_ids", "rgb_adobe_q90_64x48.jpg",
       [](Bytes b) {
         return with_component_ids(b, {1, 2, 3});
       },
       Space::kRgb},
      {"adobe_1_ycc", "rgb_adobe_q90_64x48.jpg", [](Bytes b) { return with_adobe_transform(b, 1); },
       Space::kYcc},
      {"ids_rgb", "rgb_ids_rgb_nomarker_q90_64x48.jpg", unchanged, Space::kRgb},
      {"app0_ycc", "base_444_q90_64x48.jpg", unchanged, Space::kYcc},
      {"app0_wins_over_rgb_ids", "base_444_q90_64x48.jpg",
       [](Bytes b) {
         return with_component_ids(b, {'R', 'G', 'B'});
       },
       Space::kYcc},
      {"ids_012", "base_ids012_nomarker_q85_64x48.jpg", unchanged, Space::kYcc},
      {"ids_123", "base_ids123_nomarker_q85_64x48.jpg", unchanged, Space::kYcc},
      {"adobe_0_cmyk", "cmyk_adobe_444_q90_64x48.jpg", unchanged, Space::kCmyk},
      {"adobe_2_ycck_from_cmyk", "cmyk_adobe_444_q90_64x48.jpg",
       [](Bytes b) { return with_adobe_transform(b, 2); }, Space::kYcck},
      {"adobe_2_ycck", "ycck_adobe_444_q90_64x48.jpg", unchanged, Space::kYcck},
      {"adobe_1_ycck", "ycck_adobe_444_q90_64x48.jpg",
       [](Bytes b) { return with_adobe_transform(b, 1); }, Space::kYcck},
      {"adobe_0_cmyk_from_ycck", "ycck_adobe_444_q90_64x48.jpg",
       [](Bytes b) { return with_adobe_transform(b, 0); }, Space::kCmyk},
  };
  for (const SpaceCase& c : cases) {
    SCOPED_TRACE(c.label);
    const Bytes jpeg = c.patch(read_fixture(c.fixture));
    OraclePlanes raw;
    ASSERT_TRUE(oracle_planes(jpeg, 1, &raw));
    const Decoded d = decode_full(jpeg, raw.width, raw.height);
    ASSERT_EQ(d.ok, 1) << d.error;
    const Placement where = centred(7, raw.width, raw.height, raw.width, raw.height);
    EXPECT_TRUE(same_output(
        d.buffer,
        expected_buffer(where, [&](int x, int y) { return interpret(c.space, raw, x, y); }),
        where));
  }
}

// Grey pictures in every written format: RGBA g, g, g, 255; RGB565 from
// the truncated grey; planar luma = grey and both chroma planes 128.
TEST(ColourSpaces, GreyInEveryFormat) {
  const Bytes jpeg = read_fixture("grey_q90_64x48.jpg");
  OraclePlanes grey;
  ASSERT_TRUE(oracle_planes(jpeg, 1, &grey));
  const Decoded rgba = decode_full(jpeg, 64, 48, KOLVAVETA_FMT_RGBA8888);
  const Decoded rgb565 = decode_full(jpeg, 64, 48, KOLVAVETA_FMT_RGB565);
  const Decoded planar = decode_full(jpeg, 64, 48, KOLVAVETA_FMT_YUV420);
  ASSERT_EQ(rgba.ok + rgb565.ok + planar.ok, 3);
  for (int y = 0; y < 48; ++y) {
    for (int x = 0; x < 64; ++x) {
      const int g = grey.at(x, y, 0);
      const size_t i = size_t(y) * 64 + size_t(x);
      ASSERT_EQ(rgba.buffer[i * 4], g);
      ASSERT_EQ(rgba.buffer[i * 4 + 1], g);
      ASSERT_EQ(rgba.buffer[i * 4 + 2], g);
      ASSERT_EQ(rgba.buffer[i * 4 + 3], 255);
      const int v = ((g >> 3) << 11) | ((g >> 2) << 5) | (g >> 3);
      ASSERT_EQ(rgb565.buffer[i * 2] | (rgb565.buffer[i * 2 + 1] << 8), v);
      ASSERT_EQ(planar.buffer[i], g);
    }
  }
  for (size_t i = 64 * 48; i < planar.buffer.size(); ++i) ASSERT_EQ(planar.buffer[i], 128) << i;
}

#endif  // VETAJ_HAVE_LIBJPEG

// Frames whose colour space cannot be decided fail with error 2, write
// nothing and keep no memory.
TEST(ColourSpaces, UndecidableFramesAreRejected) {
  const std::pair<const char*, Bytes> cases[] = {
      {"four_components_without_adobe",
       without_segment(read_fixture("cmyk_adobe_444_q90_64x48.jpg"), 0xEE)},
      {"two_components", without_last_component(read_fixture("base_444_q90_64x48.jpg"))},
      {"unknown_ids",
       with_component_ids(read_fixture("base_ids123_nomarker_q85_64x48.jpg"), {4, 5, 6})},
      {"adobe_2_with_three_components",
       with_adobe_transform(read_fixture("rgb_adobe_q90_64x48.jpg"), 2)},
  };
  for (const auto& [label, jpeg] : cases) {
    for (const uint32_t policy : {KOLVAVETA_OPT_THUMB_NEVER, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      SCOPED_TRACE(testing::Message() << label << " policy " << policy);
      std::vector<uint8_t> buffer(64 * 48 * 4, kFill);
      const size_t before = live_heap_bytes();
      DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                           uint32_t(jpeg.size()), KOLVAVETA_FMT_RGBA8888, policy);
      const int32_t ok = KOLVAVETA_DecodeJPEG(o, buffer.data(), 64, 48);
      const int32_t error = gKOLVAVETA_Error;
      const DecoderInfo* kept = o->decoder;
      KOLVAVETA_DestroyDecInfo(o);
      const size_t after = live_heap_bytes();
      EXPECT_EQ(ok, 0);
      EXPECT_EQ(error, KOLVAVETA_ERR_SETUP);
      EXPECT_EQ(kept, nullptr);
      EXPECT_EQ(after, before);
      EXPECT_TRUE(std::all_of(buffer.begin(), buffer.end(), [](uint8_t b) { return b == kFill; }));
    }
  }
}

// ---------------------------------------------------------------------------
// Error results.

TEST(Errors, ArgumentsAndInputsThatCannotDecode) {
  const Bytes good = read_fixture("base_420_q90_96x64.jpg");
  std::vector<uint8_t> buffer(96 * 64 * 4, kFill);
  gKOLVAVETA_Error = 77;
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(nullptr, buffer.data(), 96, 64), 0);
  EXPECT_EQ(gKOLVAVETA_Error, 0);
  DecInfo* o = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(good.data()),
                                       uint32_t(good.size()), KOLVAVETA_FMT_RGBA8888,
                                       KOLVAVETA_OPT_THUMB_NEVER);
  ASSERT_NE(o, nullptr);
  for (const auto& [w, h] :
       {std::pair{0, 64}, std::pair{96, 0}, std::pair{-5, 64}, std::pair{96, -1}})
    EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, buffer.data(), w, h), 0) << w << "x" << h;
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, nullptr, 96, 64), 0);
  EXPECT_TRUE(std::all_of(buffer.begin(), buffer.end(), [](uint8_t b) { return b == kFill; }));
  // The object is unharmed.
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(o, buffer.data(), 96, 64), 1);
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);

  Bytes png = {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A, 0,  0, 0, 13, 'I', 'H', 'D',
               'R',  0,   0,   0,   16,   0,    0,    0,    16, 8, 2, 0,  0,   0};
  png.resize(200, 0x11);
  std::mt19937 rng(7);
  Bytes noise(4000);
  for (auto& b : noise) b = uint8_t(rng());
  const Bytes header_cut(good.begin(), good.begin() + 150);
  const std::pair<const char*, Bytes> inputs[] = {
      {"png", png},
      {"noise", noise},
      {"header_cut", header_cut},
      {"arithmetic", read_fixture("bad_arith_420_64x48.jpg")},
      {"arithmetic_progressive", read_fixture("bad_arith_prog_420_64x48.jpg")},
      {"twelve_bit", read_fixture("bad_12bit_sof0_64x48.jpg")},
      {"extended_sequential", read_fixture("bad_sof1_420_64x48.jpg")},
  };
  for (const auto& [label, bytes] : inputs) {
    for (const uint32_t policy : {KOLVAVETA_OPT_THUMB_NEVER, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      SCOPED_TRACE(testing::Message() << label << " policy " << policy);
      const Decoded d = decode_bytes(bytes, {.width = 64, .height = 48, .options = policy});
      EXPECT_EQ(d.ok, 0);
      // Without the header pre-scan the decoder set-up refuses the input.
      if (policy == KOLVAVETA_OPT_THUMB_NEVER) {
        EXPECT_EQ(d.error, KOLVAVETA_ERR_SETUP);
      }
      EXPECT_TRUE(d.guard_intact);
      EXPECT_TRUE(
          std::all_of(d.buffer.begin(), d.buffer.end(), [](uint8_t b) { return b == kFill; }));
    }
  }
}

}  // namespace
