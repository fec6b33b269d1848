// The decoder's marker reader and the file-header pre-scan.
#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "drivers/decoder.h"
#include "io/stream.h"
#include "support/files.h"
#include "support/manifest.h"
#include "support/oracle.h"
#include "support/segments.h"
#include "syntax/markers.h"

namespace {

using vjtest::Bytes;
using vjtest::JpegBuilder;

// A decoder set up as the header reader leaves it before the first marker:
// a window on a stream over `bytes`, a zeroed MarkerState with the Adobe
// transform at 1.
class MarkerReader {
 public:
  // `size` overrides the input size a caller stream claims.
  explicit MarkerReader(const Bytes& bytes, int32_t kind = 1, int64_t size_claimed = -1)
      : data_(bytes) {
    const uint32_t size = static_cast<uint32_t>(size_claimed < 0 ? data_.size() : size_claimed);
    if (data_.empty()) kind = 4;  // a memory input cannot be empty
    if (kind == 4) {
      source_.data = data_;
      stream_ = KOLVAVETA_Open_Stream(&source_, vjtest::CallbackSource::read,
                                      vjtest::CallbackSource::skip,
                                      vjtest::CallbackSource::rewind, size);
    } else {
      stream_ = KOLVAVETA_Open_IO(kind, data_.data(), size);
    }
    vj::window_open(&window_, stream_);
    decoder_ = vj::alloc_zeroed<DecoderInfo>();
    decoder_->window = &window_;
    decoder_->stream = stream_;
    decoder_->marker = vj::fake_alloc_zeroed<MarkerState>();
    decoder_->marker->adobe_transform = 1;
  }
  ~MarkerReader() {
    VETAJ_DeleteDecoderInfo(decoder_);
    KOLVAVETA_OsFree(decoder_);
    vj::window_close(&window_);
    // A caller stream converted to a memory stream owns its block now.
    if (stream_->kind == 5) KOLVAVETA_OsFree(stream_->source);
    KOLVAVETA_Close_IO(stream_);
  }
  MarkerReader(const MarkerReader&) = delete;
  MarkerReader& operator=(const MarkerReader&) = delete;

  // One call of the marker reader; returns its status.
  int32_t next(uint8_t* code = nullptr) {
    int32_t status = -1;
    const uint8_t c = VETAJ_ParseNextMarker(decoder_, &status);
    if (code != nullptr) *code = c;
    return status;
  }
  DecoderInfo* d() const { return decoder_; }
  MarkerState* m() const { return decoder_->marker; }
  IoStream* stream() const { return stream_; }
  // The next unread input byte.
  int32_t peek() { return vj::window_byte(&window_); }

 private:
  Bytes data_;
  vjtest::CallbackSource source_;
  IoStream* stream_ = nullptr;
  StreamWindow window_{};
  DecoderInfo* decoder_ = nullptr;
};

const Bytes kCounts{0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0};
const Bytes kSymbols{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10};

Bytes cat(Bytes a, const Bytes& b) {
  a.insert(a.end(), b.begin(), b.end());
  return a;
}

// What the corpus cannot show: fill bytes, garbage and other codes between
// segments, two tables in one DHT, the band of a baseline scan, the window
// left at the entropy-coded data.
TEST(ParseNextMarker, ReadsABaselineHeaderIntoTheDecoder) {
  JpegBuilder b;
  b.raw({0x00, 0x11, 0xFF, 0xD8, 0xFF, 0xFF, 0xFF}).dqt(3, 100);
  b.sof(0xC0, 300, 200, {{7, 2, 1, 3}, {8, 1, 2, 3}, {9, 1, 1, 3}});
  b.raw({0x55, 0x66, 0xFF, 0xD0, 0xFF, 0x00, 0xFF, 0xFF}).segment(0xE3, {1, 2, 3});
  b.segment(0xFE, {}).segment(0xDC, {0, 8});
  b.segment(0xC4, cat(vjtest::dht_table(0x00, kCounts, kSymbols),
                      vjtest::dht_table(0x13, kCounts, kSymbols)));
  b.sos({{7, 0x03}, {8, 0x03}, {9, 0x03}}, 1, 5, 0x01).raw({0xAB});
  MarkerReader r(b.bytes());
  uint8_t code = 0;
  ASSERT_EQ(r.next(&code), 200);
  EXPECT_EQ(code, 0xDA);
  EXPECT_EQ(r.peek(), 0xAB) << "window left at the first entropy-coded byte";
  const DecoderInfo* d = r.d();
  EXPECT_EQ(d->huff_store_count, 2u);
  EXPECT_EQ(d->ac_huff[3], d->huff_store[1]);
  EXPECT_EQ(d->quant_tables[3]->values[8], 102) << "zig-zag position 2 is row 1, column 0";
  // A baseline scan always covers the whole band.
  EXPECT_EQ(std::vector<uint32_t>({d->Ss, d->Se, d->Ah, d->Al}),
            std::vector<uint32_t>({0, 63, 0, 0}));
}

TEST(ParseNextMarker, RedefinedTablesTakeNewSlotsUpToTheStoreSize) {
  for (uint32_t tables : {kMaxTableSpecs, kMaxTableSpecs + 1}) {
    JpegBuilder b;
    b.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}});
    for (uint32_t i = 0; i < tables; ++i) b.dht(0x00, kCounts, kSymbols);
    MarkerReader r(b.sos({{1, 0x00}}).bytes());
    EXPECT_EQ(r.next(), tables > kMaxTableSpecs ? 201 : 200);
    EXPECT_EQ(r.d()->huff_store_count, kMaxTableSpecs);
  }
}

