// The decoder's marker reader and the file-header pre-scan.
#include <gtest/gtest.h>

#include <cstring>
#include <map>
#include <functional>
#include <string>
#include <tuple>
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

// What the corpus cannot show: two tables in one DHT, the band of a baseline
// scan, the window left at the entropy-coded data.
TEST(ParseNextMarker, ReadsABaselineHeaderIntoTheDecoder) {
  Bytes two_tables = vjtest::dht_table(0x00, kCounts, kSymbols);
  Bytes ac = vjtest::dht_table(0x13, kCounts, kSymbols);
  two_tables.insert(two_tables.end(), ac.begin(), ac.end());
  JpegBuilder b;
  b.soi()
      .dqt(3, 100)
      .sof(0xC0, 300, 200, {{7, 2, 1, 3}, {8, 1, 2, 3}, {9, 1, 1, 3}})
      .segment(0xC4, two_tables)
      .sos({{7, 0x03}, {8, 0x03}, {9, 0x03}}, 1, 5, 0x01)
      .raw({0xAB});
  MarkerReader r(b.bytes());
  uint8_t code = 0;
  ASSERT_EQ(r.next(&code), 200);
  EXPECT_EQ(code, 0xDA);
  EXPECT_EQ(r.peek(), 0xAB) << "window left at the first entropy-coded byte";
  const DecoderInfo* d = r.d();
  EXPECT_EQ(d->huff_store_count, 2u);
  EXPECT_EQ(d->dc_huff[0], d->huff_store[0]);
  EXPECT_EQ(d->ac_huff[3], d->huff_store[1]);
  EXPECT_EQ(0, std::memcmp(d->huff_store[1]->bits + 1, kCounts.data(), 16));
  EXPECT_EQ(0, std::memcmp(d->huff_store[1]->huffval, kSymbols.data(), kSymbols.size()));
  EXPECT_EQ(d->quant_tables[3]->values[8], 102) << "zig-zag position 2 is row 1, column 0";
  for (int i = 0; i < 3; ++i) EXPECT_EQ(d->scan_components[i], &d->components[i]);
  EXPECT_EQ(d->components[2].ac_no, 3);
  EXPECT_EQ(d->scan_comp_index, 2u);
  EXPECT_EQ(d->first_scan_comps, -1);
  EXPECT_EQ(d->Ss + d->Ah + d->Al, 0u);
  EXPECT_EQ(d->Se, 63u);
}

TEST(ParseNextMarker, AcceptsFillBytesGarbageAndOtherCodesBetweenSegments) {
  JpegBuilder b;
  b.raw({0x00, 0x11, 0xFF, 0xD8, 0xFF, 0xFF, 0xFF})
      .sof(0xC0, 8, 8, {{1, 1, 1, 0}})
      .raw({0x55, 0x66, 0xFF, 0xD0, 0xFF, 0x00, 0xFF, 0xFF})
      .segment(0xE3, {1, 2, 3})
      .segment(0xFE, {})
      .segment(0xDC, {0, 8})
      .sos({{1, 0x00}})
      .raw({0x42});
  MarkerReader r(b.bytes());
  ASSERT_EQ(r.next(), 200);
  EXPECT_EQ(r.peek(), 0x42);
}

