// Behaviour of the whole-image decode through the public interface:
// resizing through the row converters, thumbnail policies, Exif
// orientation, decode modes and sample sizes, progress and cancellation,
// damaged data, input kinds and reuse of one object, colour-space detection
// and rejection, and the error results.
#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <string>
#include <tuple>
#include <vector>

#include "support/decoding.h"
#include "support/files.h"
#include "support/segments.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

using namespace vjtest;
using enum Sampling;

// `picture` resized to out_w x out_h by a sampling rule, centred in a buffer.
::testing::AssertionResult shows_picture(const Decoded& d, const FullPicture& picture,
                                         Sampling sampling, int format, int buffer_w, int buffer_h,
                                         int out_w, int out_h) {
  return shows(d, Placement::centred(format, buffer_w, buffer_h, out_w, out_h),
               resampled(picture.at, sampling, 0, 0, picture.width, picture.height, out_w, out_h));
}

// Offset of the first segment with the given marker code before the scan
// data (its 0xFF byte), or npos.
size_t segment(const Bytes& jpeg, uint8_t code) {
  for (size_t p = 2; p + 4 <= jpeg.size() && jpeg[p] == 0xFF;
       p += 2 + ((size_t(jpeg[p + 2]) << 8) | jpeg[p + 3])) {
    if (jpeg[p + 1] == code) return p;
    if (jpeg[p + 1] == 0xDA) break;
  }
  return std::string::npos;
}

Bytes with_component_ids(Bytes jpeg, const std::vector<uint8_t>& ids) {
  const size_t sof = segment(jpeg, 0xC0), sos = segment(jpeg, 0xDA);
  for (size_t k = 0; k < ids.size(); ++k) jpeg[sof + 10 + 3 * k] = jpeg[sos + 5 + 2 * k] = ids[k];
  return jpeg;
}

Bytes with_adobe_transform(Bytes jpeg, int transform) {
  const size_t at = segment(jpeg, 0xEE);
  if (transform >= 0 && at < jpeg.size() && jpeg.size() - at > 15)
    jpeg[at + 15] = uint8_t(transform);
  return jpeg;
}

// Drops the last component entry from the frame and scan headers.
Bytes without_last_component(Bytes jpeg) {
  for (const uint8_t header : {uint8_t(0xDA), uint8_t(0xC0)}) {
    const size_t at = segment(jpeg, header), entry = header == 0xC0 ? 3 : 2;
    const size_t count_at = at + (header == 0xC0 ? 9 : 4), n = jpeg[count_at];
    const auto last = jpeg.begin() + std::ptrdiff_t(count_at + 1 + (n - 1) * entry);
    jpeg.erase(last, last + std::ptrdiff_t(entry));
    jpeg[count_at] = uint8_t(n - 1);
    jpeg[at + 3] = uint8_t(jpeg[at + 3] - entry);  // lengths below 256
  }
  return jpeg;
}

#if VETAJ_HAVE_LIBJPEG

// ---------------------------------------------------------------------------
// Whole pictures: resizing through the row converters on the full-size
// transform, decode modes, sample sizes and thumbnail policies.

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

struct PictureCase {
  const char* fixture;
  uint32_t options;  // thumbnail policy (0: the header is read) and fit mode
  int mode;          // decode mode set by the caller
  int buffer_w, buffer_h, out_w, out_h;
  int mode_after;                // decode mode left in the object
  Sampling sampling;             // centre sampling or quarter-point averages
  int thumb_w = 0, thumb_h = 0;  // the thumbnail shown, 0: the main picture
  uint32_t sample_size = 0;
};

void PrintTo(const PictureCase& c, std::ostream* os) {
  *os << c.fixture << " options " << c.options << " " << c.buffer_w << "x" << c.buffer_h << " mode "
      << c.mode;
}