// Streams that the marker reader must refuse with status 201.
struct BadHeader {
  const char* name;
  Bytes bytes;
};

std::vector<BadHeader> bad_headers() {
  // SOI, a frame of two components, `middle`, a scan.
  auto framed = [](const std::function<void(JpegBuilder&)>& middle) {
    JpegBuilder b;
    b.soi().sof(0xC0, 16, 16, {{1, 1, 1, 0}, {2, 1, 1, 0}});
    middle(b);
    return b.sos({{1, 0x00}}).raw({0x00}).bytes();
  };
  auto sof = [](uint8_t code, uint32_t w, uint32_t h, const std::vector<vjtest::FrameComp>& c) {
    JpegBuilder b;
    return b.soi().sof(code, w, h, c).sos({{1, 0x00}}).raw({0}).bytes();
  };
  auto scan = [](const std::vector<vjtest::ScanComp>& c, uint8_t ss = 0, uint8_t se = 63,
                 uint8_t ahal = 0) {
    JpegBuilder b;
    b.soi().sof(0xC2, 8, 8, {{1, 1, 1, 0}, {2, 1, 1, 0}});
    return b.sos(c, ss, se, ahal).raw({0}).bytes();
  };
  // SOI, an 8x8 frame, then raw bytes.
  auto after_frame = [](const Bytes& tail) {
    JpegBuilder b;
    return b.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).raw(tail).bytes();
  };
  const Bytes one{0xFF, 0xD8}, scan_first = JpegBuilder().soi().dqt(0).sos({{1, 0x00}}).bytes();
  Bytes short_dqt{0x00};
  short_dqt.resize(64, 1);  // one value short
  return {
      {"Width50001", sof(0xC0, 50001, 8, {{1, 1, 1, 0}})},
      {"Height50001", sof(0xC2, 8, 50001, {{1, 1, 1, 0}})},
      {"FiveComponents",
       sof(0xC0, 8, 8, {{1, 1, 1, 0}, {2, 1, 1, 0}, {3, 1, 1, 0}, {4, 1, 1, 0}, {5, 1, 1, 0}})},
      {"NoComponents", sof(0xC0, 8, 8, {})},
      {"SamplingZero", sof(0xC0, 8, 8, {{1, 0, 1, 0}})},
      {"SamplingFive", sof(0xC0, 8, 8, {{1, 1, 5, 0}})},
      // Nf 3 with Lf 18: the length must be 3 * 3 + 8 = 17.
      {"FrameLengthMismatch",
       cat(cat(one, {0xFF, 0xC0, 0, 18, 8, 0, 8, 0, 8, 3, 1, 0x11, 0, 2, 0x11, 0, 3, 0x11, 0, 0}),
           JpegBuilder().sos({{1, 0x00}}).bytes())},
      {"SecondFrame", framed([](JpegBuilder& b) { b.sof(0xC0, 8, 8, {{1, 1, 1, 0}}); })},
      {"ScanBeforeFrame", cat(scan_first, JpegBuilder().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).bytes())},
      {"DqtSixteenBit", framed([](JpegBuilder& b) { b.dqt(0x10); })},
      {"DqtTableFour", framed([](JpegBuilder& b) { b.dqt(4); })},
      {"DqtLengthShort", framed([&](JpegBuilder& b) { b.segment(0xDB, short_dqt); })},
      {"DqtLengthOne", framed([](JpegBuilder& b) { b.raw({0xFF, 0xDB, 0, 1}); })},
      {"DhtClassTwo", framed([](JpegBuilder& b) { b.dht(0x20, kCounts, kSymbols); })},
      {"DhtTableFour", framed([](JpegBuilder& b) { b.dht(0x04, kCounts, kSymbols); })},
      {"DhtCountsOver256", framed([](JpegBuilder& b) { b.dht(0, Bytes(16, 17), Bytes(272, 0)); })},
      {"DhtSymbolsPastSegment", framed([](JpegBuilder& b) {
         b.dht(0x00, kCounts, Bytes(kSymbols.begin(), kSymbols.end() - 1));
       })},
      {"DhtHeadCut", framed([](JpegBuilder& b) { b.segment(0xC4, Bytes(10, 0)); })},
      {"DriLengthFive", framed([](JpegBuilder& b) { b.segment(0xDD, {0, 1, 0}); })},
      {"AppLengthOne", framed([](JpegBuilder& b) { b.raw({0xFF, 0xE1, 0, 1}); })},
      {"AppPastTheEnd", after_frame({0xFF, 0xE1, 0xFF, 0xF0, 1, 2, 3})},
      {"ScanComponentNotInFrame", scan({{3, 0x00}})},
      {"ScanComponentTwice", scan({{1, 0x00}, {1, 0x00}})},
      {"ScanNoComponents", scan({})},
      {"ScanFiveComponents", scan({{1, 0}, {2, 0}, {1, 0}, {2, 0}, {1, 0}})},
      {"ScanDcTableFour", scan({{1, 0x40}})},
      {"ScanAcTableFour", scan({{1, 0x04}})},
      {"ProgressiveBandPast63", scan({{1, 0x00}}, 1, 64)},
      {"ProgressiveBandReversed", scan({{1, 0x00}}, 6, 5)},
      {"ProgressiveApproxPast13", scan({{1, 0x00}}, 0, 0, 0x0E)},
      {"ScanLengthMismatch", after_frame({0xFF, 0xDA, 0, 9, 1, 1, 0, 0, 63, 0})},
      {"EoiBeforeScan", after_frame({0xFF, 0xD9, 0, 0, 0})},
      {"Empty", {}},
      {"OnlyFillBytes", Bytes(40, 0xFF)},
  };
}

