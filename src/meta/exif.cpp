// Exif and TIFF metadata readers.
//
// Exif data is read from a private copy of the APP1 segment's TIFF data, so
// every offset and count found in it is checked against that copy's length
// before anything is read. A TIFF container can be large and is read through
// the stream window instead.
#include "meta/exif.h"

#include <cstring>
#include <span>

#include "io/stream.h"

namespace {

// Tags with a meaning of their own (the stored fields are in the rule tables).
constexpr uint16_t kTagStripOffsets = 273;
constexpr uint16_t kTagStripByteCounts = 279;
constexpr uint16_t kTagSubIfds = 330;
constexpr uint16_t kTagJpegFormat = 513;
constexpr uint16_t kTagJpegFormatLength = 514;
constexpr uint16_t kTagExifIfd = 34665;
constexpr uint16_t kTagGpsIfd = 34853;

constexpr uint32_t kTiffMagic = 42;
constexpr uint32_t kEntrySize = 12;

// A TIFF container's SubIFD chains are followed this deep, and at most this
// many IFDs are read, so that IFDs pointing at each other cannot loop.
constexpr uint32_t kMaxSubIfdDepth = 4;
constexpr uint32_t kMaxTiffIfds = 64;

uint32_t get16(const uint8_t* p, bool le) { return le ? vj::le16(p) : vj::be16(p); }
uint32_t get32(const uint8_t* p, bool le) { return le ? vj::le32(p) : vj::be32(p); }

// TIFF data held in memory, with its byte order.
struct TiffData {
  const uint8_t* data;
  uint32_t length;
  bool le;
  uint32_t u16(uint32_t at) const { return get16(data + at, le); }
  uint32_t u32(uint32_t at) const { return get32(data + at, le); }
};

// Reads the byte-order mark and the value 42 of a TIFF header. Returns false
// when they are not there.
bool read_tiff_header(const uint8_t* h, bool* le) {
  if (h[0] == 'I' && h[1] == 'I') {
    *le = true;
  } else if (h[0] == 'M' && h[1] == 'M') {
    *le = false;
  } else {
    return false;
  }
  return get16(h + 2, *le) == kTiffMagic;
}

// Bytes of one value of a field type; 0 for the types that are not read.
uint32_t unit_size(uint32_t type) {
  switch (type) {
    case 1: case 2: case 6: case 7: return 1;
    case 3: case 8: return 2;
    case 4: case 9: case 11: return 4;
    case 5: case 10: case 12: return 8;
    default: return 0;
  }
}

// Decodes the 12 bytes of an entry standing at entry_position of data that is
// data_length bytes long (the caller has checked that the entry lies inside).
bool decode_entry(const uint8_t* e, uint32_t entry_position, uint32_t data_length, bool le,
                  ExifField* out) {
  const uint32_t type = get16(e + 2, le);
  const uint32_t count = get32(e + 4, le);
  const uint32_t unit = unit_size(type);
  // An entry without values has nothing to read.
  if (unit == 0 || count == 0) return false;
  const uint64_t bytes = uint64_t(unit) * count;
  uint32_t value;
  if (unit == 1 && count <= 4) {
    value = entry_position + 8;
  } else if (unit == 2 && count == 1) {
    value = get16(e + 8, le);
  } else if (unit == 4 && count == 1) {
    value = get32(e + 8, le);
  } else if (unit == 2 && count == 2) {
    return false;  // two SHORTs are not read
  } else {
    value = get32(e + 8, le);
    if (uint64_t(value) + bytes > data_length) return false;
  }
  out->tag = static_cast<uint16_t>(get16(e, le));
  out->type = static_cast<uint16_t>(type);
  out->count = count;
  out->byte_length = static_cast<uint32_t>(bytes);  // at most data_length here
  out->value = value;
  return true;
}

// How a field's values are stored in a record.
enum class Store : uint8_t {
  kValue,   // the entry's value (the number, or the offset of a list) as one word
  kValues,  // every value as a word; a rational takes two
  kBytes,   // the bytes into a fixed array
  kChars,   // the bytes into a fixed array whose last byte is then set to 0
  kString,  // an owned NUL-terminated copy (char*)
  kBlob,    // an owned copy followed by a NUL byte (uint8_t*), length in `aux`
};

constexpr uint16_t type_bit(uint16_t type) { return static_cast<uint16_t>(1u << type); }
constexpr uint16_t kByte = type_bit(kTiffByte);
constexpr uint16_t kAscii = type_bit(kTiffAscii);
constexpr uint16_t kShort = type_bit(kTiffShort);
constexpr uint16_t kLong = type_bit(kTiffLong);
constexpr uint16_t kRational = type_bit(kTiffRational);
constexpr uint16_t kUndefined = type_bit(kTiffUndefined);
constexpr uint16_t kSRational = type_bit(kTiffSRational);

// One stored field: the entry must have one of `types` and, unless `count` is
// 0, exactly that count. `at` and `aux` are byte offsets in the record.
struct FieldRule {
  uint16_t tag;
  uint16_t types;
  uint32_t count;
  Store store;
  uint16_t at;
  uint16_t aux;
};

#define VJ_AT(record, field) static_cast<uint16_t>(offsetof(record, field))

constexpr FieldRule kIfd0Rules[] = {
    {258, kShort, 3, Store::kValues, VJ_AT(ExifInfo, bits_per_sample), 0},
    {259, kShort, 1, Store::kValue, VJ_AT(ExifInfo, compression), 0},
    {271, kAscii, 0, Store::kString, VJ_AT(ExifInfo, make), 0},
    {272, kAscii, 0, Store::kString, VJ_AT(ExifInfo, model), 0},
    {274, kShort, 1, Store::kValue, VJ_AT(ExifInfo, orientation), 0},
    {282, kRational, 1, Store::kValues, VJ_AT(ExifInfo, x_resolution), 0},
    {283, kRational, 1, Store::kValues, VJ_AT(ExifInfo, y_resolution), 0},
    {296, kShort, 1, Store::kValue, VJ_AT(ExifInfo, resolution_unit), 0},
    {305, kAscii, 0, Store::kString, VJ_AT(ExifInfo, software), 0},
    {531, kShort, 1, Store::kValue, VJ_AT(ExifInfo, ycbcr_positioning), 0},
    {33432, kAscii, 0, Store::kString, VJ_AT(ExifInfo, rights_notice), 0},
};

constexpr FieldRule kExifRules[] = {
    {33434, kRational, 1, Store::kValues, VJ_AT(ExifInfo, exposure_time), 0},
    {36864, kUndefined, 4, Store::kBlob, VJ_AT(ExifInfo, exif_version), 0},
    {36867, kAscii, 20, Store::kString, VJ_AT(ExifInfo, date_time_original), 0},
    {36868, kAscii, 20, Store::kString, VJ_AT(ExifInfo, date_time_digitized), 0},
    {37385, kShort, 1, Store::kValue, VJ_AT(ExifInfo, flash), 0},
    {40961, kShort, 1, Store::kValue, VJ_AT(ExifInfo, color_space), 0},
    {40962, kShort | kLong, 1, Store::kValue, VJ_AT(ExifInfo, pixel_x_dimension), 0},
    {40963, kShort | kLong, 1, Store::kValue, VJ_AT(ExifInfo, pixel_y_dimension), 0},
    {41986, kShort, 1, Store::kValue, VJ_AT(ExifInfo, exposure_mode), 0},
    {41987, kShort, 1, Store::kValue, VJ_AT(ExifInfo, white_balance), 0},
    {41988, kRational, 1, Store::kValues, VJ_AT(ExifInfo, digital_zoom_ratio), 0},
    {37386, kRational, 1, Store::kValues, VJ_AT(ExifInfo, focal_length), 0},
    {34855, kShort, 0, Store::kValue, VJ_AT(ExifInfo, iso_speed_ratings), 0},
    {37380, kSRational, 1, Store::kValues, VJ_AT(ExifInfo, exposure_bias_value), 0},
    {33437, kRational, 1, Store::kValues, VJ_AT(ExifInfo, f_number), 0},
    {37377, kSRational, 1, Store::kValues, VJ_AT(ExifInfo, shutter_speed_value), 0},
};

constexpr FieldRule kGpsRules[] = {
    {0, kByte, 4, Store::kBytes, VJ_AT(GpsInfo, version_id), 0},
    {1, kAscii, 2, Store::kChars, VJ_AT(GpsInfo, latitude_ref), 0},
    {2, kRational, 3, Store::kValues, VJ_AT(GpsInfo, latitude), 0},
    {3, kAscii, 2, Store::kChars, VJ_AT(GpsInfo, longitude_ref), 0},
    {4, kRational, 3, Store::kValues, VJ_AT(GpsInfo, longitude), 0},
    {5, kByte, 1, Store::kBytes, VJ_AT(GpsInfo, altitude_ref), 0},
    {6, kRational, 1, Store::kValues, VJ_AT(GpsInfo, altitude), 0},
    {7, kRational, 3, Store::kValues, VJ_AT(GpsInfo, time_stamp), 0},
    {18, kAscii, 0, Store::kString, VJ_AT(GpsInfo, map_datum), 0},
    {27, kUndefined, 0, Store::kBlob, VJ_AT(GpsInfo, processing_method),
     VJ_AT(GpsInfo, processing_method_length)},
    {29, kAscii, 11, Store::kChars, VJ_AT(GpsInfo, date_stamp), 0},
};

constexpr FieldRule kThumbnailRules[] = {
    {256, kShort | kLong, 1, Store::kValue, VJ_AT(ThumbnailInfo, width), 0},
    {257, kShort | kLong, 1, Store::kValue, VJ_AT(ThumbnailInfo, height), 0},
    {259, kShort, 1, Store::kValue, VJ_AT(ThumbnailInfo, format), 0},
    {262, kShort, 1, Store::kValue, VJ_AT(ThumbnailInfo, colour), 0},
    {kTagStripOffsets, kShort | kLong, 1, Store::kValue, VJ_AT(ThumbnailInfo, offset), 0},
    {kTagStripByteCounts, kShort | kLong, 1, Store::kValue, VJ_AT(ThumbnailInfo, length), 0},
    {282, kRational, 1, Store::kValues, VJ_AT(ThumbnailInfo, x_resolution), 0},
    {283, kRational, 1, Store::kValues, VJ_AT(ThumbnailInfo, y_resolution), 0},
    {284, kShort, 1, Store::kValue, VJ_AT(ThumbnailInfo, planar), 0},
    {kTagJpegFormat, kLong, 1, Store::kValue, VJ_AT(ThumbnailInfo, offset), 0},
    {kTagJpegFormatLength, kLong, 1, Store::kValue, VJ_AT(ThumbnailInfo, length), 0},
    {4173, kShort, 1, Store::kValue, VJ_AT(ThumbnailInfo, vendor), 0},
};

#undef VJ_AT

enum class Outcome { kSkipped, kStored, kNoMemory };

template <class T>
T& slot(uint8_t* record, uint16_t at) {
  return *reinterpret_cast<T*>(record + at);
}

// Replaces an owned buffer of the record.
template <class T>
void replace_owned(T*& owned, uint8_t* copy) {
  vj::os_free(owned);
  owned = reinterpret_cast<T*>(copy);
}

// Stores the field by the first rule for its tag.
Outcome store_field(std::span<const FieldRule> rules, const TiffData& t, const ExifField& f,
                    void* record_start) {
  const FieldRule* rule = nullptr;
  for (const FieldRule& r : rules) {
    if (r.tag == f.tag) {
      rule = &r;
      break;
    }
  }
  if (rule == nullptr || (rule->types & type_bit(f.type)) == 0 ||
      (rule->count != 0 && f.count != rule->count))
    return Outcome::kSkipped;
  uint8_t* record = static_cast<uint8_t*>(record_start);
  // For the stores below that read bytes, f.value is their position, and
  // VETAJ_ReadExifField has checked that byte_length bytes lie there.
  const uint8_t* src = t.data + f.value;
  switch (rule->store) {
    case Store::kValue:
      slot<uint32_t>(record, rule->at) = f.value;
      break;
    case Store::kValues: {
      uint32_t* out = &slot<uint32_t>(record, rule->at);
      if (f.type == kTiffShort) {
        for (uint32_t i = 0; i < f.count; ++i) out[i] = t.u16(f.value + 2 * i);
      } else {
        for (uint32_t i = 0; i < f.byte_length / 4; ++i) out[i] = t.u32(f.value + 4 * i);
      }
      break;
    }
    case Store::kBytes:
    case Store::kChars: {
      uint8_t* out = &slot<uint8_t>(record, rule->at);
      KOLVAVETA_OsMemcpy(out, src, f.byte_length);
      if (rule->store == Store::kChars) out[f.byte_length - 1] = 0;
      break;
    }
    case Store::kString:
    case Store::kBlob: {
      // Strings need not be terminated in the data: one NUL byte is added.
      uint8_t* copy = static_cast<uint8_t*>(KOLVAVETA_OsMalloc(f.byte_length + 1));
      if (copy == nullptr) return Outcome::kNoMemory;
      KOLVAVETA_OsMemcpy(copy, src, f.byte_length);
      copy[f.byte_length] = 0;
      if (rule->store == Store::kString) {
        replace_owned(slot<char*>(record, rule->at), copy);
      } else {
        replace_owned(slot<uint8_t*>(record, rule->at), copy);
        if (rule->aux != 0) slot<uint32_t>(record, rule->aux) = f.byte_length;
      }
      break;
    }
  }
  return Outcome::kStored;
}

// Result of reading one IFD.
struct IfdResult {
  uint32_t link;  // the next-IFD link, 0 when absent or outside the data
  bool ended;     // reading ended early (allocation failure or a sub-IFD rule)
};

// Calls visit(field) for every usable entry of the IFD at `offset`; a visit
// returning false ends the walk. An IFD whose entries do not all lie inside
// the data is skipped.
template <class Visit>
IfdResult walk_ifd(const TiffData& t, uint32_t offset, Visit visit) {
  if (uint64_t(offset) + 2 > t.length) return {0, false};
  const uint32_t count = t.u16(offset);
  const uint64_t end = uint64_t(offset) + 2 + uint64_t(kEntrySize) * count;
  if (end > t.length) return {0, false};
  for (uint32_t i = 0; i < count; ++i) {
    ExifField f;
    if (VETAJ_ReadExifField(t.data, offset + 2 + kEntrySize * i, t.length, t.le, &f) == 0)
      continue;
    if (!visit(f)) return {0, true};
  }
  if (end + 4 > t.length) return {0, false};
  return {t.u32(static_cast<uint32_t>(end)), false};
}

// Reads an IFD whose fields are all stored by a rule table.
IfdResult read_plain_ifd(const TiffData& t, uint32_t offset, std::span<const FieldRule> rules,
                         void* record) {
  return walk_ifd(t, offset, [&](const ExifField& f) {
    return store_field(rules, t, f, record) != Outcome::kNoMemory;
  });
}

IfdResult read_ifd0(const TiffData& t, uint32_t offset, ExifInfo* exif) {
  // Each sub-IFD is read once, however many pointers to it IFD0 holds.
  bool exif_read = false;
  bool gps_read = false;
  return walk_ifd(t, offset, [&](const ExifField& f) {
    if (f.tag != kTagExifIfd && f.tag != kTagGpsIfd)
      return store_field(kIfd0Rules, t, f, exif) != Outcome::kNoMemory;
    if (f.type != kTiffLong || f.count != 1) return true;
    IfdResult sub;
    if (f.tag == kTagExifIfd) {
      if (exif_read) return true;
      exif_read = true;
      sub = read_plain_ifd(t, f.value, kExifRules, exif);
    } else {
      if (gps_read) return true;
      gps_read = true;
      if (exif->gps == nullptr) exif->gps = vj::alloc_zeroed<GpsInfo>();
      if (exif->gps == nullptr) return false;
      sub = read_plain_ifd(t, f.value, kGpsRules, exif->gps);
    }
    // A sub-IFD that links onwards ends the reading of IFD0, so that no
    // thumbnail IFD is taken from such a block.
    return !sub.ended && sub.link == 0;
  });
}

// Reads IFD1 into a thumbnail record. Offsets become input positions by
// adding tiff_position.
void read_thumbnail_ifd(const TiffData& t, uint32_t offset, uint32_t tiff_position,
                        ThumbnailInfo* th) {
  bool jpeg = false;
  uint32_t jpeg_at = 0;  // position of the JPEG thumbnail in the TIFF data
  (void)walk_ifd(t, offset, [&](const ExifField& f) {
    if (store_field(kThumbnailRules, t, f, th) != Outcome::kStored) return true;
    switch (f.tag) {
      case kTagStripOffsets:
      case kTagJpegFormat: {
        const uint64_t position = uint64_t(tiff_position) + f.value;
        jpeg = f.tag == kTagJpegFormat && position <= UINT32_MAX;
        jpeg_at = f.value;
        th->offset = position <= UINT32_MAX ? static_cast<uint32_t>(position) : 0;
        break;
      }
      case kTagStripByteCounts:
        th->format = kThumbStrips;
        break;
      case kTagJpegFormatLength:
        th->format = kThumbJpeg;
        break;
      default:
        break;
    }
    return true;
  });
  // A JPEG thumbnail's size is that of its own frame header.
  if (jpeg && jpeg_at < t.length) {
    uint32_t available = t.length - jpeg_at;
    if (th->length != 0 && th->length < available) available = th->length;
    int32_t width = 0;
    int32_t height = 0;
    if (VETAJ_GetJPEGResolution(t.data + jpeg_at, available, &width, &height) == vj::kStatusOk) {
      th->width = width;
      th->height = height;
    }
  }
}

// Copies `count` bytes from the window, refilling it as needed.
bool window_read(StreamWindow* w, uint8_t* destination, uint32_t count) {
  while (count > 0) {
    if (w->remaining == 0 && VETAJ_CheckBuffer(w, 1) == 0) return false;
    const uint32_t take = count < w->remaining ? count : w->remaining;
    KOLVAVETA_OsMemcpy(destination, w->window + w->index, take);
    w->index += take;
    w->remaining -= take;
    destination += take;
    count -= take;
  }
  return true;
}

// A big-endian 16-bit value from the window, or -1 at the end of input.
int32_t window_be16(StreamWindow* w) {
  const int32_t high = vj::window_byte(w);
  const int32_t low = vj::window_byte(w);
  if (high < 0 || low < 0) return -1;
  return (high << 8) | low;
}

bool skipped_by_length(int32_t code) {
  switch (code) {
    case 0xC0: case 0xC2: case 0xC4: case 0xDA: case 0xDB: case 0xDC: case 0xDD: case 0xFE:
      return true;
    default:
      return code >= 0xE0 && code <= 0xEF;
  }
}

// Scans the JPEG stream at the window for the Exif APP1 segment and leaves
// the window at its TIFF header. Returns the TIFF data length through
// *tiff_length, or false when there is no usable Exif segment.
bool find_exif_segment(StreamWindow* w, uint32_t* tiff_length) {
  if (vj::window_byte(w) != 0xFF || vj::window_byte(w) != 0xD8) return false;
  for (;;) {
    const int32_t b = vj::window_byte(w);
    if (b < 0) return false;
    if (b != 0xFF) continue;
    int32_t code = vj::window_byte(w);
    while (code == 0xFF) code = vj::window_byte(w);  // fill bytes
    if (code < 0) return false;
    if (code == 0xE1) {
      const int32_t length = window_be16(w);
      // At least the "Exif" 0 0 prefix, and no more than the input holds.
      if (length < 8) return false;
      const uint32_t payload = static_cast<uint32_t>(length) - 2;
      if (w->size != 0) {
        const uint32_t at = vj::window_tell(w);
        const uint32_t left = at < w->size ? w->size - at : 0;
        if (payload >= left) return false;
      }
      uint8_t prefix[6];
      if (!window_read(w, prefix, sizeof prefix)) return false;
      if (std::memcmp(prefix, "Exif\0\0", sizeof prefix) == 0) {
        *tiff_length = payload - 6;
        return true;
      }
      if (!vj::window_skip(w, payload - 6)) return false;
    } else if (skipped_by_length(code)) {
      const int32_t length = window_be16(w);
      if (length < 2) return false;
      if (!vj::window_skip(w, static_cast<uint32_t>(length) - 2)) return false;
    }
  }
}

// Gives the thumbnail record its own copy of the thumbnail data, taken from
// the TIFF data (the Exif segment holds its thumbnail). Clears the present
// flag when the data lies elsewhere or cannot be copied.
void copy_thumbnail(const uint8_t* tiff, uint32_t tiff_position, uint32_t tiff_length,
                    ThumbnailInfo* th) {
  const uint32_t at = th->offset - tiff_position;
  uint8_t* copy = nullptr;
  if (th->offset >= tiff_position && uint64_t(at) + th->length <= tiff_length)
    copy = static_cast<uint8_t*>(KOLVAVETA_OsMalloc(th->length));
  if (copy == nullptr) {
    th->present = 0;
    return;
  }
  KOLVAVETA_OsMemcpy(copy, tiff + at, th->length);
  replace_owned(th->data, copy);
}

}  // namespace