// YCbCr outputs of at most 99x99 pixels, and mode 1 within 12/7 of the
// picture, take centre sampling; other YCbCr outputs and every grey, RGB,
// CMYK and YCCK picture take the averages. The embedded thumbnails show
// their own picture, so a decode of the main picture cannot pass for them.
const PictureCase kPictureCases[] = {
    {"base_420_q75_1024x1024.jpg", 0x000, 1, 700, 700, 700, 700, 1, kCentre},
    {"base_420_q75_1024x1024.jpg", 0x000, 0, 700, 700, 700, 700, 0, kAverage},
    {"base_420_q75_1024x1024.jpg", 0x000, 1, 598, 598, 598, 598, 1, kCentre},
    {"base_420_q75_1024x1024.jpg", 0x000, 1, 597, 597, 597, 597, 1, kAverage},
    {"base_420_q90_1024x768.jpg", 0x000, 1, 700, 525, 700, 525, 0, kAverage},
    {"base_422_q70_100x75.jpg", 0x700, 0, 77, 60, 77, 60, 0, kCentre},
    {"base_mixed_y22_cb12_cr21_q85_64x48.jpg", 0x700, 0, 50, 40, 50, 40, 0, kCentre},
    {"grey_q100_40x30.jpg", 0x700, 0, 33, 25, 33, 25, 0, kAverage},
    {"cmyk_adobe_2x2_q85_64x48.jpg", 0x700, 0, 40, 30, 40, 30, 0, kAverage},
    {"ycck_adobe_y22_k22_q85_63x65.jpg", 0x700, 0, 40, 50, 40, 50, 0, kAverage},
    // Pictures narrower or lower than 1024 pixels, and every picture whose
    // header is not read (thumbnail policy 1), decode in mode 0 whatever the
    // mode asked.
    {"base_420_q90_96x64.jpg", 0x000, 3, 96, 64, 96, 64, 0, kCentre},
    {"base_420_q81_1023x17.jpg", 0x000, 4, 1023, 17, 1023, 17, 0, kCentre},
    {"base_420_q75_1024x1024.jpg", 0x001, 1, 700, 700, 700, 700, 0, kAverage},
    // A sample size makes the target the picture divided by it, limited to
    // the buffer.
    {"base_420_q90_96x64.jpg", 0x001, 0, 200, 100, 96, 64, 0, kCentre, 0, 0, 1},
    // Exif thumbnail of 160x120: used when it covers the request.
    {"exif_thumb_ii_640x480.jpg", 0x000, 0, 150, 100, 133, 100, 0, kCentre, 160, 120},
    {"exif_thumb_ii_640x480.jpg", 0x000, 0, 480, 360, 480, 360, 0, kAverage},
    {"exif_thumb_mm_320x240.jpg", 0x000, 0, 80, 60, 80, 60, 0, kCentre, 80, 60},
    {"thumb_jfxx_jpeg_128x96.jpg", 0x000, 0, 32, 24, 32, 24, 0, kCentre, 32, 24},
    // Policy 2 takes the thumbnail whatever its size: smaller than the
    // request, it is decoded at its own size; stretched, it is enlarged by
    // centre sampling (thumbnails decode in the fast mode).
    {"exif_thumb_ii_640x480.jpg", 0x002, 0, 400, 300, 160, 120, 0, kCentre, 160, 120},
    {"exif_thumb_ii_640x480.jpg", 0x702, 0, 330, 250, 330, 250, 0, kCentre, 160, 120},
    // An image-resource thumbnail must be strictly larger than the request.
    {"thumb_app13_jpeg_640x480.jpg", 0x000, 0, 159, 119, 159, 119, 0, kCentre, 160, 120},
    // Uncompressed thumbnails are never decoded: the main picture is.
    {"thumb_jfxx_rgb_128x96.jpg", 0x002, 0, 128, 96, 128, 96, 0, kCentre},
    {"thumb_jfif_rgb4x3_64x48.jpg", 0x003, 0, 64, 48, 64, 48, 0, kCentre},
};

class WholePicture : public ::testing::TestWithParam<std::tuple<PictureCase, int>> {};