class ParseNextMarkerRefuses : public ::testing::TestWithParam<BadHeader> {};

TEST_P(ParseNextMarkerRefuses, WithStatus201AndNoScanReported) {
  // Exactly sized heap copy: any read past the end is caught by the sanitizers.
  MarkerReader r(GetParam().bytes);
  uint8_t code = 0;
  EXPECT_EQ(r.next(&code), 201);
  EXPECT_NE(code, 0xDA);
  EXPECT_EQ(r.m()->seen_sos, 0);
}

INSTANTIATE_TEST_SUITE_P(BadHeaders, ParseNextMarkerRefuses, ::testing::ValuesIn(bad_headers()),
                         [](const auto& p) { return std::string(p.param.name); });

// A caller stream is read whole into memory at a progressive frame (the
// progressive tests decode such streams); an unknown size, or one below
// what was already read, is refused.
TEST(ParseNextMarker, TurnsACallerStreamIntoAMemoryStream) {
  JpegBuilder b;
  b.soi().com(30000, 0x11).com(20000, 0x22);
  const Bytes bytes = b.sof(0xC2, 8, 8, {{1, 1, 1, 0}}).sos({{1, 0x00}}, 0, 0, 0).raw({0}).bytes();
  for (int64_t size : {-1, 0, 5}) {
    MarkerReader r(bytes, 4, size);
    EXPECT_EQ(r.next(), size < 0 ? 200 : 201) << size;
    EXPECT_EQ(r.stream()->kind, size < 0 ? 5 : 4) << size;
  }
}