int32_t VETAJ_ReadExifField(const uint8_t* data, uint32_t entry_position, uint32_t data_length,
                            int32_t little_endian, ExifField* out) {
  if (data == nullptr || out == nullptr || uint64_t(entry_position) + kEntrySize > data_length)
    return 0;
  return decode_entry(data + entry_position, entry_position, data_length, little_endian != 0, out)
             ? 1
             : 0;
}

uint32_t VETAJ_Read0thIFDInfo(const uint8_t* data, uint32_t ifd_offset, uint32_t length,
                              int32_t little_endian, ExifInfo* exif) {
  if (data == nullptr || exif == nullptr) return 0;
  const IfdResult r = read_ifd0(TiffData{data, length, little_endian != 0}, ifd_offset, exif);
  return r.ended ? 0 : r.link;
}

uint32_t VETAJ_ReadExifIFDInfo(const uint8_t* data, uint32_t ifd_offset, uint32_t length,
                               int32_t little_endian, ExifInfo* exif) {
  if (data == nullptr || exif == nullptr) return 0;
  const IfdResult r =
      read_plain_ifd(TiffData{data, length, little_endian != 0}, ifd_offset, kExifRules, exif);
  return r.ended ? 0 : r.link;
}

uint32_t VETAJ_ReadGpsIFDInfo(const uint8_t* data, uint32_t ifd_offset, uint32_t length,
                              int32_t little_endian, GpsInfo* gps) {
  if (data == nullptr || gps == nullptr) return 0;
  const IfdResult r =
      read_plain_ifd(TiffData{data, length, little_endian != 0}, ifd_offset, kGpsRules, gps);
  return r.ended ? 0 : r.link;
}