TEST(ParseNextMarker, ProgressiveScansKeepTheirBandAndFirstScanCount) {
  JpegBuilder b;
  b.soi()
      .sof(0xC2, 16, 16, {{1, 1, 1, 0}, {2, 1, 1, 0}, {3, 1, 1, 0}})
      .sos({{1, 0x00}}, 0, 0, 0x01)
      .raw({0x01})
      .sos({{2, 0x01}}, 1, 5, 0x21)
      .raw({0x02})
      .sos({{1, 0x00}, {2, 0x00}, {3, 0x00}}, 0, 0, 0x10)
      .raw({0x03});
  MarkerReader r(b.bytes());
  ASSERT_EQ(r.next(), 200);
  EXPECT_EQ(r.m()->frame_kind, 2);
  EXPECT_EQ(r.d()->first_scan_comps, 1);
  EXPECT_EQ(r.peek(), 0x01);
  ASSERT_EQ(r.next(), 200);
  EXPECT_EQ(r.d()->Ss, 1u);
  EXPECT_EQ(r.d()->Se, 5u);
  EXPECT_EQ(r.d()->Ah, 2u);
  EXPECT_EQ(r.d()->Al, 1u);
  EXPECT_EQ(r.d()->scan_comp_index, 1u);
  EXPECT_EQ(r.d()->first_scan_comps, 1) << "later scans leave the first-scan count";
  ASSERT_EQ(r.next(), 200);
  EXPECT_EQ(r.d()->comps_in_scan, 3);
  EXPECT_EQ(r.d()->first_scan_comps, 1);
  // No further scan: the walk ends with 201.
  EXPECT_EQ(r.next(), 201);
}

TEST(ParseNextMarker, RedefinedTablesTakeNewSlotsUpToTheStoreSize) {
  auto stream_with = [](uint32_t tables) {
    JpegBuilder b;
    b.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}});
    for (uint32_t i = 0; i < tables; ++i) b.dht(0x00, kCounts, kSymbols);
    b.sos({{1, 0x00}});
    return b.bytes();
  };
  MarkerReader full(stream_with(kMaxTableSpecs));
  ASSERT_EQ(full.next(), 200);
  EXPECT_EQ(full.d()->huff_store_count, kMaxTableSpecs);
  EXPECT_EQ(full.d()->dc_huff[0], full.d()->huff_store[kMaxTableSpecs - 1]);

  MarkerReader over(stream_with(kMaxTableSpecs + 1));
  EXPECT_EQ(over.next(), 201);
  EXPECT_EQ(over.d()->huff_store_count, kMaxTableSpecs);
}

// Streams that the marker reader must refuse with status 201.
struct BadHeader {
  const char* name;
  Bytes bytes;
};

Bytes with_frame(const std::function<void(JpegBuilder&)>& middle) {
  JpegBuilder b;
  b.soi().sof(0xC0, 16, 16, {{1, 1, 1, 0}, {2, 1, 1, 0}});
  middle(b);
  b.sos({{1, 0x00}}).raw({0x00});
  return b.bytes();
}

Bytes raw_segment(uint8_t code, const Bytes& length_and_payload) {
  Bytes out{0xFF, code};
  out.insert(out.end(), length_and_payload.begin(), length_and_payload.end());
  return out;
}