// ---------------------------------------------------------------------------
// File-header pre-scan

int32_t prescan(const Bytes& bytes, FileHeaderInfo* h, int32_t mode = 8) {
  return vjtest::on_memory_window(
      bytes, [&](StreamWindow* w) { return VETAJ_ParseFileHeader(w, mode, h); });
}

// The thumbnail fields a test compares: present, width, height, format,
// colour, length, offset.
std::vector<int64_t> thumb(const ThumbnailInfo& t) {
  return {t.present, t.width, t.height, t.format, t.colour, t.length, t.offset};
}

// A stream with the given APP segments before a 640x480 baseline frame.
Bytes with_app(const std::vector<std::pair<uint8_t, Bytes>>& apps, size_t tail = 64) {
  JpegBuilder b;
  b.soi();
  for (const auto& [code, payload] : apps) b.segment(code, payload);
  b.dqt(0).sof(0xC0, 640, 480, {{1, 2, 2, 0}, {2, 1, 1, 0}, {3, 1, 1, 0}});
  return b.sos({{1, 0x00}, {2, 0x11}, {3, 0x11}}).raw(Bytes(tail, 0x12)).eoi().bytes();
}

// Other JFIF versions keep the thumbnail size one byte earlier.
Bytes jfif(uint8_t major, uint8_t tw, uint8_t th, size_t pixel_bytes) {
  Bytes p{'J', 'F', 'I', 'F', 0, major, 2, 1, 0, 72, 0, 72, tw, th};
  if (major != 1) p[11] = tw, p[12] = th, p[13] = 0;
  p.resize(p.size() + pixel_bytes, 0x80);
  return p;
}

Bytes jfxx(uint8_t code, const Bytes& data) { return cat({'J', 'F', 'X', 'X', 0, code}, data); }

// An Exif APP1 payload: IFD0 with one entry after `padding` bytes (which
// can push IFD1 past the window), IFD1 with the given one-value entries.
struct IfdEntry {
  uint16_t tag, type;
  uint32_t value;
};

Bytes exif(bool big, const std::vector<IfdEntry>& ifd1, uint32_t ifd0_at = 8, size_t padding = 0) {
  Bytes t{'E', 'x', 'i', 'f', 0, 0, uint8_t(big ? 'M' : 'I'), uint8_t(big ? 'M' : 'I')};
  auto put = [&](uint32_t x, int n) {
    for (int i = 0; i < n; ++i) t.push_back(uint8_t(x >> (8 * (big ? n - 1 - i : i))));
  };
  auto entry = [&](const IfdEntry& e) {
    const bool byte = e.type == 1 || e.type == 2 || e.type == 6 || e.type == 7;
    const int n = e.type == 3 || e.type == 8 ? 2 : byte ? 1 : 4;
    put(e.tag, 2), put(e.type, 2), put(1, 4), put(e.value, n), put(0, 4 - n);
  };
  put(42, 2), put(ifd0_at == 8 ? uint32_t(8 + padding) : ifd0_at, 4);
  t.resize(6 + 8 + padding, 0xEE);
  put(1, 2), entry({0x112, 3, 1}), put(uint32_t(t.size() - 6 + 4), 4);
  put(uint32_t(ifd1.size()), 2);
  for (const IfdEntry& e : ifd1) entry(e);
  put(0, 4);
  return t;
}

TEST(ParseFileHeader, RefusesBadModesMissingSoiAndUnusableFrames) {
  FileHeaderInfo h{};
  EXPECT_EQ(prescan(with_app({}), &h, 3), 201);
  EXPECT_EQ(prescan(with_app({}), &h, 2), 200);
  Bytes no_soi = with_app({}), big = with_app({{0xE0, Bytes(100, 0)}});
  no_soi[1] = 0xD7;
  big[4] = 0x40;  // an APP0 claiming more bytes than the input holds
  auto frame = [](uint8_t code, uint32_t w, uint8_t precision, bool scan) {
    JpegBuilder b;
    b.soi().sof(code, w, 8, {{1, 1, 1, 0}}, precision);
    return scan ? b.sos({{1, 0}}).bytes() : b.eoi().bytes();
  };
  for (const Bytes& bad : {no_soi, big, frame(0xC0, 0, 8, true), frame(0xC0, 8, 12, true),
                           frame(0xC0, 8, 8, false), frame(0xC1, 8, 8, true)})
    EXPECT_EQ(prescan(bad, &h), 201);
}