int32_t VETAJ_ReadExifInfo(const uint8_t* tiff_data, uint32_t tiff_position, uint32_t length,
                           ExifInfo* exif) {
  if (tiff_data == nullptr || exif == nullptr || length < 8) return 0;
  bool le = false;
  if (!read_tiff_header(tiff_data, &le)) return 0;
  const TiffData t{tiff_data, length, le};
  const uint32_t ifd0 = t.u32(4);
  if (ifd0 >= length) return 0;
  const IfdResult r = read_ifd0(t, ifd0, exif);
  const uint32_t ifd1 = r.ended ? 0 : r.link;
  if (ifd1 == 0 || uint64_t(ifd1) + 2 > length) return 1;
  ThumbnailInfo th{};
  read_thumbnail_ifd(t, ifd1, tiff_position, &th);
  th.present = th.length != 0 ? 1 : 0;
  vj::os_free(exif->thumbnail.data);
  exif->thumbnail = th;
  return 1;
}

int32_t VETAJ_GetExifInfo(StreamWindow* window, ExifInfo* exif) {
  if (window == nullptr || exif == nullptr) return 0;
  auto leave_empty = vj::on_exit([window] { vj::window_empty(window); });
  uint32_t tiff_length = 0;
  if (!find_exif_segment(window, &tiff_length) || tiff_length < 8) return 0;
  const uint32_t tiff_position = vj::window_tell(window);
  uint8_t* tiff = static_cast<uint8_t*>(KOLVAVETA_OsMalloc(tiff_length));
  if (tiff == nullptr) return 0;
  auto free_tiff = vj::on_exit([&tiff] { vj::os_free(tiff); });
  if (!window_read(window, tiff, tiff_length)) return 0;
  const int32_t result = VETAJ_ReadExifInfo(tiff, tiff_position, tiff_length, exif);
  if (exif->thumbnail.present != 0)
    copy_thumbnail(tiff, tiff_position, tiff_length, &exif->thumbnail);
  return result;
}

