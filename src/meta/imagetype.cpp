// Image type detection and the headers of the other picture formats.
//
// Every length, count and offset read from the input is checked against
// the input size before it is used, and every byte is read at most once, so
// a hostile file costs time in proportion to its size and never makes a
// reader leave the input.
#include "meta/imagetype.h"

#include <climits>

#include "meta/exif.h"
#include "syntax/scanners.h"

namespace {

constexpr uint8_t kPngSignature[8] = {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A};

// Bytes of the PNG header read: signature, IHDR length and type, width,
// height, bit depth, colour type, compression, filter, interlace method.
constexpr uint32_t kPngHeader = 29;
// BMP file header (14 bytes) and the part of the bitmap header read.
constexpr uint32_t kBmpHeader = 26;
// GIF signature, version and logical screen descriptor.
constexpr uint32_t kGifHeader = 13;
// Fields of a GIF image descriptor after its separator.
constexpr uint32_t kGifImageDescriptor = 9;
// WBMP: the type and fixed-header bytes, and the position by which both
// dimensions must have ended.
constexpr uint32_t kWbmpFirstInteger = 2;
constexpr uint32_t kWbmpIntegerEnd = 20;

// GIF block introducers and extension labels.
constexpr int32_t kGifImage = 0x2C;
constexpr int32_t kGifTrailer = 0x3B;
constexpr int32_t kGifExtension = 0x21;
constexpr int32_t kGifGraphicControl = 0xF9;
constexpr int32_t kGifPlainText = 0x01;
constexpr int32_t kGifComment = 0xFE;
constexpr int32_t kGifApplication = 0xFF;

// The `n` bytes at the window's position, brought into the window, or null
// when the input ends first.
const uint8_t* peek(StreamWindow* w, uint32_t n) {
  if (VETAJ_CheckBuffer(w, n) == 0) return nullptr;
  return w->window + w->index;
}

bool starts_with(const uint8_t* p, const uint8_t* signature, uint32_t n) {
  for (uint32_t i = 0; i < n; ++i)
    if (p[i] != signature[i]) return false;
  return true;
}

bool is_gif(const uint8_t* b) { return b[0] == 'G' && b[1] == 'I' && b[2] == 'F'; }
bool is_jpeg(const uint8_t* b) { return b[0] == 0xFF && b[1] == 0xD8; }
bool is_tiff(const uint8_t* b) {
  return (b[0] == 'M' && b[1] == 'M') || (b[0] == 'I' && b[1] == 'I');
}
bool is_wbmp(const uint8_t* b) { return b[0] == 0 && b[1] < 0x80; }
bool is_bmp(const uint8_t* b) { return b[0] == 'B' || b[1] == 'M'; }

// The signature test on the first 8 bytes.
int32_t type_of(const uint8_t* b) {
  if (is_gif(b)) return KOLVAVETA_IMAGE_GIF;
  if (starts_with(b, kPngSignature, sizeof(kPngSignature))) return KOLVAVETA_IMAGE_PNG;
  if (is_jpeg(b)) return KOLVAVETA_IMAGE_JPEG;
  if (b[0] == 'B') return KOLVAVETA_IMAGE_BMP;
  if (is_wbmp(b)) return KOLVAVETA_IMAGE_WBMP;
  if (b[1] == 'M') return KOLVAVETA_IMAGE_BMP;
  return KOLVAVETA_IMAGE_UNKNOWN;
}

// Returns 0 after marking the header unreadable.
int32_t unreadable() {
  vj::set_error(KOLVAVETA_ERR_NOT_IMAGE);
  return KOLVAVETA_IMAGE_UNKNOWN;
}

void set_size(DecInfo* o, uint32_t width, uint32_t height) {
  o->image_width = static_cast<int32_t>(width);
  o->image_height = static_cast<int32_t>(height);
}

void set_image_count(JpegInfo* info, int32_t count) {
  if (info != nullptr) info->image_count = count;
}

// Skips `count` bytes of the input. False when they run past its end: the
// seek of a file input would succeed there, so the size decides.
bool skip_within(StreamWindow* w, uint32_t count) {
  if (uint64_t(vj::window_tell(w)) + count > w->size) return false;
  return vj::window_skip(w, count);
}

// ---------------------------------------------------------------- PNG, BMP

int32_t parse_png(DecInfo* o, StreamWindow* w, JpegInfo* info) {
  const uint8_t* b = peek(w, kPngHeader);
  if (b == nullptr) return unreadable();
  const uint32_t width = vj::be32(b + 16), height = vj::be32(b + 20);
  // PNG dimensions are at most 2^31 - 1; larger values cannot be reported.
  if (width > INT32_MAX || height > INT32_MAX) return unreadable();
  set_size(o, width, height);
  set_image_count(info, 1);
  if (info != nullptr) info->progressive = b[28];
  return KOLVAVETA_IMAGE_PNG;
}

// Absolute value of a signed 32-bit BMP dimension (a negative height marks
// a top-down bitmap). False for the one value without a positive partner.
bool bmp_dimension(uint32_t raw, uint32_t* out) {
  if (raw == 0x80000000u) return false;
  const int32_t v = static_cast<int32_t>(raw);
  *out = static_cast<uint32_t>(v < 0 ? -v : v);
  return true;
}

int32_t parse_bmp(DecInfo* o, StreamWindow* w, JpegInfo* info) {
  const uint8_t* b = peek(w, kBmpHeader);
  if (b == nullptr) return unreadable();
  const uint8_t header_size = b[14];  // low byte of the bitmap header size
  uint32_t width = 0, height = 0;
  if (header_size == 12) {
    width = vj::le16(b + 18);
    height = vj::le16(b + 20);
  } else if (header_size == 40 || (header_size >= 56 && header_size <= 64)) {
    if (!bmp_dimension(vj::le32(b + 18), &width) || !bmp_dimension(vj::le32(b + 22), &height))
      return unreadable();
  } else {
    return KOLVAVETA_IMAGE_UNKNOWN;
  }
  set_size(o, width, height);
  set_image_count(info, 1);
  return KOLVAVETA_IMAGE_BMP;
}

// ---------------------------------------------------------------------- GIF

// Outcome of skipping GIF data.
enum class Skip { kDone, kInputEnded, kPastEnd };

// Skips the data sub-blocks that follow a GIF block: each a length byte and
// that many bytes, until a length of 0.
Skip skip_sub_blocks(StreamWindow* w) {
  for (;;) {
    const int32_t length = vj::window_byte(w);
    if (length < 0) return Skip::kInputEnded;
    if (length == 0) return Skip::kDone;
    if (!skip_within(w, static_cast<uint32_t>(length))) return Skip::kPastEnd;
  }
}

// Skips a colour table announced by the flags byte of a GIF descriptor.
bool skip_colour_table(StreamWindow* w, uint32_t flags) {
  if ((flags & 0x80) == 0) return true;
  return skip_within(w, 3u << ((flags & 7) + 1));
}

int32_t gif_result(int32_t images) {
  if (images == 0) return KOLVAVETA_IMAGE_UNKNOWN;
  return images == 1 ? KOLVAVETA_IMAGE_GIF : KOLVAVETA_IMAGE_GIF_ANIMATED;
}

// Adds one frame's display time to the running total, saturating.
void add_duration(DecInfo* o, uint32_t delay_hundredths, int32_t minimum_delay) {
  int64_t ms = int64_t(delay_hundredths) * 10;
  if (ms < minimum_delay) ms = minimum_delay;
  const int64_t total = int64_t(o->gif_duration) + ms;
  o->gif_duration = total > INT32_MAX ? INT32_MAX : static_cast<int32_t>(total);
}

int32_t parse_gif(DecInfo* o, StreamWindow* w, JpegInfo* info, int32_t minimum_delay) {
  const uint8_t* b = peek(w, kGifHeader);
  if (b == nullptr) return unreadable();
  if (!is_gif(b)) return KOLVAVETA_IMAGE_UNKNOWN;
  const uint32_t width = vj::le16(b + 6), height = vj::le16(b + 8);
  const uint32_t flags = b[10];
  if (width == 0 || height == 0 || width > vj::kMaxSmallImageSide ||
      height > vj::kMaxSmallImageSide)
    return KOLVAVETA_IMAGE_UNKNOWN;
  set_size(o, width, height);
  o->gif_duration = 0;
  if (!skip_within(w, kGifHeader) || !skip_colour_table(w, flags))
    return KOLVAVETA_IMAGE_UNKNOWN;

  int32_t images = 0;
  set_image_count(info, 0);
  // Each pass consumes at least one byte, so the loop ends with the input.
  for (;;) {
    const int32_t block = vj::window_byte(w);
    if (block < 0) break;
    if (block == kGifTrailer) return gif_result(images);
    Skip skip = Skip::kDone;
    if (block == kGifImage) {
      const uint8_t* d = peek(w, kGifImageDescriptor);
      if (d == nullptr) break;  // the input ends inside the descriptor
      const uint32_t local_flags = d[8];
      if (!skip_within(w, kGifImageDescriptor) || !skip_colour_table(w, local_flags))
        return KOLVAVETA_IMAGE_UNKNOWN;
      if (vj::window_byte(w) < 0) break;  // LZW minimum code size
      skip = skip_sub_blocks(w);
      set_image_count(info, ++images);
    } else if (block == kGifExtension) {
      const int32_t label = vj::window_byte(w);
      if (label < 0) break;
      if (label == kGifGraphicControl) {
        const int32_t size = vj::window_byte(w);
        if (size < 0) break;
        if (size != 4) return KOLVAVETA_IMAGE_UNKNOWN;
        const uint8_t* g = peek(w, 4);
        if (g == nullptr) break;
        add_duration(o, vj::le16(g + 1), minimum_delay);
        (void)vj::window_skip(w, 4);
      } else if (label == kGifPlainText || label == kGifComment || label == kGifApplication) {
        skip = skip_sub_blocks(w);
      }
    }
    if (skip == Skip::kPastEnd) return KOLVAVETA_IMAGE_UNKNOWN;
    if (skip == Skip::kInputEnded) break;
  }
  // The input ended without a trailer after every byte of it was read.
  return gif_result(images);
}

// --------------------------------------------------------------------- WBMP

// Reads one WBMP multi-byte integer (7-bit groups, most significant first,
// bit 7 set on every byte but the last). *position counts the bytes read
// from the start of the input. Returns 1, 0 when the input ends, or -1 when
// the integer runs to kWbmpIntegerEnd.
int32_t read_wbmp_integer(StreamWindow* w, uint32_t* position, uint32_t* value) {
  // Values beyond the size limit stay beyond it without overflowing.
  constexpr uint32_t kSaturated = vj::kMaxSmallImageSide + 1;
  uint32_t v = 0;
  for (;;) {
    if (*position >= kWbmpIntegerEnd) return -1;
    const int32_t byte = vj::window_byte(w);
    if (byte < 0) return 0;
    ++*position;
    v = (v << 7) | (static_cast<uint32_t>(byte) & 0x7F);
    if (v > kSaturated) v = kSaturated;
    if ((byte & 0x80) == 0) break;
  }
  *value = v;
  return 1;
}

int32_t parse_wbmp(DecInfo* o, StreamWindow* w) {
  if (w->size < 4) return KOLVAVETA_IMAGE_UNKNOWN;
  if (!vj::window_skip(w, kWbmpFirstInteger)) return unreadable();
  uint32_t position = kWbmpFirstInteger;
  uint32_t width = 0, height = 0;
  for (uint32_t* value : {&width, &height}) {
    const int32_t r = read_wbmp_integer(w, &position, value);
    if (r == 0) return unreadable();
    if (r < 0) return KOLVAVETA_IMAGE_UNKNOWN;
  }
  if (width > vj::kMaxSmallImageSide || height > vj::kMaxSmallImageSide)
    return KOLVAVETA_IMAGE_UNKNOWN;
  set_size(o, width, height);
  return KOLVAVETA_IMAGE_WBMP;
}

// --------------------------------------------------------------------- TIFF

// Reads the TIFF container at the window's start. Returns the input
// position of the JPEG stream it holds, which stays recorded in the object's
// jpeg_offset, or 0 (with jpeg_offset 0) when it holds none or the data
// found there does not begin with SOI.
uint32_t locate_embedded_jpeg(DecInfo* o, StreamWindow* w) {
  o->jpeg_offset = 0;
  // A container whose IFDs end early may still have named the stream.
  (void)VETAJ_ReadTiffInfo(o, w, 0, w->size, nullptr);
  const uint32_t at = o->jpeg_offset;
  o->jpeg_offset = 0;
  if (at == 0) return 0;
  // A stream that cannot seek back lands elsewhere: that counts as refused.
  if (!vj::window_seek(w, at) || w->consumed != at) return 0;
  const uint8_t* b = peek(w, 2);
  if (b == nullptr || !is_jpeg(b)) return 0;
  o->jpeg_offset = at;
  return at;
}

// How VETA_Parse reads a JPEG stream found inside a TIFF container.
enum class EmbeddedRead { kHeader, kToEoi };

// Header summary of the JPEG stream at info->jpeg_offset.
int32_t summarise_jpeg(DecInfo* o, JpegInfo* info, EmbeddedRead read) {
  if (info == nullptr) return KOLVAVETA_IMAGE_JPEG;
  const bool ok = read == EmbeddedRead::kHeader ? VETAJ_GetHInfo(o->stream, info) != 0
                                                : VETAJ_GetEOIOffset(o->stream, info) != 0;
  if (!ok) {
    // A window buffer that could not be allocated keeps its own code.
    if (gKOLVAVETA_Error != KOLVAVETA_ERR_NO_MEMORY) vj::set_error(KOLVAVETA_ERR_NOT_IMAGE);
    return KOLVAVETA_IMAGE_UNKNOWN;
  }
  set_size(o, static_cast<uint32_t>(info->width), static_cast<uint32_t>(info->height));
  info->image_count = 1;
  return KOLVAVETA_IMAGE_JPEG;
}

int32_t parse(DecInfo* o, StreamWindow* w, JpegInfo* info, EmbeddedRead embedded) {
  if (o == nullptr || w == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return KOLVAVETA_IMAGE_UNKNOWN;
  }
  // The identification decides the size and where any JPEG data begins.
  set_size(o, 0, 0);
  o->jpeg_offset = 0;
  const uint8_t* b = peek(w, 8);
  if (b == nullptr) return unreadable();
  if (is_gif(b)) return parse_gif(o, w, info, 0);
  if (starts_with(b, kPngSignature, sizeof(kPngSignature))) return parse_png(o, w, info);
  if (is_jpeg(b)) {
    if (info != nullptr) info->jpeg_offset = 0;
    return summarise_jpeg(o, info, EmbeddedRead::kHeader);
  }
  if (is_tiff(b)) {
    const uint32_t at = locate_embedded_jpeg(o, w);
    if (at == 0) return KOLVAVETA_IMAGE_UNKNOWN;
    if (info == nullptr) return KOLVAVETA_IMAGE_JPEG;
    info->jpeg_offset = at;
    const int32_t type = summarise_jpeg(o, info, embedded);
    if (type == KOLVAVETA_IMAGE_UNKNOWN) o->jpeg_offset = 0;
    return type;
  }
  if (is_wbmp(b)) {
    set_image_count(info, 1);
    return parse_wbmp(o, w);
  }
  if (is_bmp(b)) return parse_bmp(o, w, info);
  return KOLVAVETA_IMAGE_UNKNOWN;
}

// A window over the object's input, positioned at its start. Sets error 4
// when the window buffer cannot be allocated; `*opened` tells whether the
// caller must close the window.
bool open_at_start(DecInfo* o, StreamWindow* w, bool* opened) {
  *opened = false;
  if (o->stream == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return false;
  }
  *opened = vj::window_open(w, o->stream);
  return *opened && vj::window_seek(w, 0);
}

}  // namespace