// The caller's words 9..14 pass through.
TEST(ParseFileHeader, ReadsJfifThumbnailsOfOtherVersions) {
  FileHeaderInfo h{};
  h.thumbnail.unused9 = 77;
  h.thumbnail.x_resolution[1] = 5;
  ASSERT_EQ(prescan(with_app({{0xE0, jfif(2, 3, 1, 9)}}), &h), 200);
  EXPECT_EQ(thumb(h.thumbnail), std::vector<int64_t>({1, 3, 1, 1, 2, 9, 2 + 4 + 14}));
  EXPECT_EQ(h.thumbnail.unused9, 77);
  EXPECT_EQ(h.thumbnail.x_resolution[1], 5u);
}

// In both byte orders, also with IFD1 past the first window; the offset
// counts from the TIFF header. Without JPEG tags the strips are used.
TEST(ParseFileHeader, ExifThumbnailIsLocatedFromIfd1) {
  const std::vector<IfdEntry> ifd1{{0x100, 3, 160}, {0x101, 4, 120}, {0x103, 3, 6},
                                   {0x106, 3, 2},   {0x11C, 3, 1},   {0x201, 4, 30},
                                   {0x202, 4, 400}, {0x104D, 1, 9},  {0x11A, 5, 0}};
  for (bool big : {false, true}) {
    for (size_t padding : {0, 20000}) {
      FileHeaderInfo h{};
      ASSERT_EQ(prescan(with_app({{0xE1, exif(big, ifd1, 8, padding)}}, 600), &h), 200);
      EXPECT_EQ(thumb(h.thumbnail), std::vector<int64_t>({1, 160, 120, 6, 2, 400, 2 + 4 + 6 + 30}));
      EXPECT_EQ(h.thumbnail.planar, 1);
      EXPECT_EQ(h.thumbnail.vendor, 9);
    }
  }
  FileHeaderInfo h{};
  const std::vector<IfdEntry> strips{{0x103, 3, 1}, {0x111, 4, 40}, {0x117, 4, 48}};
  ASSERT_EQ(prescan(with_app({{0xE1, exif(false, strips)}}), &h), 200);
  EXPECT_EQ(thumb(h.thumbnail), std::vector<int64_t>({1, 0, 0, 0, 0, 48, 12 + 40}));
}

Bytes resource(uint16_t id, const Bytes& data) {
  Bytes r{'8', 'B', 'I', 'M'};
  vjtest::put16(&r, id);
  r.insert(r.end(), {0, 0});  // empty name, padded to an even length
  vjtest::put32(&r, static_cast<uint32_t>(data.size()));
  r = cat(r, data);
  if (r.size() % 2 != 0) r.push_back(0);
  const char sig[] = "Photoshop 3.0";
  return cat(Bytes(sig, sig + sizeof sig), r);
}

// A thumbnail resource of 80x60 in the given format, with `data_bytes` of
// data after its 28-byte header that claims `length`.
Bytes thumb_resource(uint32_t format, uint32_t length, uint32_t data_bytes) {
  Bytes d;
  for (uint32_t v : {format, 80u, 60u, 240u, 14400u, length}) vjtest::put32(&d, v);
  vjtest::put16(&d, 24);
  vjtest::put16(&d, 1);
  d.resize(28 + data_bytes, 0xCC);
  return resource(0x040C, d);
}

TEST(ParseFileHeader, KeepsAnEarlierThumbnail) {
  const Bytes app13 = thumb_resource(1, 50, 51);
  for (const auto& later : {std::pair<uint8_t, Bytes>{0xE1, exif(false, {{0x100, 3, 9}})},
                            std::pair<uint8_t, Bytes>{0xED, app13}}) {
    FileHeaderInfo h{};
    ASSERT_EQ(prescan(with_app({{0xE0, jfif(1, 1, 1, 3)}, later}), &h), 200);
    EXPECT_EQ(thumb(h.thumbnail), std::vector<int64_t>({1, 1, 1, 1, 2, 3, 2 + 4 + 14}));
  }
}