int32_t VETAJ_GetTiffInfo(StreamWindow* window, ExifInfo* exif) {
  return VETAJ_GetExifInfo(window, exif);
}

ExifInfo* VETAJ_CreatExifInfo(DecInfo* object) {
  if (object == nullptr || object->stream == nullptr) return nullptr;
  StreamWindow window;
  if (!vj::window_open(&window, object->stream)) return nullptr;
  auto close = vj::on_exit([&window] { vj::window_close(&window); });
  if (!vj::window_seek(&window, object->jpeg_offset)) return nullptr;
  ExifInfo* exif = vj::alloc_zeroed<ExifInfo>();
  if (exif == nullptr) return nullptr;
  if (VETAJ_GetExifInfo(&window, exif) == 0) {
    VETAJ_DestroyExifInfo(exif);
    return nullptr;
  }
  return exif;
}

ExifInfo* VETAJ_CreatExifInfoUseExifBuffer(const uint8_t* buffer, uint32_t length) {
  if (buffer == nullptr || length < 4 || buffer[0] != 0xFF || buffer[1] != 0xE1) return nullptr;
  const uint32_t segment_length = vj::be16(buffer + 2);
  if (segment_length < 8 || segment_length + 1 >= length) return nullptr;
  if (std::memcmp(buffer + 4, "Exif\0\0", 6) != 0) return nullptr;
  ExifInfo* exif = vj::alloc_zeroed<ExifInfo>();
  if (exif == nullptr) return nullptr;
  constexpr uint32_t kTiffStart = 10;
  if (VETAJ_ReadExifInfo(buffer + kTiffStart, kTiffStart, segment_length - 8, exif) == 0) {
    VETAJ_DestroyExifInfo(exif);
    return nullptr;
  }
  return exif;
}