std::vector<BadHeader> bad_headers() {
  std::vector<BadHeader> v;
  auto add = [&](const char* name, const Bytes& bytes) { v.push_back({name, bytes}); };
  auto sof = [](uint8_t code, uint32_t w, uint32_t h, const std::vector<vjtest::FrameComp>& c) {
    JpegBuilder b;
    b.soi().sof(code, w, h, c).sos({{1, 0x00}}).raw({0});
    return b.bytes();
  };
  add("Width50001", sof(0xC0, 50001, 8, {{1, 1, 1, 0}}));
  add("Height50001", sof(0xC2, 8, 50001, {{1, 1, 1, 0}}));
  add("FiveComponents", sof(0xC0, 8, 8, {{1, 1, 1, 0}, {2, 1, 1, 0}, {3, 1, 1, 0},
                                         {4, 1, 1, 0}, {5, 1, 1, 0}}));
  add("NoComponents", sof(0xC0, 8, 8, {}));
  add("SamplingZero", sof(0xC0, 8, 8, {{1, 0, 1, 0}}));
  add("SamplingFive", sof(0xC0, 8, 8, {{1, 1, 5, 0}}));
  {
    // Nf 3 with Lf 18: the length must be 3 * 3 + 8 = 17.
    JpegBuilder b;
    b.soi().raw(
        raw_segment(0xC0, {0, 18, 8, 0, 8, 0, 8, 3, 1, 0x11, 0, 2, 0x11, 0, 3, 0x11, 0, 0}));
    b.sos({{1, 0x00}});
    add("FrameLengthMismatch", b.bytes());
  }
  add("SecondFrame", with_frame([](JpegBuilder& b) { b.sof(0xC0, 8, 8, {{1, 1, 1, 0}}); }));
  {
    JpegBuilder b;
    b.soi().dqt(0).sos({{1, 0x00}}).sof(0xC0, 8, 8, {{1, 1, 1, 0}});
    add("ScanBeforeFrame", b.bytes());
  }
  add("DqtSixteenBit", with_frame([](JpegBuilder& b) { b.dqt(0x10); }));
  add("DqtTableFour", with_frame([](JpegBuilder& b) { b.dqt(4); }));
  add("DqtLengthShort", with_frame([](JpegBuilder& b) {
        Bytes p{0x00};
        p.resize(64, 1);  // one value short
        b.segment(0xDB, p);
      }));
  add("DqtLengthOne", with_frame([](JpegBuilder& b) { b.raw(raw_segment(0xDB, {0, 1})); }));
  add("DhtClassTwo", with_frame([](JpegBuilder& b) { b.dht(0x20, kCounts, kSymbols); }));
  add("DhtTableFour", with_frame([](JpegBuilder& b) { b.dht(0x04, kCounts, kSymbols); }));
  add("DhtCountsOver256", with_frame([](JpegBuilder& b) {
        b.dht(0x00, Bytes(16, 17), Bytes(272, 0));
      }));
  add("DhtSymbolsPastSegment", with_frame([](JpegBuilder& b) {
        b.dht(0x00, kCounts, Bytes(kSymbols.begin(), kSymbols.end() - 1));
      }));
  add("DhtHeadCut", with_frame([](JpegBuilder& b) { b.segment(0xC4, Bytes(10, 0)); }));
  add("DriLengthFive", with_frame([](JpegBuilder& b) { b.segment(0xDD, {0, 1, 0}); }));
  add("AppLengthOne", with_frame([](JpegBuilder& b) { b.raw(raw_segment(0xE1, {0, 1})); }));
  {
    JpegBuilder b;
    b.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).raw(raw_segment(0xE1, {0xFF, 0xF0, 1, 2, 3}));
    add("AppPastTheEnd", b.bytes());
  }
  auto scan = [](const std::vector<vjtest::ScanComp>& c, uint8_t ss = 0, uint8_t se = 63,
                 uint8_t ahal = 0) {
    JpegBuilder b;
    b.soi().sof(0xC2, 8, 8, {{1, 1, 1, 0}, {2, 1, 1, 0}}).sos(c, ss, se, ahal).raw({0});
    return b.bytes();
  };
  add("ScanComponentNotInFrame", scan({{3, 0x00}}));
  add("ScanComponentTwice", scan({{1, 0x00}, {1, 0x00}}));
  add("ScanNoComponents", scan({}));
  add("ScanFiveComponents", scan({{1, 0}, {2, 0}, {1, 0}, {2, 0}, {1, 0}}));
  add("ScanDcTableFour", scan({{1, 0x40}}));
  add("ScanAcTableFour", scan({{1, 0x04}}));
  add("ProgressiveBandPast63", scan({{1, 0x00}}, 1, 64));
  add("ProgressiveBandReversed", scan({{1, 0x00}}, 6, 5));
  add("ProgressiveApproxPast13", scan({{1, 0x00}}, 0, 0, 0x0E));
  {
    JpegBuilder b;
    b.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).raw(raw_segment(0xDA, {0, 9, 1, 1, 0, 0, 63, 0}));
    add("ScanLengthMismatch", b.bytes());
  }
  {
    JpegBuilder b;
    b.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).eoi().raw({0, 0, 0});
    add("EoiBeforeScan", b.bytes());
  }
  add("Empty", {});
  add("OnlyFillBytes", Bytes(40, 0xFF));
  return v;
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