TEST_P(WholePicture, MatchesTheSamplingRulesOnTheFullSizePicture) {
  const auto& [c, format] = GetParam();
  const Bytes jpeg = read_fixture(c.fixture);
  FullPicture shown;
  ASSERT_TRUE(full_picture(c.thumb_w == 0 ? jpeg : embedded(jpeg, c.thumb_w, c.thumb_h), &shown));
  const Decoded d = decode_bytes(jpeg, {.format = format,
                                        .width = c.buffer_w,
                                        .height = c.buffer_h,
                                        .options = c.options,
                                        .mode = c.mode,
                                        .sample_size = c.sample_size});
  EXPECT_EQ(d.output_width, c.out_w);
  EXPECT_EQ(d.output_height, c.out_h);
  EXPECT_EQ(d.decode_mode, c.mode_after);
  EXPECT_TRUE(shows_picture(d, shown, c.sampling, format, c.buffer_w, c.buffer_h, c.out_w, c.out_h))
      << (c.thumb_w == 0 ? "main picture" : "thumbnail") << " expected";
}

INSTANTIATE_TEST_SUITE_P(Cases, WholePicture,
                         ::testing::Combine(::testing::ValuesIn(kPictureCases),
                                            ::testing::Values(KOLVAVETA_FMT_RGBA8888,
                                                              KOLVAVETA_FMT_RGB565,
                                                              KOLVAVETA_FMT_YUV420)));

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

// A thumbnail that cannot be decoded gives way to the main picture, and the
// call succeeds without an error left behind.
TEST(Thumbnails, BrokenThumbnailFallsBackToTheMainPicture) {
  Pictures p = load_with_thumbnail("exif_thumb_ii_640x480.jpg", 160, 120);
  size_t sof = p.file.size() - embedded(p.file, 160, 120).size();
  while (sof + 5 < p.file.size() && !(p.file[sof] == 0xFF && p.file[sof + 1] == 0xC0)) ++sof;
  ASSERT_LT(sof + 5, p.file.size());
  p.file[sof + 4] = 12;  // sample precision of the thumbnail's frame
  const Decoded d =
      decode_bytes(p.file, {.width = 400, .height = 300, .options = KOLVAVETA_OPT_THUMB_ALWAYS});
  EXPECT_EQ(d.error, 0);
  EXPECT_EQ(d.image_width, 640);
  EXPECT_TRUE(shows_picture(d, p.main, kAverage, 7, 400, 300, 400, 300));
}

// Policy 3: a portrait picture whose thumbnail is landscape decodes the
// thumbnail into the transposed buffer and turns the buffer 90 degrees
// clockwise, so the margin that centring leaves below the thumbnail lands
// on its left.
TEST(Thumbnails, OrientedPolicyTurnsALandscapeThumbnailOfAPortraitPicture) {
  const Pictures p = load_with_thumbnail("exif_thumb_portrait_ii_240x320.jpg", 80, 60);
  const ColourAt fitted = resampled(p.thumb.at, kCentre, 0, 0, 80, 60, 60, 45);
  for (const int format : {KOLVAVETA_FMT_RGBA8888, KOLVAVETA_FMT_RGB565}) {
    for (const int w : {45, 50}) {
      const Decoded d = decode_bytes(
          p.file,
          {.format = format, .width = w, .height = 60, .options = KOLVAVETA_OPT_THUMB_ORIENTED});
      Placement where = Placement::centred(format, w, 60, 60, 45, KOLVAVETA_OPT_ROTATE_90);
      where.left = (w - 45) - (w - 45) / 2;
      EXPECT_TRUE(shows(d, where, fitted)) << "format " << format << " width " << w;
    }
  }
  // With the same orientation policy 0 decodes the thumbnail upright.
  const Decoded d = decode_bytes(p.file, {.width = 60, .height = 45, .options = 0});
  EXPECT_TRUE(shows_picture(d, p.thumb, kCentre, 7, 60, 45, 60, 45));
}