int32_t VETAJ_ReadTiffInfo(DecInfo* object, StreamWindow* window, uint32_t /*ignored*/,
                           uint32_t length, ExifInfo* /*exif*/) {
  if (object == nullptr || window == nullptr || length < 8) return 0;
  if (VETAJ_CheckBuffer(window, 8) == 0) return 0;
  const uint8_t* header = window->window + window->index;
  bool le = false;
  if (!read_tiff_header(header, &le)) return 0;
  const uint32_t ifd0 = get32(header + 4, le);
  if (ifd0 >= length) return 0;
  TiffReader reader{object, window, vj::window_tell(window), length, le, kMaxTiffIfds};
  return VETAJ_ReadTiffIFDInfo(&reader, ifd0, 0);
}

int32_t VETAJ_ReadTiffIFDInfo(TiffReader* r, uint32_t ifd_offset, uint32_t depth) {
  if (r == nullptr || r->ifds_left == 0) return 1;
  --r->ifds_left;
  StreamWindow* w = r->window;
  // Absolute input position of a place in the container, or false.
  auto position_of = [r](uint32_t offset, uint32_t need, uint32_t* out) {
    if (uint64_t(offset) + need > r->length || uint64_t(r->base) + offset > INT32_MAX)
      return false;
    *out = r->base + offset;
    return true;
  };
  uint32_t at = 0;
  if (!position_of(ifd_offset, 2, &at) || !vj::window_seek(w, at) || VETAJ_CheckBuffer(w, 2) == 0)
    return vj::kStatusFail;
  const uint32_t count = get16(w->window + w->index, r->little_endian);
  w->index += 2;
  w->remaining -= 2;
  if (uint64_t(ifd_offset) + 2 + uint64_t(kEntrySize) * count > r->length) return 1;
  for (uint32_t i = 0; i < count; ++i) {
    uint8_t e[kEntrySize];
    if (!window_read(w, e, kEntrySize)) return vj::kStatusFail;
    // SubIFDs may also be given the IFD type, which reads like LONG.
    if (get16(e, r->little_endian) == kTagSubIfds && get16(e + 2, r->little_endian) == kTiffIfd) {
      e[2] = r->little_endian ? kTiffLong : 0;
      e[3] = r->little_endian ? 0 : kTiffLong;
    }
    ExifField f;
    if (!decode_entry(e, ifd_offset + 2 + kEntrySize * i, r->length, r->little_endian, &f))
      continue;
    if (f.tag == kTagJpegFormat && f.type == kTiffLong && f.count == 1) {
      if (position_of(f.value, 2, &at)) r->object->jpeg_offset = at;
    } else if (f.tag == kTagSubIfds && f.type == kTiffLong && depth < kMaxSubIfdDepth) {
      // The first SubIFD is read here, where the tag stands, and reading
      // then goes on after this entry.
      const uint32_t resume = vj::window_tell(w);
      uint32_t first = f.value;
      bool found = true;
      if (f.count > 1) {
        found = position_of(f.value, 4, &at) && vj::window_seek(w, at) &&
                VETAJ_CheckBuffer(w, 4) != 0;
        if (found) first = get32(w->window + w->index, r->little_endian);
      }
      if (found) (void)VETAJ_ReadTiffIFDInfo(r, first, depth + 1);
      if (!vj::window_seek(w, resume)) return vj::kStatusFail;
    }
  }
  return 1;
}