// APP segments that hold no usable thumbnail.
struct NoThumb {
  const char* name;
  uint8_t code;
  Bytes payload;
};

std::vector<NoThumb> no_thumbnails() {
  const std::vector<IfdEntry> good{{0x201, 4, 30}, {0x202, 4, 40}};
  auto patched = [](Bytes b, size_t at, uint8_t v) {
    b[at] = v;
    return b;
  };
  constexpr size_t kNext = 6 + 8 + 2 + 12;  // next-IFD offset of IFD0 in the payload
  const Bytes cut13 = thumb_resource(1, 50, 51);
  return {
      {"JfifPixelsShort", 0xE0, jfif(1, 2, 2, 11)},
      {"JfifPixelsLong", 0xE0, jfif(1, 2, 2, 13)},
      {"JfifZeroWidth", 0xE0, jfif(1, 0, 2, 0)},
      {"JfxxRgbShort", 0xE0, jfxx(0x13, {3, 2, 1, 2, 3})},
      {"JfxxPaletteShort", 0xE0, jfxx(0x11, {1, 1, 0})},
      {"JfxxZeroWidth", 0xE0, jfxx(0x13, {0, 2})},
      {"JfxxUnknownCode", 0xE0, jfxx(0x12, {1, 1, 0, 0, 0})},
      {"JfxxEmptyJpeg", 0xE0, jfxx(0x10, {})},
      {"ExifBadType", 0xE1, exif(false, {{0x201, 4, 30}, {0x202, 13, 40}})},
      {"ExifIfd0PastSegment", 0xE1, exif(false, good, 5000)},
      {"ExifNoLength", 0xE1, exif(true, {{0x201, 4, 30}})},
      {"ExifNoOffset", 0xE1, exif(true, {{0x202, 4, 30}})},
      {"ExifLengthZero", 0xE1, exif(true, {{0x201, 4, 30}, {0x202, 4, 0}})},
      {"ExifOffsetPastInput", 0xE1, exif(true, {{0x201, 4, 0xFFFFFF00}, {0x202, 4, 40}})},
      {"ExifLengthPastInput", 0xE1, exif(false, {{0x201, 4, 30}, {0x202, 4, 0x7FFFFFFF}})},
      {"ExifByteOrder", 0xE1, patched(exif(false, good), 6, 'X')},
      {"ExifMagic", 0xE1, patched(exif(false, good), 8, 43)},
      {"ExifNoNextIfd", 0xE1, patched(patched(exif(false, good), kNext, 0), kNext + 1, 0)},
      {"ExifEntriesPastSegment", 0xE1, patched(exif(false, good), kNext + 4, 0xFF)},
      {"ExifTooShort", 0xE1, Bytes{'E', 'x', 'i', 'f', 0, 0, 'I', 'I'}},
      {"ResourceThumbLongerThanResource", 0xED, thumb_resource(1, 60, 51)},
      {"ResourceShorterThanHeader", 0xED, resource(0x040C, Bytes(20, 0))},
      {"ResourcePastSegment", 0xED, Bytes(cut13.begin(), cut13.end() - 40)},
  };
}

class PreScanWithoutThumbnail : public ::testing::TestWithParam<NoThumb> {};

TEST_P(PreScanWithoutThumbnail, SkipsTheSegment) {
  FileHeaderInfo h{};
  ASSERT_EQ(prescan(with_app({{GetParam().code, GetParam().payload}}, 100), &h), 200);
  EXPECT_EQ(h.thumbnail.present, 0);
  EXPECT_EQ(h.width, 640);
}

INSTANTIATE_TEST_SUITE_P(Segments, PreScanWithoutThumbnail, ::testing::ValuesIn(no_thumbnails()),
                         [](const auto& p) { return std::string(p.param.name); });

// ---------------------------------------------------------------------------
// The fixture corpus

// Scans found by calling the marker reader until it reports the end.
int32_t count_scans(MarkerReader* r) {
  int32_t scans = 0;
  while (scans < 1000 && r->next() == 200) ++scans;
  return scans;
}