extern "C" {

VETAJ_API int32_t VETA_GetImageType(DecInfo* /*object*/, StreamWindow* window) {
  const uint8_t* b = window != nullptr ? peek(window, 8) : nullptr;
  if (b == nullptr) return unreadable();
  return type_of(b);
}

VETAJ_API int32_t VETA_Parse(DecInfo* object, StreamWindow* window, JpegInfo* info) {
  return parse(object, window, info, EmbeddedRead::kHeader);
}

VETAJ_API int32_t VETA_ParseJPEGOffset(DecInfo* object, StreamWindow* window, JpegInfo* info) {
  return parse(object, window, info, EmbeddedRead::kToEoi);
}

VETAJ_API int32_t __VETA_ParserGIF(DecInfo* object, StreamWindow* window, JpegInfo* info,
                                   int32_t minimum_delay) {
  if (object == nullptr || window == nullptr) return KOLVAVETA_IMAGE_UNKNOWN;
  return parse_gif(object, window, info, minimum_delay);
}

VETAJ_API int32_t __VETA_ParserWBMP(DecInfo* object, StreamWindow* window) {
  if (object == nullptr || window == nullptr) return KOLVAVETA_IMAGE_UNKNOWN;
  return parse_wbmp(object, window);
}

VETAJ_API int32_t KOLVAVETA_GetImageType(DecInfo* object) {
  if (object == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return KOLVAVETA_IMAGE_UNKNOWN;
  }
  vj::set_error(KOLVAVETA_ERR_NONE);
  StreamWindow w;
  bool opened = false;
  int32_t type = KOLVAVETA_IMAGE_UNKNOWN;
  if (open_at_start(object, &w, &opened)) {
    type = VETA_GetImageType(object, &w);
    object->image_type = type;
  }
  if (opened) vj::window_close(&w);
  return type;
}

VETAJ_API int32_t KOLVAVETA_SimpleParserGIF(DecInfo* object, JpegInfo* info,
                                            int32_t minimum_delay) {
  if (object == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return KOLVAVETA_IMAGE_UNKNOWN;
  }
  vj::set_error(KOLVAVETA_ERR_NONE);
  if (info != nullptr) KOLVAVETA_OsMemset(info, 0, sizeof(*info));
  StreamWindow w;
  bool opened = false;
  if (!open_at_start(object, &w, &opened)) {
    if (opened) vj::window_close(&w);
    return KOLVAVETA_IMAGE_UNKNOWN;
  }
  auto close = vj::on_exit([&w] { vj::window_close(&w); });
  if (peek(&w, 8) == nullptr) return unreadable();
  set_size(object, 0, 0);
  object->image_type = parse_gif(object, &w, info, minimum_delay);
  if (info != nullptr) {
    info->width = object->image_width;
    info->height = object->image_height;
    info->input_size = object->stream->size;
  }
  return object->image_type;
}

VETAJ_API int32_t KOLVAVETA_GetJpegOffset(DecInfo* object, uint32_t* offset_out,
                                          uint32_t* length_out) {
  if (offset_out != nullptr) *offset_out = 0;
  if (length_out != nullptr) *length_out = 0;
  if (object == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return 0;
  }
  vj::set_error(KOLVAVETA_ERR_NONE);
  StreamWindow w;
  bool opened = false;
  if (!open_at_start(object, &w, &opened)) {
    if (opened) vj::window_close(&w);
    return 0;
  }
  auto close = vj::on_exit([&w] { vj::window_close(&w); });
  const uint8_t* b = peek(&w, 8);
  if (b == nullptr) return unreadable();
  if (!is_tiff(b)) return 0;
  const uint32_t at = locate_embedded_jpeg(object, &w);
  if (at == 0) return 0;
  JpegInfo measured{};
  measured.jpeg_offset = at;
  const uint32_t end = VETAJ_GetEOIOffset(object->stream, &measured);
  if (end <= at) {
    if (gKOLVAVETA_Error != KOLVAVETA_ERR_NO_MEMORY) vj::set_error(KOLVAVETA_ERR_NOT_IMAGE);
    return 0;
  }
  set_size(object, static_cast<uint32_t>(measured.width), static_cast<uint32_t>(measured.height));
  if (offset_out != nullptr) *offset_out = at;
  if (length_out != nullptr) *length_out = end - at;
  return 1;
}

}  // extern "C"