// A caller stream is read whole into memory at a progressive frame, the part
// before the window included (the source can rewind).
TEST(ParseNextMarker, TurnsACallerStreamIntoAMemoryStream) {
  JpegBuilder b;
  b.soi().com(30000, 0x11).com(20000, 0x22);
  b.sof(0xC2, 8, 8, {{1, 1, 1, 0}}).sos({{1, 0x00}}, 0, 0, 0).raw({0x5A});
  b.com(40, 0x33).sos({{1, 0x00}}, 1, 63, 0).raw({0xA5});
  const Bytes bytes = b.bytes();
  MarkerReader r(bytes, 4);
  ASSERT_EQ(r.next(), 200);
  IoStream* s = r.stream();
  ASSERT_EQ(s->kind, 5);
  ASSERT_EQ(s->size, bytes.size());
  EXPECT_EQ(s->read_callback, nullptr);
  EXPECT_EQ(0, std::memcmp(s->source, bytes.data(), bytes.size()));
  EXPECT_EQ(r.peek(), 0x5A);
  ASSERT_EQ(r.next(), 200);
  EXPECT_EQ(r.peek(), 0xA5);

  // An unknown size, or one below what was already read, is refused.
  for (int64_t size : {0, 5}) {
    MarkerReader bad(bytes, 4, size);
    EXPECT_EQ(bad.next(), 201);
    EXPECT_EQ(bad.stream()->kind, 4);
  }
}

// ---------------------------------------------------------------------------
// File-header pre-scan

int32_t prescan(const Bytes& bytes, FileHeaderInfo* h, int32_t mode = 8) {
  return vjtest::on_memory_window(
      bytes, [&](StreamWindow* w) { return VETAJ_ParseFileHeader(w, mode, h); });
}

// The thumbnail fields a test expects.
struct Thumb {
  int32_t width, height, format, colour;
  uint32_t length, offset;
};

void expect_thumbnail(const ThumbnailInfo& t, const Thumb& e) {
  EXPECT_EQ(t.present, 1);
  EXPECT_EQ(t.width, e.width);
  EXPECT_EQ(t.height, e.height);
  EXPECT_EQ(t.format, e.format);
  EXPECT_EQ(t.colour, e.colour);
  EXPECT_EQ(t.length, e.length);
  EXPECT_EQ(t.offset, e.offset);
}

// A stream with the given APP segments before a 640x480 baseline frame.
Bytes with_app(const std::vector<std::pair<uint8_t, Bytes>>& apps, size_t tail = 64) {
  JpegBuilder b;
  b.soi();
  for (const auto& [code, payload] : apps) b.segment(code, payload);
  b.dqt(0).sof(0xC0, 640, 480, {{1, 2, 2, 0}, {2, 1, 1, 0}, {3, 1, 1, 0}});
  b.sos({{1, 0x00}, {2, 0x11}, {3, 0x11}}).raw(Bytes(tail, 0x12)).eoi();
  return b.bytes();
}

Bytes jfif(uint8_t major, uint8_t tw, uint8_t th, size_t pixel_bytes) {
  Bytes p{'J', 'F', 'I', 'F', 0, major, 2, 1, 0, 72, 0, 72, tw, th};
  if (major != 1) {  // other versions: the size sits one byte earlier
    p[11] = tw;
    p[12] = th;
    p[13] = 0;
  }
  p.resize(p.size() + pixel_bytes, 0x80);
  return p;
}