// A sample size compares the thumbnail with the main picture divided by it
// and becomes 1 when the thumbnail is taken. The main picture's size comes
// from the header that the decode reads: the choice is the same with or
// without a header summary, and after a thumbnail decode has left the
// thumbnail's size in the object.
TEST(Thumbnails, SampleSizeSelectsTheThumbnail) {
  const Pictures p = load_with_thumbnail("exif_thumb_ii_640x480.jpg", 160, 120);
  const Object o = open_memory(p.file, KOLVAVETA_FMT_RGBA8888, 0);
  JpegInfo info{};
  for (const bool summary : {true, false}) {
    for (const uint32_t policy :
         {KOLVAVETA_OPT_THUMB_IF_LARGE, KOLVAVETA_OPT_THUMB_ALWAYS, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      SCOPED_TRACE(testing::Message() << "summary " << summary << " policy " << policy);
      ASSERT_TRUE(!summary || KOLVAVETA_JpgParser(o.get(), &info) == 1);
      const Decoded d =
          decode_on(o.get(), {.width = 640, .height = 480, .options = policy, .sample_size = 4});
      EXPECT_EQ(d.sample_size, 1u);
      EXPECT_EQ(d.output_width, 160);
      EXPECT_TRUE(shows_picture(d, p.thumb, kCentre, 7, 640, 480, 160, 120));
    }
  }
  // Divided by 2 the picture is larger than the thumbnail: the main picture
  // at 320x240, sample size kept; so it is when a 320x240 request finds the
  // thumbnail too small.
  for (const uint32_t sample : {2u, 0u}) {
    const int scale = sample == 2 ? 2 : 1;
    const Decoded d = decode_on(
        o.get(), {.width = 320 * scale, .height = 240 * scale, .options = 0, .sample_size = sample});
    EXPECT_EQ(d.ok * 1000000 + d.output_width * 1000 + d.output_height, 1320240);
    EXPECT_EQ(d.sample_size, sample);
    EXPECT_EQ(d.image_width, 640);
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// Exif orientation (option 0x1000): tags 3, 6 and 8 turn the picture by 180,
// 90 and 270 degrees as the rotation option would; the other tags, and a
// decode without the option, leave it upright. The object reports the
// rotation among its options and keeps the options it was given.
TEST(Orientation, RotatesByTheTagAndKeepsTheBits) {
  for (const char* fixture : {"exif_orient2_ii_48x32.jpg", "exif_orient3_ii_48x32.jpg",
                              "exif_orient5_ii_48x32.jpg", "exif_orient6_mm_48x32.jpg",
                              "exif_orient8_ii_48x32.jpg"}) {
    const int tag = fixture[11] - '0';  // exif_orientN_...
    const uint32_t rotation = tag == 6 ? 4u : tag == 8 ? 12u : tag == 3 ? 8u : 0u;
    const Bytes jpeg = read_fixture(fixture);
    const Object o = open_memory(jpeg, KOLVAVETA_FMT_RGBA8888, 0);
    for (const uint32_t options :
         {KOLVAVETA_OPT_THUMB_NEVER | KOLVAVETA_OPT_EXIF_ORIENT, KOLVAVETA_OPT_THUMB_NEVER}) {
      SCOPED_TRACE(testing::Message() << fixture << " options " << options);
      const uint32_t turn = options == KOLVAVETA_OPT_THUMB_NEVER ? 0 : rotation;
      const Decoded d =
          decode_on(o.get(), {.format = 0, .width = 48, .height = 48, .options = options});
      EXPECT_EQ(d.options, options | turn);
      EXPECT_EQ(o->options_given, options);
      EXPECT_TRUE(same_output(
          d.buffer,
          decode_bytes(jpeg, {.format = 0, .width = 48, .height = 48, .options = 1 | turn})
              .buffer));
    }
  }
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
Object object_with_progress(const Bytes& jpeg, CallLog* log) {
  Object o = open_memory(jpeg);
  auto* progress = static_cast<KOLVAVETA_Progress*>(KOLVAVETA_OsMalloc(sizeof(KOLVAVETA_Progress)));
  *progress = {log, logging_progress};
  o->progress = progress;
  o->check_callback = logging_check;
  g_log = log;
  return o;
}

// The check callback receives the rows written so far; the progress
// callback fires on every third check with 100 * rows / output height, so
// the percentage stays within 0..100 when the picture is resized or cropped.
// The throttle counter is process-wide: it carries over between decodes.
TEST(Progress, FiresOnEveryThirdCheckWithThePercentage) {
  const Bytes tall = read_fixture("base_420_q88_17x1023.jpg");
  const Bytes large = read_fixture("base_420_q90_1024x768.jpg");
  const uint32_t never = KOLVAVETA_OPT_THUMB_NEVER;
  const std::pair<const Bytes*, DecodeRequest> runs[] = {
      {&tall, {.width = 17, .height = 1023}},
      {&large, {.format = 0, .width = 700, .height = 525}},
      {&large, {.format = 0, .width = 1000, .height = 600, .options = never | 0x300}},
      {&large, {.format = 0, .width = 1100, .height = 900, .options = never | 0x700}},
      {&tall, {.width = 17, .height = 1023}}};
  CallLog logs[std::size(runs)];
  for (size_t r = 0; r < std::size(runs); ++r) {
    SCOPED_TRACE(r);
    const CallLog& log = logs[r];
    const Object o = object_with_progress(*runs[r].first, &logs[r]);
    const Decoded d = decode_on(o.get(), runs[r].second);
    ASSERT_EQ(d.ok, 1);
    ASSERT_GE(log.fired_at.size(), 5u);
    EXPECT_TRUE(std::is_sorted(log.check_rows.begin(), log.check_rows.end()));
    EXPECT_LE(log.check_rows.back(), std::min(runs[r].second.height, d.output_height));
    EXPECT_GE(log.percents.back(), 50);
    if (r == 0)
      EXPECT_LE(log.fired_at[0], 3u);
    else
      EXPECT_EQ(log.fired_at[0], 2 - (logs[r - 1].check_rows.size() - 1 - logs[r - 1].fired_at.back()));
    for (size_t i = 0; i < log.fired_at.size(); ++i) {
      EXPECT_TRUE(i == 0 || log.fired_at[i] - log.fired_at[i - 1] == 3) << i;
      EXPECT_EQ(log.percents[i], int32_t(100 * uint32_t(log.check_rows[log.fired_at[i]]) /
                                         uint32_t(d.output_height)));
    }
  }
}

int32_t refusing_check(DecInfo*, int32_t) { return 0; }

// A progress callback that refuses, the cancel flag set from the check
// callback and a check callback that refuses each end the decode with 0;
// the cancel flag is cleared when the next decode starts, and the object
// decodes the picture again.
TEST(Cancel, AbortsLeaveTheObjectReusable) {
  const Bytes jpeg = read_fixture("base_420_q88_17x1023.jpg");
  const Decoded reference = decode_bytes(jpeg, {.width = 17, .height = 1023});
  for (const int abort : {0, 1, 2}) {  // progress refuses, cancel flag, check refuses
    SCOPED_TRACE(abort);
    CallLog log;
    const Object o = object_with_progress(jpeg, &log);
    log.progress_result = abort == 0 ? 0 : 1;
    log.stop_after_check = abort == 1 ? 3 : -1;
    if (abort == 2) o->check_callback = refusing_check;
    EXPECT_EQ(decode_on(o.get(), {.width = 17, .height = 1023}).ok, 0);
    EXPECT_LE(log.check_rows.size(), 4u);
    EXPECT_LE(log.fired_at.size(), 1u);
    log = CallLog{};
    o->check_callback = logging_check;
    EXPECT_EQ(decode_on(o.get(), {.width = 17, .height = 1023}).buffer, reference.buffer);
  }
}

// ---------------------------------------------------------------------------
// Damaged data.

// Cutting the entropy data anywhere: a decode that succeeds differs from
// the whole picture only in its last 15 rows, and every longer cut
// succeeds too. Where restart markers start every MCU row, a cut at a
// marker shows exactly which rows are lost: lost within the last 15 rows
// they are concealed as flat grey, lost from higher up the decode fails.
TEST(DamagedData, TruncatedData) {
  for (const auto& [fixture, mcu_rows] :
       {std::pair{"base_444_rst_row_q85_48x40.jpg", 8},
        std::pair{"base_420_opt_rst4_q92_63x65.jpg", 16}, std::pair{"base_422_q85_64x48.jpg", 0},
        std::pair{"cmyk_adobe_444_q80_33x17.jpg", 0}}) {
    const Bytes jpeg = read_fixture(fixture);
    int w = 0, h = 0;
    ASSERT_TRUE(frame_size(jpeg, &w, &h));
    const Decoded whole = decode_bytes(jpeg, {.width = w, .height = h});
    const auto same_top = [&](const Decoded& d, int rows) {
      return std::equal(d.buffer.begin(), d.buffer.begin() + std::ptrdiff_t(w) * 4 * rows,
                        whole.buffer.begin());
    };
    bool succeeded = false;
    int kept = 0;  // MCU rows before the cut, at a restart marker
    // Every length in the pictures with markers and near the end, else every 5th.
    for (size_t n = segment(jpeg, 0xDA) + 2; n <= jpeg.size();
         n += mcu_rows > 0 || n + 64 >= jpeg.size() ? 1 : 5) {
      SCOPED_TRACE(testing::Message() << fixture << " cut at " << n);
      const Decoded d = decode_bytes(Bytes(jpeg.begin(), jpeg.begin() + std::ptrdiff_t(n)),
                                     {.width = w, .height = h});
      ASSERT_TRUE(d.guard_intact);
      ASSERT_TRUE(!succeeded || d.ok == 1) << "after a shorter cut decoded";
      succeeded = d.ok == 1;
      ASSERT_TRUE(!succeeded || same_top(d, std::max(0, h - 15)));
      if (mcu_rows == 0 || n + 1 >= jpeg.size() || jpeg[n] != 0xFF || (jpeg[n + 1] & 0xF8) != 0xD0)
        continue;
      const int first_lost = ++kept * mcu_rows;
      ASSERT_EQ(d.ok, h - first_lost <= 15 ? 1 : 0);
      EXPECT_EQ(d.error, 0);
      for (size_t i = size_t(first_lost) * size_t(w) * 4; succeeded && i < d.buffer.size(); ++i)
        ASSERT_EQ(d.buffer[i], (i % 4 == 3) ? 255 : 128) << "byte " << i;
      EXPECT_TRUE(!succeeded || same_top(d, first_lost));
    }
    EXPECT_TRUE(succeeded);
    EXPECT_EQ(kept, mcu_rows == 0 ? 0 : (h + mcu_rows - 1) / mcu_rows - 1);
  }
}

// Every fixture cut at several points and with seeded bit flips (anywhere,
// or only in the marker segments before the entropy data), through every
// format, rotation, fit mode, decode mode and thumbnail policy in turn, at
// its own size and at every reduction: the decode ends without touching
// memory outside the buffer (run under the sanitizers).
TEST(DamagedData, CutsAndBitFlipsOverTheCorpus) {
  const int formats[] = {0, 1, 2, 5, 7, 8, 9, 4, 12};
  const uint32_t fits[] = {0x000, 0x300, 0x700, 0x100};
  const std::pair<int, int> scales[] = {{1, 1}, {3, 4}, {1, 2}, {3, 8}, {1, 4}, {1, 8}, {1, 16}};
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
      const auto [num, den] = scales[turn % std::size(scales)];
      const Decoded d = decode_bytes(
          damaged, {.format = formats[turn % std::size(formats)],
                    .width = std::max(1, w * num / den) + (num == den ? int(turn % 3) : 0),
                    .height = std::max(1, h * num / den) + (num == den ? int(turn % 2) : 0),
                    .options = uint32_t(turn % 16) | fits[turn / 16 % std::size(fits)] |
                               (turn % 5 == 0 ? KOLVAVETA_OPT_EXIF_ORIENT : 0u),
                    .mode = int(turn % 5)});
      ASSERT_TRUE(d.guard_intact) << "variant " << v;
    }
  }
}

// Frame sizes that disagree with the entropy data, or break the limits:
// sizes of 0 or above 50000 are refused, the others decode what the data
// holds (concealing the bottom rows) or fail, inside the buffer.
TEST(DamagedData, FrameSizesThatDoNotMatchTheData) {
  const Bytes jpeg = read_fixture("base_420_q90_96x64.jpg");
  const size_t sof = segment(jpeg, 0xC0);
  for (const auto& [w, h, refused] :
       {std::tuple{0, 64, true}, std::tuple{96, 0, true}, std::tuple{50001, 8, true},
        std::tuple{8, 50001, true}, std::tuple{96, 6400, false}, std::tuple{50000, 8, false},
        std::tuple{17, 3, false}, std::tuple{97, 65, false}}) {
    Bytes patched = jpeg;
    patched[sof + 5] = uint8_t(h >> 8);
    patched[sof + 6] = uint8_t(h);
    patched[sof + 7] = uint8_t(w >> 8);
    patched[sof + 8] = uint8_t(w);
    for (const uint32_t policy : {KOLVAVETA_OPT_THUMB_NEVER, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      SCOPED_TRACE(testing::Message() << w << "x" << h << " policy " << policy);
      // A refused frame is never written: a small buffer will do.
      const Decoded d = decode_bytes(
          patched,
          {.format = 0, .width = refused ? 64 : w, .height = refused ? 48 : h, .options = policy});
      EXPECT_TRUE(d.guard_intact);
      EXPECT_TRUE(!refused || d.ok == 0);
      EXPECT_TRUE(!refused || policy != 1 || d.error == KOLVAVETA_ERR_SETUP) << d.error;
    }
  }
}

// ---------------------------------------------------------------------------
// Input kinds and reuse: every kind of input gives the pixels of a memory
// decode, and one object decodes request after request (formats, fits,
// rotations, thumbnails), reading its input again each time.

TEST(InputKinds, EveryKindAndEveryReuseGivesTheSamePixels) {
  const std::pair<const char*, std::vector<DecodeRequest>> cases[] = {
      {"base_422_q70_100x75.jpg",
       {{.width = 100, .height = 75},
        {.format = 0, .width = 80, .height = 80, .options = 0x108},
        {.format = 2, .width = 50, .height = 90, .options = 0x301},
        {.format = 5, .width = 75, .height = 100, .options = 0x00D},
        {.width = 100, .height = 75}}},
      {"garbage_lead_420_64x48.jpg", {{.width = 64, .height = 48}}},
      {"exif_thumb_portrait_ii_240x320.jpg",
       {{.format = 0, .width = 45, .height = 60, .options = 3}, {.width = 60, .height = 80}}},
  };
  for (const auto& [fixture, requests] : cases) {
    const Bytes jpeg = read_fixture(fixture);
    std::vector<Decoded> fresh;
    for (const DecodeRequest& r : requests) fresh.push_back(decode_bytes(jpeg, r));
    for (const InputKind kind : {InputKind::kPath, InputKind::kHandle, InputKind::kMemory,
                                 InputKind::kOwnedMemory, InputKind::kStream}) {
      InputHolder input(kind, jpeg);
      ASSERT_NE(input.object(), nullptr);
      for (size_t i = 0; i < requests.size(); ++i) {
        SCOPED_TRACE(testing::Message()
                     << fixture << " " << input_kind_name(kind) << " request " << i);
        const Decoded d = decode_on(input.object(), requests[i]);
        EXPECT_EQ(d.ok + fresh[i].ok, 2);
        EXPECT_EQ(d.output_width, fresh[i].output_width);
        EXPECT_EQ(d.output_height, fresh[i].output_height);
        EXPECT_EQ(d.buffer, fresh[i].buffer);
      }
    }
  }
}

// ---------------------------------------------------------------------------
// Colour spaces (the fixtures as they are are compared with libjpeg by the
// decode tests) and refused inputs.

#if VETAJ_HAVE_LIBJPEG

// The Adobe transform decides before the component ids (for four
// components any value but 0 is YCCK), and a JFIF marker before both.
TEST(ColourSpaces, DetectedFromComponentsAndMarkers) {
  struct Case {
    const char* fixture;
    std::vector<uint8_t> ids;  // replacing the component ids, when given
    int transform;             // replacing the Adobe transform, when not -1
    int space;                 // 2 RGB, 3 YCbCr, 4 CMYK, 5 YCCK
  } const cases[] = {{"rgb_adobe_q90_64x48.jpg", {1, 2, 3}, -1, 2},
                     {"rgb_adobe_q90_64x48.jpg", {}, 1, 3},
                     {"base_444_q90_64x48.jpg", {'R', 'G', 'B'}, -1, 3},
                     {"cmyk_adobe_444_q90_64x48.jpg", {}, 2, 5},
                     {"ycck_adobe_444_q90_64x48.jpg", {}, 1, 5},
                     {"ycck_adobe_444_q90_64x48.jpg", {}, 0, 4}};
  for (const Case& c : cases) {
    const Bytes jpeg =
        with_adobe_transform(with_component_ids(read_fixture(c.fixture), c.ids), c.transform);
    FullPicture raw;
    ASSERT_TRUE(oracle_picture(jpeg, c.space, &raw));
    const Decoded d = decode_bytes(jpeg, {.width = raw.width, .height = raw.height});
    EXPECT_TRUE(shows(d, Placement::centred(7, raw.width, raw.height, raw.width, raw.height),
                      raw.at))
        << c.fixture << " case " << (&c - cases);
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// Inputs that cannot decode fail with nothing written and no decoder kept
// (the sanitizer build's leak check covers the memory).
// Without the header pre-scan (policy 1) the decoder set-up refuses them
// with error 2; so it does with the pre-scan for frames whose colour space
// cannot be decided.
TEST(Errors, InputsThatCannotDecode) {
  const Bytes good = read_fixture("base_420_q90_96x64.jpg");
  std::mt19937 rng(7);
  Bytes noise(4000);
  for (auto& b : noise) b = uint8_t(rng());
  Bytes no_adobe = read_fixture("cmyk_adobe_444_q90_64x48.jpg");
  no_adobe[segment(no_adobe, 0xEE) + 1] = 0xEF;  // an APP15 segment instead
  const std::tuple<const char*, Bytes, bool> cases[] = {
      {"noise", noise, false},
      {"header_cut", Bytes(good.begin(), good.begin() + 150), false},
      {"arithmetic", read_fixture("bad_arith_420_64x48.jpg"), false},
      {"twelve_bit", read_fixture("bad_12bit_sof0_64x48.jpg"), false},
      {"extended_sequential", read_fixture("bad_sof1_420_64x48.jpg"), false},
      {"four_components_without_adobe", no_adobe, true},
      {"two_components", without_last_component(read_fixture("base_444_q90_64x48.jpg")), true},
      {"unknown_ids",
       with_component_ids(read_fixture("base_ids123_nomarker_q85_64x48.jpg"), {4, 5, 6}), true},
      {"adobe_2_with_three_components",
       with_adobe_transform(read_fixture("rgb_adobe_q90_64x48.jpg"), 2), true},
  };
  for (const auto& [label, jpeg, undecidable] : cases) {
    for (const uint32_t policy : {KOLVAVETA_OPT_THUMB_NEVER, KOLVAVETA_OPT_THUMB_IF_LARGE}) {
      SCOPED_TRACE(testing::Message() << label << " policy " << policy);
      const Decoded d = decode_bytes(jpeg, {.width = 64, .height = 48, .options = policy});
      EXPECT_EQ(d.ok, 0);
      EXPECT_TRUE(d.error == KOLVAVETA_ERR_SETUP || (!undecidable && policy != 1)) << d.error;
      EXPECT_FALSE(d.kept_decoder);
      EXPECT_TRUE(d.guard_intact && all_fill(d.buffer));
    }
  }
}

// Bad arguments fail with nothing written and leave the object unharmed.
TEST(Errors, Arguments) {
  std::vector<uint8_t> buffer(96 * 64 * 4, kFill);
  gKOLVAVETA_Error = 77;
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(nullptr, buffer.data(), 96, 64), 0);
  EXPECT_EQ(gKOLVAVETA_Error, 0);
  const Bytes good = read_fixture("base_420_q90_96x64.jpg");
  const Object o = open_memory(good);
  for (const auto& [w, h] :
       {std::pair{0, 64}, std::pair{96, 0}, std::pair{-5, 64}, std::pair{96, -1}})
    EXPECT_EQ(KOLVAVETA_DecodeJPEG(o.get(), buffer.data(), w, h), 0) << w << "x" << h;
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(o.get(), nullptr, 96, 64), 0);
  EXPECT_TRUE(all_fill(buffer));
  EXPECT_EQ(KOLVAVETA_DecodeJPEG(o.get(), buffer.data(), 96, 64), 1);
}

}  // namespace
