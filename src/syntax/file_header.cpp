// The file-header pre-scan: picture size, progressive flag and the location
// of an embedded thumbnail (JFIF, JFXX, Exif IFD1 or an image-resource block).
#include <cstring>

#include "syntax/marker_io.h"
#include "syntax/markers.h"

namespace {

using vj::kStatusFail;

// Bounds-checked reads from a TIFF structure held in memory.
struct TiffView {
  const uint8_t* data;
  uint32_t size;
  bool big_endian;

  bool has(uint32_t at, uint32_t n) const { return at <= size && size - at >= n; }
  bool u16(uint32_t at, uint32_t* v) const {
    if (!has(at, 2)) return false;
    *v = big_endian ? vj::be16(data + at) : vj::le16(data + at);
    return true;
  }
  bool u32(uint32_t at, uint32_t* v) const {
    if (!has(at, 4)) return false;
    *v = big_endian ? vj::be32(data + at) : vj::le32(data + at);
    return true;
  }
};

// Bytes of one value of each TIFF field type 1..12.
constexpr uint8_t kTiffTypeSize[13] = {0, 1, 1, 2, 4, 8, 1, 1, 2, 4, 8, 4, 8};
constexpr uint32_t kIfdEntry = 12;

// Exif IFD1 tags that locate the thumbnail.
constexpr uint32_t kTagWidth = 0x100;
constexpr uint32_t kTagHeight = 0x101;
constexpr uint32_t kTagCompression = 0x103;
constexpr uint32_t kTagPhotometric = 0x106;
constexpr uint32_t kTagStripOffsets = 0x111;
constexpr uint32_t kTagStripByteCounts = 0x117;
constexpr uint32_t kTagPlanar = 0x11C;
constexpr uint32_t kTagJpegOffset = 0x201;
constexpr uint32_t kTagJpegLength = 0x202;
constexpr uint32_t kTagVendor = 0x104D;

constexpr int32_t kColourRgb = 2;

// APP0 "JFIF": an uncompressed RGB thumbnail after the 14 header bytes.
bool jfif_thumbnail(const uint8_t* p, uint32_t n, uint32_t at, ThumbnailInfo* t) {
  constexpr uint32_t kHeader = 14;  // "JFIF\0" and nine bytes of fields
  if (n < kHeader) return false;
  const uint8_t* fields = p + 5;
  const bool v1 = fields[0] == 1;
  const uint32_t tw = v1 ? fields[7] : fields[6];
  const uint32_t th = v1 ? fields[8] : fields[7];
  if (tw == 0 || th == 0 || n - kHeader != 3 * tw * th) return false;
  t->present = 1;
  t->width = static_cast<int32_t>(tw);
  t->height = static_cast<int32_t>(th);
  t->format = kThumbRawRgb;
  t->colour = kColourRgb;
  t->length = n - kHeader;
  t->offset = at + kHeader;
  return true;
}

// APP0 "JFXX": extension code 0x10 holds a JPEG thumbnail; 0x11 (one byte per
// pixel after a 768-byte palette) and 0x13 (three bytes per pixel) hold the
// thumbnail's width and height in the two bytes after the code.
bool jfxx_thumbnail(const uint8_t* p, uint32_t n, uint32_t at, ThumbnailInfo* t) {
  constexpr uint32_t kHeader = 6;  // "JFXX\0" and the extension code
  constexpr uint32_t kPalette = 768;
  if (n <= kHeader) return false;
  const uint32_t code = p[5];
  const uint32_t rest = n - kHeader;
  if (code == 0x10) {
    if (rest == 0) return false;
    t->present = 1;
    t->format = kThumbJpeg;
    t->length = rest;
    t->offset = at + kHeader;
    return true;
  }
  if (code != 0x11 && code != 0x13) return false;
  if (rest < 2) return false;
  const uint32_t tw = p[kHeader];
  const uint32_t th = p[kHeader + 1];
  const uint32_t data = rest - 2;  // palette (0x11) and pixels
  const uint32_t pixels = code == 0x11 ? (data >= kPalette ? data - kPalette : ~0u) : data;
  const uint32_t expected = tw * th * (code == 0x13 ? 3 : 1);
  if (tw == 0 || th == 0 || pixels != expected) return false;
  t->present = 1;
  t->width = static_cast<int32_t>(tw);
  t->height = static_cast<int32_t>(th);
  t->format = kThumbRawRgb;
  t->colour = kColourRgb;
  t->length = data;
  t->offset = at + kHeader + 2;
  return true;
}

// APP1 "Exif": the thumbnail fields of IFD1.
bool exif_thumbnail(const uint8_t* p, uint32_t n, uint32_t at, ThumbnailInfo* t) {
  constexpr uint32_t kHeader = 6;  // "Exif\0\0"
  if (n < kHeader + 8) return false;
  TiffView tiff{p + kHeader, n - kHeader, false};
  const uint32_t tiff_at = at + kHeader;  // absolute position of the TIFF header
  if (tiff.data[0] == 'M' && tiff.data[1] == 'M') {
    tiff.big_endian = true;
  } else if (tiff.data[0] != 'I' || tiff.data[1] != 'I') {
    return false;
  }
  uint32_t magic = 0, ifd0 = 0, count = 0, ifd1 = 0;
  if (!tiff.u16(2, &magic) || magic != 42 || !tiff.u32(4, &ifd0)) return false;
  if (!tiff.u16(ifd0, &count)) return false;
  const uint64_t next_at = uint64_t(ifd0) + 2 + uint64_t(count) * kIfdEntry;
  if (next_at > tiff.size || !tiff.u32(static_cast<uint32_t>(next_at), &ifd1)) return false;
  if (ifd1 <= 1 || !tiff.u16(ifd1, &count)) return false;

  // Location and length must come from this IFD, not from an earlier find.
  bool have_offset = false, have_length = false;
  for (uint32_t i = 0; i < count; ++i) {
    const uint64_t entry64 = uint64_t(ifd1) + 2 + uint64_t(i) * kIfdEntry;
    if (entry64 + kIfdEntry > tiff.size) return false;
    const uint32_t entry = static_cast<uint32_t>(entry64);
    uint32_t tag = 0, type = 0, value = 0;
    tiff.u16(entry, &tag);
    tiff.u16(entry + 2, &type);
    if (type < 1 || type > 12) return false;
    switch (kTiffTypeSize[type]) {
      case 1:
        value = tiff.data[entry + 8];
        break;
      case 2:
        tiff.u16(entry + 8, &value);
        break;
      case 4:
        tiff.u32(entry + 8, &value);
        break;
      default:
        continue;  // eight-byte values do not fit the entry: not a usable field
    }
    switch (tag) {
      case kTagWidth:
        t->width = static_cast<int32_t>(value);
        break;
      case kTagHeight:
        t->height = static_cast<int32_t>(value);
        break;
      case kTagCompression:
        t->format = static_cast<int32_t>(value);
        break;
      case kTagPhotometric:
        t->colour = static_cast<int32_t>(value);
        break;
      case kTagStripOffsets:
      case kTagJpegOffset: {
        const uint64_t offset = uint64_t(value) + tiff_at;
        if (offset > UINT32_MAX) return false;
        t->offset = static_cast<uint32_t>(offset);
        have_offset = true;
        break;
      }
      case kTagStripByteCounts:
        t->length = value;
        t->format = kThumbStrips;
        have_length = true;
        break;
      case kTagPlanar:
        t->planar = static_cast<int32_t>(value);
        break;
      case kTagJpegLength:
        t->length = value;
        t->format = kThumbJpeg;
        have_length = true;
        break;
      case kTagVendor:
        t->vendor = static_cast<int32_t>(value);
        break;
      default:
        break;
    }
  }
  if (!have_offset || !have_length || t->length == 0) return false;
  t->present = 1;
  return true;
}

// APP13: "8BIM" image resources after the 14-byte signature; resource 0x040C
// is the thumbnail.
bool resource_thumbnail(const uint8_t* p, uint32_t n, uint32_t at, ThumbnailInfo* t) {
  constexpr uint32_t kSignature = 14;  // "Photoshop 3.0\0"
  constexpr uint32_t kThumbResource = 0x040C;
  constexpr uint32_t kThumbHeader = 28;
  uint64_t pos = kSignature;
  while (pos + 4 <= n && std::memcmp(p + pos, "8BIM", 4) == 0) {
    pos += 4;
    if (pos + 3 > n) return false;
    const uint32_t id = vj::be16(p + pos);
    pos += 2;
    pos += (1u + p[pos] + 1u) & ~1u;  // Pascal name, padded to even length
    if (pos + 4 > n) return false;
    const uint32_t size = vj::be32(p + pos);
    pos += 4;
    if (size > n - pos) return false;
    if (id == kThumbResource) {
      if (size < kThumbHeader) return false;
      const uint8_t* h = p + pos;
      const uint32_t length = vj::be32(h + 20);
      if (length == 0 || length > size - kThumbHeader) return false;
      const bool raw = vj::be32(h) == 0;
      t->present = 1;
      t->format = raw ? kThumbRawRgb : kThumbJpegResource;
      if (raw) t->colour = kColourRgb;
      t->width = static_cast<int32_t>(vj::be32(h + 4));
      t->height = static_cast<int32_t>(vj::be32(h + 8));
      t->length = length;
      t->offset = at + static_cast<uint32_t>(pos) + kThumbHeader;
      return true;
    }
    pos += (uint64_t(size) + 1) & ~uint64_t(1);
  }
  return false;
}

using ThumbnailRule = bool (*)(const uint8_t*, uint32_t, uint32_t, ThumbnailInfo*);

// Chooses the thumbnail rule for an APP0, APP1 or APP13 segment from its
// first bytes, or null when the segment holds no thumbnail to look at.
ThumbnailRule choose_rule(uint32_t code, const uint8_t* p, uint32_t avail, bool present) {
  if (code == vj::kMarkerApp0 && avail >= 5) {
    if (std::memcmp(p, "JFIF\0", 5) == 0) return jfif_thumbnail;
    if (std::memcmp(p, "JFXX\0", 5) == 0) return jfxx_thumbnail;
  }
  if (code == vj::kMarkerApp1 && avail >= 6 && std::memcmp(p, "Exif\0\0", 6) == 0)
    return exif_thumbnail;
  if (code == vj::kMarkerApp13 && !present) return resource_thumbnail;
  return nullptr;
}

// An APP0, APP1 or APP13 segment: applies the thumbnail rules to it. A
// thumbnail is accepted only when its data lies inside the input; it then
// replaces the working record and the caller's copy. False when the segment
// is malformed or the input ends.
bool read_thumbnail_segment(StreamWindow* w, uint32_t code, ThumbnailInfo* work,
                            ThumbnailInfo* caller) {
  uint32_t length = 0;
  if (!vj::read_be16(w, &length) || length < 2) return false;
  const uint32_t payload = length - 2;
  const uint32_t at = vj::window_tell(w);
  if (w->size != 0 && (at >= w->size || payload >= w->size - at)) return false;

  constexpr uint32_t kPeek = 6;
  const uint32_t peek = payload < kPeek ? payload : kPeek;
  if (peek > 0 && VETAJ_CheckBuffer(w, peek) == 0) return false;
  const ThumbnailRule rule =
      choose_rule(code, w->window + w->index, peek, work->present != 0);
  if (rule == nullptr) return vj::skip_bytes(w, payload);

  // The segment may be larger than the window: read it whole.
  auto* data = vj::alloc_zeroed<uint8_t>(payload);
  if (data == nullptr) return false;
  auto release = vj::on_exit([&] { vj::os_free(data); });
  if (!vj::read_bytes(w, data, payload)) return false;
  ThumbnailInfo found = *work;
  if (rule(data, payload, at, &found) &&
      (w->size == 0 || uint64_t(found.offset) + found.length <= w->size)) {
    *work = found;
    *caller = found;
  }
  return true;
}

}  // namespace

int32_t VETAJ_ParseFileHeader(StreamWindow* w, int32_t mode, FileHeaderInfo* header) {
  if (w == nullptr || header == nullptr) return kStatusFail;
  ThumbnailInfo work = header->thumbnail;
  bool have_frame = false;
  return vj::walk_markers(w, mode, [&](uint32_t code) {
    switch (code) {
      case vj::kMarkerSof2:
        header->progressive = 1;
        [[fallthrough]];
      case vj::kMarkerSof0:
        // A repeated frame header is read again.
        have_frame = true;
        return vj::read_frame_size_into(w, &header->width, &header->height) ? vj::Step::kNext
                                                                            : vj::Step::kFail;
      case vj::kMarkerSos:
        // Without a baseline or progressive frame there is no picture to size.
        return have_frame ? vj::Step::kDone : vj::Step::kFail;
      case vj::kMarkerApp0:
      case vj::kMarkerApp1:
      case vj::kMarkerApp13:
        return read_thumbnail_segment(w, code, &work, &header->thumbnail) ? vj::Step::kNext
                                                                          : vj::Step::kFail;
      default:
        return vj::Step::kPass;
    }
  });
}