TEST(ParseFileHeader, RefusesBadModesMissingSoiAndMalformedSegments) {
  FileHeaderInfo h{};
  EXPECT_EQ(prescan(with_app({}), &h, 3), 201);
  EXPECT_EQ(prescan(with_app({}), &h, 2), 200);
  Bytes no_soi = with_app({});
  no_soi[1] = 0xD7;
  EXPECT_EQ(prescan(no_soi, &h), 201);
  // An APP0 claiming more bytes than the input holds.
  Bytes big = with_app({{0xE0, Bytes(100, 0)}});
  big[4] = 0x40;
  EXPECT_EQ(prescan(big, &h), 201);
  JpegBuilder b;
  b.soi().sof(0xC0, 0, 8, {{1, 1, 1, 0}}).sos({{1, 0}});
  EXPECT_EQ(prescan(b.bytes(), &h), 201) << "zero width";
  JpegBuilder c;
  c.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}, 12).sos({{1, 0}});
  EXPECT_EQ(prescan(c.bytes(), &h), 201) << "12-bit";
  JpegBuilder e;
  e.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).eoi();
  EXPECT_EQ(prescan(e.bytes(), &h), 201) << "no scan";
  JpegBuilder f;
  f.soi().sof(0xC1, 8, 8, {{1, 1, 1, 0}}).sos({{1, 0}});
  EXPECT_EQ(prescan(f.bytes(), &h), 201) << "no baseline or progressive frame";
}

// Other JFIF versions keep the thumbnail size one byte earlier; the caller's
// words 9..14 pass through.
TEST(ParseFileHeader, ReadsJfifThumbnailsOfOtherVersions) {
  FileHeaderInfo h{};
  h.thumbnail.unused9 = 77;
  h.thumbnail.x_resolution[1] = 5;
  ASSERT_EQ(prescan(with_app({{0xE0, jfif(2, 3, 1, 9)}}), &h), 200);
  expect_thumbnail(h.thumbnail, {3, 1, 1, 2, 9, 2 + 4 + 14});
  EXPECT_EQ(h.thumbnail.unused9, 77);
  EXPECT_EQ(h.thumbnail.x_resolution[1], 5u);
}

Bytes jfxx(uint8_t code, const Bytes& data) {
  Bytes p{'J', 'F', 'X', 'X', 0, code};
  p.insert(p.end(), data.begin(), data.end());
  return p;
}

// An Exif APP1 payload: IFD0 with one entry, IFD1 with the given entries.
struct IfdEntry {
  uint16_t tag, type;
  uint32_t value;
};

Bytes exif(bool big, const std::vector<IfdEntry>& ifd1, uint32_t ifd0_at = 8,
           size_t padding = 0) {
  Bytes t;
  auto u16 = [&](uint32_t v) {
    if (big) {
      t.push_back(static_cast<uint8_t>(v >> 8));
      t.push_back(static_cast<uint8_t>(v));
    } else {
      t.push_back(static_cast<uint8_t>(v));
      t.push_back(static_cast<uint8_t>(v >> 8));
    }
  };
  auto u32 = [&](uint32_t v) {
    if (big) {
      u16(v >> 16);
      u16(v & 0xFFFF);
    } else {
      u16(v & 0xFFFF);
      u16(v >> 16);
    }
  };
  auto entry = [&](const IfdEntry& e) {
    u16(e.tag);
    u16(e.type);
    u32(1);
    if (e.type == 3 || e.type == 8) {
      u16(e.value);
      u16(0);
    } else if (e.type == 1 || e.type == 2 || e.type == 6 || e.type == 7) {
      t.push_back(static_cast<uint8_t>(e.value));
      t.insert(t.end(), 3, 0);
    } else {
      u32(e.value);
    }
  };
  t.push_back(big ? 'M' : 'I');
  t.push_back(big ? 'M' : 'I');
  u16(42);
  u32(ifd0_at == 8 ? static_cast<uint32_t>(8 + padding) : ifd0_at);
  t.resize(8 + padding, 0xEE);  // padding before IFD0 pushes IFD1 past the window
  u16(1);
  entry({0x112, 3, 1});
  const uint32_t ifd1_at = static_cast<uint32_t>(t.size() + 4);
  u32(ifd1_at);
  u16(static_cast<uint32_t>(ifd1.size()));
  for (const IfdEntry& e : ifd1) entry(e);
  u32(0);
  Bytes p{'E', 'x', 'i', 'f', 0, 0};
  p.insert(p.end(), t.begin(), t.end());
  return p;
}