int32_t VETAJ_GetJPEGResolution(const uint8_t* data, uint32_t length, int32_t* width,
                                int32_t* height) {
  if (data == nullptr || length < 2 || data[0] != 0xFF || data[1] != 0xD8) return vj::kStatusFail;
  bool have_frame = false;
  uint32_t frame_width = 0;
  uint32_t frame_height = 0;
  uint32_t i = 2;
  while (i < length) {
    if (data[i++] != 0xFF) continue;
    while (i < length && data[i] == 0xFF) ++i;  // fill bytes
    if (i >= length) break;
    const uint8_t code = data[i++];
    if (code == 0xDA) {
      // A scan without a frame header before it has no size to report.
      if (!have_frame) return vj::kStatusFail;
      if (width != nullptr) *width = static_cast<int32_t>(frame_width);
      if (height != nullptr) *height = static_cast<int32_t>(frame_height);
      return vj::kStatusOk;
    }
    const bool frame = code == 0xC0 || code == 0xC2;
    if (!frame && !skipped_by_length(code)) continue;
    if (length - i < (frame ? 17u : 2u)) return vj::kStatusFail;
    const uint32_t segment = vj::be16(data + i);
    if (segment < 2) return vj::kStatusFail;
    if (frame) {
      if (data[i + 2] != 8) return vj::kStatusFail;
      frame_height = vj::be16(data + i + 3);
      frame_width = vj::be16(data + i + 5);
      have_frame = true;
    }
    if (segment > length - i) return vj::kStatusFail;
    i += segment;
  }
  return vj::kStatusFail;
}

int32_t VETAJ_DecodeUncompressThumbnail(DecInfo* /*object*/, StreamWindow* /*window*/,
                                        uint32_t /*length*/, uint8_t* /*output*/) {
  return 1;
}

int32_t VETAJ_DestroyExifInfo(ExifInfo* exif) {
  if (exif == nullptr) return 0;
  vj::os_free(exif->make);
  vj::os_free(exif->model);
  vj::os_free(exif->software);
  vj::os_free(exif->rights_notice);
  vj::os_free(exif->exif_version);
  vj::os_free(exif->date_time_original);
  vj::os_free(exif->date_time_digitized);
  vj::os_free(exif->thumbnail.data);
  if (exif->gps != nullptr) {
    vj::os_free(exif->gps->map_datum);
    vj::os_free(exif->gps->processing_method);
    vj::os_free(exif->gps);
  }
  KOLVAVETA_OsFree(exif);
  return 1;
}