// Thumbnails the pre-scan must find in the corpus: format, size (0: not
// known from the header) and length (0: not known). The decoding tests show
// the JPEG ones.
struct ExpectedThumb {
  int32_t format, width, height;
  uint32_t length;
};

const std::map<std::string, ExpectedThumb> kThumbnails{
    {"exif_thumb_ii_640x480.jpg", {6, 0, 0, 0}},
    {"exif_thumb_mm_320x240.jpg", {6, 0, 0, 0}},
    {"exif_thumb_portrait_ii_240x320.jpg", {6, 0, 0, 0}},
    {"thumb_jfif_rgb4x3_64x48.jpg", {1, 4, 3, 36}},
    {"thumb_jfxx_jpeg_128x96.jpg", {6, 0, 0, 0}},
    {"thumb_jfxx_rgb_128x96.jpg", {1, 16, 12, 576}},
    {"thumb_jfxx_pal_128x96.jpg", {1, 16, 12, 768 + 192}},
    {"thumb_app13_jpeg_640x480.jpg", {7, 160, 120, 5781}},
};

// The frame, tables and scans of the corpus are checked by decoding it.
class CorpusMarkers : public ::testing::TestWithParam<std::string> {};

TEST_P(CorpusMarkers, PreScanFindsTheSizeAndThumbnail) {
  const std::string name = GetParam();
  const Bytes bytes = vjtest::read_fixture(name);
  FileHeaderInfo h{};
  const int32_t status = prescan(bytes, &h);
  if (vjtest::has_kind(name, "bad_")) {
    EXPECT_EQ(status, 201) << "no 8-bit baseline or progressive frame: no picture to size";
    return;
  }
  ASSERT_EQ(status, 200);
#if VETAJ_HAVE_LIBJPEG
  vjtest::OracleHeader o;
  ASSERT_TRUE(vjtest::oracle_header(bytes, &o));
  EXPECT_EQ(std::vector<int>({h.width, h.height, h.progressive}),
            std::vector<int>({o.width, o.height, o.progressive}));
#endif
  const ThumbnailInfo& t = h.thumbnail;
  const auto it = kThumbnails.find(name);
  ASSERT_EQ(t.present, it != kThumbnails.end() ? 1 : 0);
  if (it == kThumbnails.end()) return;
  const ExpectedThumb& e = it->second;
  EXPECT_EQ(t.format, e.format);
  if (e.width > 0) {
    EXPECT_EQ(std::make_pair(t.width, t.height), std::make_pair(e.width, e.height));
  }
  EXPECT_TRUE(e.length == 0 || t.length == e.length) << t.length;
  EXPECT_LE(uint64_t(t.offset) + t.length, bytes.size());
}

INSTANTIATE_TEST_SUITE_P(Fixtures, CorpusMarkers,
                         ::testing::ValuesIn(vjtest::list_fixtures(".jpg")),
                         [](const auto& p) { return vjtest::fixture_test_name(p.param); });

// Truncated copies of every fixture: the marker reader and the pre-scan
// never read outside the input, and what they report is the whole file's.
TEST(CorpusTruncation, MarkerReaderAndPreScanFailCleanly) {
  for (const std::string& name : vjtest::list_fixtures(".jpg")) {
    const Bytes full = vjtest::read_fixture(name);
    MarkerReader whole(full);
    const int32_t full_scans = whole.next() == 200 ? 1 + count_scans(&whole) : 0;
    FileHeaderInfo expected{};
    prescan(full, &expected);
    size_t i = 0;
    for (size_t n : vjtest::cut_lengths(full.size(), 300, 30)) {
      const Bytes cut(full.begin(), full.begin() + static_cast<long>(n));
      MarkerReader r(cut, (i++ % 4 == 0) ? 4 : 1);
      int32_t scans = 0;
      if (r.next() == 200) scans = 1 + count_scans(&r);
      EXPECT_LE(scans, full_scans) << name << " at " << n;
      FileHeaderInfo h{};
      if (prescan(cut, &h) != 200) continue;
      EXPECT_EQ(std::vector<int>({h.width, h.height, h.progressive, h.thumbnail.present}),
                std::vector<int>({expected.width, expected.height, expected.progressive,
                                  expected.thumbnail.present}))
          << name << " at " << n;
    }
  }
}

}  // namespace