class ExifThumbnail : public ::testing::TestWithParam<std::tuple<bool, size_t>> {};

TEST_P(ExifThumbnail, IsLocatedFromIfd1) {
  const auto [big, padding] = GetParam();
  const std::vector<IfdEntry> ifd1{{0x100, 3, 160}, {0x101, 4, 120}, {0x103, 3, 6},
                                   {0x106, 3, 2},   {0x11C, 3, 1},   {0x201, 4, 30},
                                   {0x202, 4, 400}, {0x104D, 1, 9},  {0x11A, 5, 0}};
  const Bytes stream = with_app({{0xE1, exif(big, ifd1, 8, padding)}}, 600);
  FileHeaderInfo h{};
  ASSERT_EQ(prescan(stream, &h), 200);
  // The offset counts from the TIFF header.
  expect_thumbnail(h.thumbnail, {160, 120, 6, 2, 400, 2 + 4 + 6 + 30});
  EXPECT_EQ(h.thumbnail.planar, 1);
  EXPECT_EQ(h.thumbnail.vendor, 9);
}

INSTANTIATE_TEST_SUITE_P(ByteOrders, ExifThumbnail,
                         ::testing::Combine(::testing::Bool(), ::testing::Values(0, 20000)));

TEST(ParseFileHeader, UncompressedExifThumbnailUsesStrips) {
  const std::vector<IfdEntry> ifd1{{0x103, 3, 1}, {0x111, 4, 40}, {0x117, 4, 48}};
  FileHeaderInfo h{};
  ASSERT_EQ(prescan(with_app({{0xE1, exif(false, ifd1)}}), &h), 200);
  expect_thumbnail(h.thumbnail, {0, 0, 0, 0, 48, 12 + 40});
}

Bytes resource(uint16_t id, const std::string& name, const Bytes& data) {
  Bytes r{'8', 'B', 'I', 'M'};
  vjtest::put16(&r, id);
  r.push_back(static_cast<uint8_t>(name.size()));
  r.insert(r.end(), name.begin(), name.end());
  if (r.size() % 2 != 0) r.push_back(0);
  vjtest::put32(&r, static_cast<uint32_t>(data.size()));
  r.insert(r.end(), data.begin(), data.end());
  if (r.size() % 2 != 0) r.push_back(0);
  return r;
}

Bytes photoshop(const std::vector<Bytes>& resources) {
  const char sig[] = "Photoshop 3.0";
  Bytes p(sig, sig + sizeof sig);
  for (const Bytes& r : resources) p.insert(p.end(), r.begin(), r.end());
  return p;
}

Bytes thumb_resource(uint32_t format, uint32_t length, uint32_t data_bytes) {
  Bytes d;
  vjtest::put32(&d, format);
  vjtest::put32(&d, 80);
  vjtest::put32(&d, 60);
  vjtest::put32(&d, 240);
  vjtest::put32(&d, 14400);
  vjtest::put32(&d, length);
  vjtest::put16(&d, 24);
  vjtest::put16(&d, 1);
  d.resize(28 + data_bytes, 0xCC);
  return d;
}

