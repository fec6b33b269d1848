// Exif and TIFF metadata: hand-built blocks in both byte orders, the JPEG
// locators over every input kind, TIFF containers and hostile input.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "io/stream.h"
#include "meta/exif.h"
#include "support/files.h"

namespace {

using Bytes = std::vector<uint8_t>;

// Builds TIFF data: the header, the IFDs one after another, then blobs: the
// values that do not fit in their entries and free-standing data.
struct TiffBuilder {
  struct Entry {
    uint16_t tag, type;
    uint32_t count;
    Bytes payload;
    int ifd_ref = -1, blob_ref = -1;
  };
  struct Ifd {
    std::vector<Entry> entries;
    int next = -1;
  };
  bool le;
  std::vector<Ifd> ifds{1};
  std::vector<Bytes> blobs;
  std::vector<uint32_t> ifd_at, blob_at;

  explicit TiffBuilder(bool little_endian) : le(little_endian) {}
  void put(Bytes& v, uint32_t x, int n) const {
    for (int i = 0; i < n; ++i) v.push_back(uint8_t(x >> (8 * (le ? i : n - 1 - i))));
  }
  int ifd() {
    ifds.emplace_back();
    return int(ifds.size()) - 1;
  }
  int blob(Bytes b) {
    blobs.push_back(std::move(b));
    return int(blobs.size()) - 1;
  }
  TiffBuilder& add(int i, uint16_t tag, uint16_t type, uint32_t count, Bytes payload) {
    ifds[i].entries.push_back({tag, type, count, payload});
    if (payload.size() > 4) ifds[i].entries.back().blob_ref = blob(payload);
    return *this;
  }
  // Values of 2 bytes (SHORT) or 4 bytes (LONG, and rationals as pairs).
  TiffBuilder& num(int i, uint16_t tag, uint16_t type, std::vector<uint32_t> v) {
    Bytes p;
    for (uint32_t x : v) put(p, x, type == 3 || type == 8 ? 2 : 4);
    return add(i, tag, type, uint32_t(v.size()) / (type == 5 || type == 10 ? 2 : 1), p);
  }
  TiffBuilder& str(int i, uint16_t tag, const std::string& s, uint16_t type = 2) {
    return add(i, tag, type, uint32_t(s.size()), Bytes(s.begin(), s.end()));
  }
  // A LONG holding the offset of an IFD or a blob.
  TiffBuilder& ref(int i, uint16_t tag, int target, bool to_blob = false) {
    add(i, tag, 4, 1, {});
    (to_blob ? ifds[i].entries.back().blob_ref : ifds[i].entries.back().ifd_ref) = target;
    return *this;
  }
  Bytes build() {
    uint32_t off = 8;
    ifd_at.clear();
    blob_at.clear();
    for (const Ifd& d : ifds) ifd_at.push_back(off), off += 6 + 12 * uint32_t(d.entries.size());
    for (const Bytes& b : blobs) blob_at.push_back(off), off += uint32_t(b.size());
    Bytes out = {uint8_t(le ? 'I' : 'M'), uint8_t(le ? 'I' : 'M')};
    put(out, 42, 2), put(out, ifd_at[0], 4);
    for (const Ifd& d : ifds) {
      put(out, uint32_t(d.entries.size()), 2);
      for (const Entry& e : d.entries) {
        put(out, e.tag, 2), put(out, e.type, 2), put(out, e.count, 4);
        Bytes value = e.payload;
        if (e.ifd_ref >= 0 || e.blob_ref >= 0)
          value.clear(), put(value, e.ifd_ref >= 0 ? ifd_at[e.ifd_ref] : blob_at[e.blob_ref], 4);
        value.resize(4, 0);
        out.insert(out.end(), value.begin(), value.end());
      }
      put(out, d.next >= 0 ? ifd_at[d.next] : 0, 4);
    }
    for (const Bytes& b : blobs) out.insert(out.end(), b.begin(), b.end());
    return out;
  }
};

struct ExifDeleter {
  void operator()(ExifInfo* e) const { VETAJ_DestroyExifInfo(e); }
};
using ExifPtr = std::unique_ptr<ExifInfo, ExifDeleter>;
ExifPtr fresh() { return ExifPtr(vj::alloc_zeroed<ExifInfo>()); }

ExifPtr read_exif(const Bytes& tiff, uint32_t position = 0, int32_t* result = nullptr) {
  ExifPtr e = fresh();
  const int32_t r = VETAJ_ReadExifInfo(tiff.data(), position, uint32_t(tiff.size()), e.get());
  if (result != nullptr) *result = r;
  return e;
}

Bytes segment(uint8_t code, const Bytes& payload) {
  Bytes s = {0xFF, code, uint8_t((payload.size() + 2) >> 8), uint8_t(payload.size() + 2)};
  s.insert(s.end(), payload.begin(), payload.end());
  return s;
}
Bytes exif_app1(const Bytes& tiff) {
  Bytes p = {'E', 'x', 'i', 'f', 0, 0};
  p.insert(p.end(), tiff.begin(), tiff.end());
  return segment(0xE1, p);
}
// A small JPEG stream: SOI, the given segments, a frame of the given size
// and a scan.
Bytes jpeg(const std::vector<Bytes>& segments, uint16_t width = 64, uint16_t height = 48,
           uint8_t sof = 0xC0) {
  Bytes j = {0xFF, 0xD8};
  for (const Bytes& s : segments) j.insert(j.end(), s.begin(), s.end());
  for (const Bytes& s : {segment(0xDB, Bytes(65, 1)),
                         segment(sof, {8, uint8_t(height >> 8), uint8_t(height),
                                       uint8_t(width >> 8), uint8_t(width), 1, 1, 0x11, 0}),
                         segment(0xDA, {1, 1, 0, 0, 63, 0})})
    j.insert(j.end(), s.begin(), s.end());
  for (uint8_t b : {0x12, 0x34, 0xFF, 0x00, 0xFF, 0xD9}) j.push_back(b);
  return j;
}
const Bytes kJfif = segment(0xE0, {'J', 'F', 'I', 'F', 0, 1, 1, 0, 0, 1, 0, 1, 0, 0});

// A block using every way of storing a field, in IFD0, the Exif and GPS
// sub-IFDs, and a JPEG thumbnail of 160x120 in IFD1.
Bytes full_block(bool le, Bytes* thumbnail = nullptr, size_t software_size = 6) {
  TiffBuilder t(le);
  const int exif = t.ifd(), gps = t.ifd(), ifd1 = t.ifd();
  const Bytes thumb = jpeg({}, 160, 120);
  if (thumbnail != nullptr) *thumbnail = thumb;
  const int tb = t.blob(thumb);
  t.str(0, 271, std::string("Abc", 4));
  t.num(0, 274, 3, {6}).str(0, 305, std::string(software_size, 'v'));
  t.ref(0, 34665, exif).ref(0, 34853, gps).ifds[0].next = ifd1;
  t.num(exif, 40962, 3, {640}).num(exif, 40963, 4, {480}).num(exif, 37380, 10, {uint32_t(-1), 3});
  t.str(exif, 36868, std::string("2021:01:02 03:04:05", 20));
  t.str(gps, 0, std::string("\2\2\0\0", 4), 1).num(gps, 2, 5, {48, 1, 51, 1, 2400, 100});
  t.str(gps, 18, std::string("WGS-84", 7)).str(gps, 27, std::string("ASCII\0\0\0GPS", 11), 7);
  t.str(gps, 29, "2020:01:02X");
  t.num(ifd1, 256, 3, {999}).num(ifd1, 257, 3, {999}).num(ifd1, 259, 3, {6});
  t.ref(ifd1, 513, tb, true).num(ifd1, 514, 4, {uint32_t(thumb.size())});
  return t.build();
}

class ByteOrder : public ::testing::TestWithParam<bool> {};
INSTANTIATE_TEST_SUITE_P(Exif, ByteOrder, ::testing::Bool(),
                         [](const auto& p) { return p.param ? "Intel" : "Motorola"; });

TEST_P(ByteOrder, EveryKindOfFieldInEveryIfdIsRead) {
  int32_t result = 0;
  Bytes thumb;
  const Bytes tiff = full_block(GetParam(), &thumb);
  ExifPtr e = read_exif(tiff, 30, &result);
  ASSERT_EQ(result, 1);
  EXPECT_STREQ(e->make, "Abc");  // inline in its entry
  EXPECT_STREQ(e->software, "vvvvvv");  // no NUL in the data: terminated in the copy
  EXPECT_EQ(e->orientation, 6u);
  EXPECT_STREQ(e->date_time_digitized, "2021:01:02 03:04:05");
  EXPECT_EQ(e->pixel_x_dimension, 640u);  // SHORT
  EXPECT_EQ(e->pixel_y_dimension, 480u);  // LONG
  EXPECT_EQ(e->exposure_bias_value[0], -1);
  ASSERT_NE(e->gps, nullptr);
  const GpsInfo& g = *e->gps;
  EXPECT_EQ(g.latitude[4], 2400u);
  ASSERT_EQ(g.processing_method_length, 11u);
  EXPECT_EQ(0, std::memcmp(g.processing_method, "ASCII\0\0\0GPS", 12));
  EXPECT_STREQ(g.date_stamp, "2020:01:02");  // the 11th byte is always cleared
  const ThumbnailInfo& th = e->thumbnail;
  EXPECT_EQ(th.format, kThumbJpeg);
  EXPECT_EQ(th.height, 120);  // from the thumbnail's own frame, not tag 257
  ASSERT_EQ(th.length, thumb.size());
  EXPECT_EQ(0, std::memcmp(tiff.data() + th.offset - 30, thumb.data(), thumb.size()));
  EXPECT_EQ(th.data, nullptr);  // only the JPEG locator copies the data
}

TEST_P(ByteOrder, EntriesOfTheWrongTypeOrCountAreSkipped) {
  TiffBuilder t(GetParam());
  t.num(0, 258, 3, {8, 8}).num(0, 259, 4, {6}).str(0, 271, "Abc", 1).num(0, 274, 4, {6});
  t.num(0, 282, 10, {72, 1}).num(0, 283, 5, {1, 1, 2, 1}).add(0, 272, 2, 0, {'x'});
  const int exif = t.ifd();
  t.ref(0, 34665, exif)
      .str(exif, 36867, std::string("2020:01:02 03:04:05"))
      .num(exif, 34855, 3, {100, 200, 400});
  const Bytes tiff = t.build();
  ExifPtr e = read_exif(tiff);
  EXPECT_EQ(e->bits_per_sample[0], 0u);  // two SHORTs are never read
  EXPECT_EQ(e->compression + e->orientation + e->x_resolution[0] + e->y_resolution[0], 0u);
  EXPECT_EQ(e->make, nullptr);
  EXPECT_EQ(e->model, nullptr);               // zero-length string
  EXPECT_EQ(e->date_time_original, nullptr);  // 19 bytes, not 20
  // A list of ISO speeds is recorded by its offset.
  ASSERT_NE(e->iso_speed_ratings, 0u);
  const uint32_t at = e->iso_speed_ratings;
  EXPECT_EQ(GetParam() ? vj::le16(&tiff[at + 4]) : vj::be16(&tiff[at + 4]), 400u);
}

TEST_P(ByteOrder, SubIfdLinkingOnwardsEndsIfd0AndLeavesTheThumbnailEmpty) {
  for (int stopper : {34665, 34853}) {
    TiffBuilder t(GetParam());
    const int exif = t.ifd(), gps = t.ifd(), ifd1 = t.ifd();
    t.str(0, 271, "Maker").ref(0, 34665, exif).ref(0, 34853, gps).num(0, 531, 3, {2});
    t.num(exif, 37385, 3, {1}).num(gps, 6, 5, {5, 1});
    t.ifds[stopper == 34665 ? exif : gps].next = ifd1;
    t.ifds[0].next = ifd1;
    t.num(ifd1, 279, 4, {10}).num(ifd1, 273, 4, {8});
    ExifPtr e = read_exif(t.build());
    EXPECT_STREQ(e->make, "Maker");
    EXPECT_EQ(e->flash, 1u);
    EXPECT_EQ(e->ycbcr_positioning, 0u) << stopper;  // IFD0 reading stopped
    EXPECT_EQ(e->gps != nullptr, stopper == 34853);
    EXPECT_EQ(e->thumbnail.present, 0);
  }
}

TEST_P(ByteOrder, StripThumbnailAndUnreadableJpegThumbnail) {
  TiffBuilder t(GetParam());
  const int ifd1 = t.ifd();
  t.ifds[0].next = ifd1;
  t.num(ifd1, 256, 4, {20}).num(ifd1, 257, 3, {10}).num(ifd1, 259, 3, {1}).num(ifd1, 262, 3, {2});
  t.num(ifd1, 273, 3, {8}).num(ifd1, 279, 4, {600}).num(ifd1, 284, 3, {1}).num(ifd1, 4173, 3, {5});
  ExifPtr e = read_exif(t.build(), 100);
  const ThumbnailInfo& th = e->thumbnail;
  EXPECT_EQ(th.format, kThumbStrips);  // StripByteCounts overrides Compression 1
  EXPECT_EQ(std::make_tuple(th.width, th.offset, th.length), std::make_tuple(20, 108u, 600u));
  // A JPEG thumbnail that is not a JPEG stream keeps the sizes of its tags.
  TiffBuilder u(GetParam());
  const int j = u.ifd(), b = u.blob(Bytes(40, 7));
  u.ifds[0].next = j;
  u.num(j, 256, 3, {33}).num(j, 257, 3, {22}).ref(j, 513, b, true).num(j, 514, 4, {40});
  ExifPtr f = read_exif(u.build());
  EXPECT_EQ(f->thumbnail.height, 22);
  EXPECT_EQ(f->thumbnail.format, kThumbJpeg);
}

// An entry at position 4 of a block of `length` bytes: type, count and value
// field decide whether the entry is usable and where its value is.
TEST(Exif, TypeAndCountDecideWhereTheValueIs) {
  struct Case {
    uint16_t type;
    uint32_t count, value_field, length;
    bool usable;
    uint32_t value;
  } cases[] = {
      {2, 5, 35, 40, true, 35},             // ends at the data end
      {2, 5, 36, 40, false, 0},             // one byte past it
      {7, 0, 0, 40, false, 0},              // no values
      {3, 1, 0xBEEF, 40, true, 0xBEEF},     // inline SHORT
      {3, 2, 16, 40, false, 0},             // two SHORTs: never
      {3, 3, 34, 40, true, 34},             // 6 bytes
      {4, 1, 0xDEADBEEF, 40, true, 0xDEADBEEF},
      {5, 1, 32, 40, true, 32},             // RATIONAL: 8 bytes
      {12, 1, 33, 40, false, 0},            // DOUBLE: 8 bytes, one past the end
      {5, 0x20000000, 16, 40, false, 0},    // 8 x count wraps to 0
      {4, 0x40000001, 12, 40, false, 0},    // 4 x count wraps to 4
      {2, 10, 0xFFFFFFF8, 40, false, 0},    // offset + count wraps
      {0, 1, 0, 40, false, 0},              // unknown types
      {1, 1, 0, 15, false, 0},              // entry past the data
  };
  for (const Case& c : cases) {
    for (bool le : {true, false}) {
      TiffBuilder w(le);
      Bytes d(4, 0);
      w.put(d, 0x1234, 2), w.put(d, c.type, 2), w.put(d, c.count, 4);
      w.put(d, c.value_field, (c.type == 3 || c.type == 8) && c.count == 1 ? 2 : 4);
      d.resize(c.length, 0xEE);
      ExifField f{};
      ASSERT_EQ(VETAJ_ReadExifField(d.data(), 4, c.length, le, &f), c.usable ? 1 : 0)
          << c.type << " x " << c.count << " at " << c.value_field;
      if (!c.usable) continue;
      EXPECT_EQ(std::make_tuple(f.tag, f.count, f.value),
                std::make_tuple(uint16_t(0x1234), c.count, c.value));
    }
  }
}

TEST(Exif, HeaderChecksAndHostileStructures) {
  const Bytes ok = TiffBuilder(true).build();
  int32_t r = 0;
  read_exif(ok, 0, &r);
  EXPECT_EQ(r, 1);
  for (auto mutate : std::vector<void (*)(Bytes&)>{
           [](Bytes& b) { b.resize(7); }, [](Bytes& b) { b[1] = 'M'; }, [](Bytes& b) { b[2] = 43; },
           [](Bytes& b) { b[4] = uint8_t(b.size()); }}) {
    Bytes b = ok;
    mutate(b);
    read_exif(b, 0, &r);
    EXPECT_EQ(r, 0);
  }
  // IFD0 claiming more entries than the data holds: skipped, nothing read.
  TiffBuilder t(true);
  t.str(0, 271, "Maker").num(0, 274, 3, {3});
  Bytes b = t.build();
  b[8] = 3;
  ExifPtr e = read_exif(b, 0, &r);
  EXPECT_EQ(r, 1);
  EXPECT_EQ(e->make, nullptr);
  // IFDs pointing at themselves and at each other terminate; repeated
  // strings replace each other; a huge count or an offset past the end skips.
  TiffBuilder u(false);
  const int exif = u.ifd();
  u.str(0, 271, "first").str(0, 271, "second").ref(0, 34665, exif).ref(0, 34665, 0);
  u.add(0, 272, 2, 0xFFFFFFFF, {0, 0, 0, 8}).add(0, 305, 2, 5, {0, 0, 0x7F, 0});
  u.ref(exif, 34665, 0).num(exif, 37385, 3, {9});
  u.ifds[0].next = 0;
  u.ifds[exif].next = 0;
  e = read_exif(u.build(), 0, &r);
  EXPECT_EQ(r, 1);
  EXPECT_STREQ(e->make, "second");
  EXPECT_EQ(e->flash, 9u);
  EXPECT_EQ(e->model, nullptr);
  EXPECT_EQ(e->software, nullptr);
}

std::unique_ptr<DecInfo, int32_t (*)(DecInfo*)> memory_object(Bytes& data) {
  return {KOLVAVETA_CreateDecInfo(1, data.data(), uint32_t(data.size()), 0, 0),
          KOLVAVETA_DestroyDecInfo};
}

// File or memory input, and whether the Exif segment is larger than a window.
class Locator : public ::testing::TestWithParam<std::tuple<bool, bool>> {};
INSTANTIATE_TEST_SUITE_P(Exif, Locator, ::testing::Combine(::testing::Bool(), ::testing::Bool()));

TEST_P(Locator, FindsTheExifSegmentAfterOtherSegmentsAndCopiesTheThumbnail) {
  const auto [from_file, big] = GetParam();
  Bytes thumb;
  const Bytes tiff = full_block(false, &thumb, big ? 30000 : 6);
  // Garbage before the stream, APP0, a non-Exif APP1 (longer than a window),
  // fill bytes, then the Exif segment.
  Bytes file(100, 0x55), xmp(big ? 20000 : 50, 'x');
  const Bytes body = jpeg({kJfif, segment(0xE1, xmp), {0xFF, 0xFF}, exif_app1(tiff)});
  file.insert(file.end(), body.begin(), body.end());
  vjtest::TempFile temp(file);
  auto object =
      from_file ? std::unique_ptr<DecInfo, int32_t (*)(DecInfo*)>(
                      KOLVAVETA_CreateDecInfo(0, const_cast<char*>(temp.path().c_str()), 0, 0, 0),
                      KOLVAVETA_DestroyDecInfo)
                : memory_object(file);
  ASSERT_NE(object, nullptr);
  EXPECT_EQ(VETAJ_CreatExifInfo(object.get()), nullptr);  // offset 0 is not a JPEG stream
  object->jpeg_offset = 100;
  ExifPtr e(VETAJ_CreatExifInfo(object.get()));
  ASSERT_NE(e, nullptr);
  EXPECT_EQ(e->orientation, 6u);
  EXPECT_EQ(std::strlen(e->software), big ? 30000u : 6u);
  ASSERT_NE(e->gps, nullptr);
  EXPECT_STREQ(e->gps->map_datum, "WGS-84");
  const ThumbnailInfo& th = e->thumbnail;
  ASSERT_EQ(th.present, 1);
  ASSERT_NE(th.data, nullptr);
  EXPECT_EQ(Bytes(th.data, th.data + th.length), thumb);
  // The offset is an absolute input position.
  EXPECT_EQ(Bytes(file.begin() + th.offset, file.begin() + th.offset + th.length), thumb);
}

TEST(Exif, LocatorRefusesBrokenStreams) {
  const Bytes tiff = full_block(true);
  Bytes beyond = exif_app1(tiff);  // claims more than the input holds
  beyond[2] = 0xFF;
  const Bytes no_tiff = exif_app1(Bytes{'I', 'I', 43, 0, 8, 0, 0, 0});
  for (Bytes data :
       {jpeg({kJfif}), jpeg({segment(0xE1, {'E', 'x', 'i', 'f', 0})}),
        Bytes{0xFF, 0xD8, 0xFF, 0xE1, 0xFF, 0xF0, 'E', 'x', 'i', 'f', 0, 0, 'I', 'I'},
        jpeg({no_tiff}), Bytes{0xFF, 0xD9, 0xFF, 0xD8}, jpeg({segment(0xE0, {}), beyond})}) {
    auto object = memory_object(data);
    EXPECT_EQ(VETAJ_CreatExifInfo(object.get()), nullptr);
  }
  EXPECT_EQ(VETAJ_CreatExifInfo(nullptr), nullptr);
  EXPECT_EQ(VETAJ_DestroyExifInfo(nullptr), 0);
}

TEST(Exif, BufferHeaderChecks) {
  const Bytes good = exif_app1(full_block(false));
  ExifPtr e(VETAJ_CreatExifInfoUseExifBuffer(good.data(), uint32_t(good.size())));
  ASSERT_NE(e, nullptr);
  EXPECT_EQ(e->thumbnail.present, 1);
  EXPECT_EQ(good[e->thumbnail.offset], 0xFF);  // positions count from the buffer start
  EXPECT_EQ(good[e->thumbnail.offset + 1], 0xD8);
  for (auto mutate : std::vector<void (*)(Bytes&)>{
           [](Bytes& b) { b.resize(3); }, [](Bytes& b) { b[1] = 0xE0; },
           [](Bytes& b) { b[2] = 0, b[3] = 7; }, [](Bytes& b) { b.pop_back(); },
           [](Bytes& b) { b[9] = 1; }, [](Bytes& b) { b[10] = 'X'; }}) {
    Bytes b = good;
    mutate(b);
    EXPECT_EQ(VETAJ_CreatExifInfoUseExifBuffer(b.data(), uint32_t(b.size())), nullptr);
  }
}

// Reads a TIFF container held by a memory or file input; returns the result
// and the recorded jpeg_offset.
std::pair<int32_t, uint32_t> read_container(Bytes data, bool file = false) {
  vjtest::TempFile temp(data);
  DecInfo* object =
      file ? KOLVAVETA_CreateDecInfo(0, const_cast<char*>(temp.path().c_str()), 0, 0, 0)
           : KOLVAVETA_CreateDecInfo(1, data.data(), uint32_t(data.size()), 0, 0);
  StreamWindow w;
  EXPECT_TRUE(vj::window_open(&w, object->stream));
  ExifPtr scratch = fresh();
  const int32_t r = VETAJ_ReadTiffInfo(object, &w, 0, uint32_t(data.size()), scratch.get());
  const uint32_t offset = object->jpeg_offset;
  vj::window_close(&w);
  KOLVAVETA_DestroyDecInfo(object);
  return {r, offset};
}

TEST_P(ByteOrder, ContainerJpegIsFoundInIfd0AndInSubIfds) {
  const bool le = GetParam();
  TiffBuilder t(le);
  const int sub = t.ifd(), pad = t.blob(Bytes(40000, 0)), a = t.blob(jpeg({})),
            b = t.blob(jpeg({}));
  (void)pad;
  t.ref(0, 513, a, true).ref(0, 330, sub).ref(sub, 513, b, true).ref(sub, 330, sub);
  Bytes data = t.build();
  for (bool file : {false, true})
    EXPECT_EQ(read_container(data, file), std::make_pair(1, t.blob_at[b]));
  // Tag order decides: the IFD0 tag after the SubIFD wins.
  TiffBuilder u(le);
  const int sub2 = u.ifd(), c = u.blob(jpeg({})), d = u.blob(jpeg({}));
  u.ref(0, 330, sub2).ref(0, 513, c, true).ref(sub2, 330, 0).ref(sub2, 513, d, true);
  u.ifds[0].next = sub2;
  data = u.build();
  EXPECT_EQ(read_container(data), std::make_pair(1, u.blob_at[c]));
}

TEST(Exif, ContainerHeaderAndBoundsChecks) {
  TiffBuilder t(true);
  const int j = t.blob(jpeg({}));
  t.ref(0, 513, j, true);
  const Bytes good = t.build();
  EXPECT_EQ(read_container(good).first, 1);
  Bytes b = good;
  b[0] = 'M';
  EXPECT_EQ(read_container(b), std::make_pair(0, 0u));
  b = good;
  b[4] = uint8_t(b.size() - 1);  // one byte left where the entry count should be
  b[5] = uint8_t((b.size() - 1) >> 8);
  EXPECT_EQ(read_container(b), std::make_pair(201, 0u));
  b = good;
  b[8] = 0xFF;  // entry count past the container
  EXPECT_EQ(read_container(b), std::make_pair(1, 0u));
  b = good;
  b[8 + 2 + 8 + 2] = 0x7F;  // JPEG offset past the container
  EXPECT_EQ(read_container(b), std::make_pair(1, 0u));
  // Hundreds of SubIFD pointers back at IFD0 end after a bounded number of
  // IFDs instead of branching without end.
  TiffBuilder loop(true);
  for (int i = 0; i < 300; ++i) loop.ref(0, 330, 0);
  loop.ref(0, 513, loop.blob(jpeg({})), true);
  b = loop.build();
  EXPECT_EQ(read_container(b), std::make_pair(1, loop.blob_at[0]));
}

Bytes cut(Bytes b, size_t n) { return Bytes(b.begin(), b.begin() + n); }

// The frame size of an embedded stream, or 201 (sizes left alone).
TEST(Exif, ResolutionOfAnEmbeddedStream) {
  constexpr size_t kFrame = 2 + 69 + 2;  // first byte after the SOF code in jpeg({})
  Bytes precision12 = jpeg({});
  precision12[kFrame + 2] = 12;
  struct Case {
    Bytes data;
    int32_t width, height;  // 0: refused with 201
  } cases[] = {
      {jpeg({}, 300, 200), 300, 200},
      {jpeg({kJfif, segment(0xFE, {0xFF, 0xC0})}, 7, 9, 0xC2), 7, 9},
      {{0xFF, 0xD9, 0xFF, 0xD8}, 0, 0},
      {precision12, 0, 0},
      {{0xFF, 0xD8, 0xFF, 0xE0, 0x10, 0x00, 0, 0}, 0, 0},  // segment past the end
      {cut(jpeg({}), kFrame + 16), 0, 0},                   // short frame
      {cut(jpeg({}), kFrame + 11), 0, 0},                   // no scan
  };
  for (Case& c : cases) {
    int32_t w = 0, h = 0;
    EXPECT_EQ(VETAJ_GetJPEGResolution(c.data.data(), uint32_t(c.data.size()), &w, &h),
              c.width == 0 ? 201 : 200);
    EXPECT_EQ(std::make_pair(w, h), std::make_pair(c.width, c.height));
  }
}

// Truncation at every length and random byte flips (fixed seed) must never
// read outside the data; the sanitizer build checks it.
TEST(Exif, HostileInputSweep) {
  const Bytes tiff = full_block(true);
  const Bytes app1 = exif_app1(tiff);
  const Bytes stream = jpeg({kJfif, app1});
  TiffBuilder c(false);
  const int sub = c.ifd(), j = c.blob(jpeg({}));
  c.ref(0, 330, sub).ref(sub, 513, j, true).ref(sub, 330, 0);
  const Bytes container = c.build();
  auto run = [](const Bytes& t, const Bytes& a, const Bytes& s, const Bytes& k) {
    Bytes t2(t), a2(a), s2(s);  // exact-size copies
    read_exif(t2);
    ExifPtr(VETAJ_CreatExifInfoUseExifBuffer(a2.data(), uint32_t(a2.size())));
    if (!s2.empty()) {
      auto object = memory_object(s2);
      ExifPtr(VETAJ_CreatExifInfo(object.get()));
    }
    if (!k.empty()) read_container(k);
  };
  for (size_t n = 0; n <= stream.size(); ++n)
    run(cut(tiff, std::min(n, tiff.size())), cut(app1, std::min(n, app1.size())), cut(stream, n),
        cut(container, std::min(n, container.size())));
  std::mt19937 rng(20240611);
  for (int round = 0; round < 3000; ++round) {
    Bytes t = tiff, a = app1, s = stream, k = container;
    for (Bytes* b : {&t, &a, &s, &k}) {
      const int flips = 1 + int(rng() % 8);
      for (int f = 0; f < flips; ++f) (*b)[rng() % b->size()] = uint8_t(rng());
    }
    run(t, a, s, k);
  }
}

}  // namespace