TEST(ParseFileHeader, KeepsAnEarlierThumbnail) {
  const Bytes app13 = photoshop({resource(0x040C, "", thumb_resource(1, 50, 51))});
  for (const auto& later : {std::pair<uint8_t, Bytes>{0xE1, exif(false, {{0x100, 3, 9}})},
                            std::pair<uint8_t, Bytes>{0xED, app13}}) {
    FileHeaderInfo h{};
    ASSERT_EQ(prescan(with_app({{0xE0, jfif(1, 1, 1, 3)}, later}), &h), 200);
    expect_thumbnail(h.thumbnail, {1, 1, 1, 2, 3, 2 + 4 + 14});
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
  Bytes cut13 = photoshop({resource(0x040C, "", thumb_resource(1, 50, 51))});
  cut13.resize(cut13.size() - 40);
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
      {"ResourceThumbLongerThanResource", 0xED,
       photoshop({resource(0x040C, "", thumb_resource(1, 60, 51))})},
      {"ResourceShorterThanHeader", 0xED, photoshop({resource(0x040C, "", Bytes(20, 0))})},
      {"ResourcePastSegment", 0xED, cut13},
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

class CorpusMarkers : public ::testing::TestWithParam<std::string> {};

TEST_P(CorpusMarkers, FrameTablesAndScansAgreeWithTheOracle) {
  const std::string name = GetParam();
  const Bytes bytes = vjtest::read_fixture(name);
  const vjtest::ManifestEntry* entry = vjtest::manifest_entry(name);
  ASSERT_NE(entry, nullptr);
  for (int32_t kind : {1, 4}) {
    SCOPED_TRACE(kind == 1 ? "memory" : "caller stream");
    MarkerReader r(bytes, kind);
    const int32_t status = r.next();
    if (vjtest::has_kind(name, "bad_")) {
      // 12-bit, extended-sequential and arithmetic-coded frames are refused.
      EXPECT_EQ(status, 201);
      continue;
    }
    ASSERT_EQ(status, 200);
    const DecoderInfo* d = r.d();
    const MarkerState* m = r.m();
#if VETAJ_HAVE_LIBJPEG
    vjtest::OracleHeader o;
    ASSERT_TRUE(vjtest::oracle_header(bytes, &o));
    EXPECT_EQ(d->image_width, o.width);
    EXPECT_EQ(d->image_height, o.height);
    EXPECT_EQ(d->num_components, o.num_components);
    EXPECT_EQ(d->max_h_samp, o.max_h);
    EXPECT_EQ(d->max_v_samp, o.max_v);
    EXPECT_EQ(d->restart_interval, static_cast<uint32_t>(o.restart_interval));
    EXPECT_EQ(m->frame_kind, o.progressive ? 2 : 1);
    EXPECT_EQ(m->seen_adobe, o.saw_adobe);
    if (o.saw_adobe) {
      EXPECT_EQ(m->adobe_transform, o.adobe_transform);
    }
    if (o.saw_jfif) {
      EXPECT_EQ(m->seen_app0, 1);
    }
    for (int i = 0; i < o.num_components && i < 4; ++i) {
      EXPECT_EQ(d->components[i].id, o.comp_id[i]);
      EXPECT_EQ(m->component_ids[i], o.comp_id[i]);
      EXPECT_EQ(d->components[i].h_samp, o.h_samp[i]);
      EXPECT_EQ(d->components[i].v_samp, o.v_samp[i]);
    }
    std::vector<vjtest::OracleComponent> comps;
    ASSERT_TRUE(vjtest::oracle_coefficients(bytes, &comps));
    for (size_t i = 0; i < comps.size() && i < d->num_components; ++i) {
      const QuantTable* q = d->quant_tables[d->components[i].quant_no & 3];
      ASSERT_NE(q, nullptr);
      EXPECT_EQ(0, std::memcmp(q->values, comps[i].quant, sizeof q->values)) << "component " << i;
    }
#endif
    EXPECT_EQ(1 + count_scans(&r), entry->marker_count("SOS"));
    EXPECT_EQ(static_cast<int>(d->huff_store_count), entry->marker_count("DHT"));
    if (kind == 4 && m->frame_kind == 2) {
      // Read whole into memory at the progressive frame.
      ASSERT_EQ(r.stream()->kind, 5);
      ASSERT_EQ(r.stream()->size, bytes.size());
      EXPECT_EQ(0, std::memcmp(r.stream()->source, bytes.data(), bytes.size()));
    }
  }
}

// Thumbnails the pre-scan must find in the corpus: format, size, length,
// and the size of the picture a JPEG thumbnail holds.
struct ExpectedThumb {
  int32_t format, width, height;
  uint32_t length;
  int jpeg_width, jpeg_height;
};

const std::map<std::string, ExpectedThumb>& expected_thumbnails() {
  static const std::map<std::string, ExpectedThumb> m{
      {"exif_thumb_ii_640x480.jpg", {6, -1, -1, 0, 160, 120}},
      {"exif_thumb_mm_320x240.jpg", {6, -1, -1, 0, 80, 60}},
      {"exif_thumb_portrait_ii_240x320.jpg", {6, -1, -1, 0, 80, 60}},
      {"thumb_jfif_rgb4x3_64x48.jpg", {1, 4, 3, 36, 0, 0}},
      {"thumb_jfxx_jpeg_128x96.jpg", {6, -1, -1, 0, 32, 24}},
      {"thumb_jfxx_rgb_128x96.jpg", {1, 16, 12, 576, 0, 0}},
      {"thumb_jfxx_pal_128x96.jpg", {1, 16, 12, 768 + 192, 0, 0}},
      {"thumb_app13_jpeg_640x480.jpg", {7, 160, 120, 5781, 160, 120}},
  };
  return m;
}

TEST_P(CorpusMarkers, PreScanFindsTheSizeAndThumbnail) {
  const std::string name = GetParam();
  const Bytes bytes = vjtest::read_fixture(name);
  FileHeaderInfo h{};
  const int32_t status = prescan(bytes, &h);
  if (vjtest::has_kind(name, "bad_")) {
    // No 8-bit baseline or progressive frame: no picture to size.
    EXPECT_EQ(status, 201);
    return;
  }
  ASSERT_EQ(status, 200);
#if VETAJ_HAVE_LIBJPEG
  vjtest::OracleHeader o;
  ASSERT_TRUE(vjtest::oracle_header(bytes, &o));
  EXPECT_EQ(h.width, o.width);
  EXPECT_EQ(h.height, o.height);
  EXPECT_EQ(h.progressive, o.progressive);
#endif
  const ThumbnailInfo& t = h.thumbnail;
  auto it = expected_thumbnails().find(name);
  if (it == expected_thumbnails().end()) {
    EXPECT_EQ(t.present, 0);
    return;
  }
  const ExpectedThumb& e = it->second;
  ASSERT_EQ(t.present, 1);
  EXPECT_EQ(t.format, e.format);
  if (e.width >= 0) {
    EXPECT_EQ(t.width, e.width);
    EXPECT_EQ(t.height, e.height);
  }
  if (e.length != 0) {
    EXPECT_EQ(t.length, e.length);
  }
  ASSERT_LE(uint64_t(t.offset) + t.length, bytes.size());
  if (e.jpeg_width != 0) {
    const Bytes thumb(bytes.begin() + t.offset, bytes.begin() + t.offset + t.length);
    ASSERT_GE(thumb.size(), 2u);
    EXPECT_EQ(thumb[0], 0xFF);
    EXPECT_EQ(thumb[1], 0xD8);
#if VETAJ_HAVE_LIBJPEG
    vjtest::OracleHeader th;
    ASSERT_TRUE(vjtest::oracle_header(thumb, &th));
    EXPECT_EQ(th.width, e.jpeg_width);
    EXPECT_EQ(th.height, e.jpeg_height);
#endif
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, CorpusMarkers, ::testing::ValuesIn(vjtest::list_fixtures(".jpg")),
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
      if (prescan(cut, &h) == 200) {
        EXPECT_EQ(h.width, expected.width) << name << " at " << n;
        EXPECT_EQ(h.height, expected.height) << name << " at " << n;
        EXPECT_EQ(h.progressive, expected.progressive) << name << " at " << n;
        EXPECT_EQ(h.thumbnail.present, expected.thumbnail.present) << name << " at " << n;
      }
    }
  }
}

}  // namespace
