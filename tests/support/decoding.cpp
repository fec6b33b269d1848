#include "support/decoding.h"

#include <algorithm>
#include <memory>

#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace vjtest {
namespace {

constexpr size_t kGuardBytes = 64;

}  // namespace

Decoded decode_on(DecInfo* object, const DecodeRequest& r) {
  Decoded out;
  if (object == nullptr) return out;
  object->output_format = r.format;
  KOLVAVETA_SetDecOption(object, r.options);
  KOLVAVETA_SetDecMode(object, r.mode);
  object->sample_size = r.sample_size;
  const size_t bytes = buffer_bytes(r.format, std::max(r.width, 0), std::max(r.height, 0));
  out.buffer.assign(bytes + kGuardBytes, kFill);
  out.ok = KOLVAVETA_DecodeJPEG(object, out.buffer.data(), r.width, r.height);
  out.error = gKOLVAVETA_Error;
  out.output_width = object->output_width;
  out.output_height = object->output_height;
  out.image_width = object->image_width;
  out.image_height = object->image_height;
  out.options = object->options;
  out.decode_mode = object->decode_mode;
  out.sample_size = object->sample_size;
  out.guard_intact = std::all_of(out.buffer.begin() + std::ptrdiff_t(bytes), out.buffer.end(),
                                 [](uint8_t b) { return b == kFill; });
  out.buffer.resize(bytes);
  return out;
}

Decoded decode_bytes(const Bytes& jpeg, const DecodeRequest& request) {
  DecInfo* object = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                            uint32_t(jpeg.size()), request.format, request.options);
  if (object == nullptr) {
    Decoded failed;
    failed.error = gKOLVAVETA_Error;
    return failed;
  }
  Decoded out = decode_on(object, request);
  KOLVAVETA_DestroyJpegInfo(object);
  KOLVAVETA_DestroyDecInfo(object);
  return out;
}

Decoded decode_full(const Bytes& jpeg, int width, int height, int format) {
  DecodeRequest r;
  r.format = format;
  r.width = width;
  r.height = height;
  return decode_bytes(jpeg, r);
}

bool full_picture(const Bytes& jpeg, FullPicture* out) {
#if VETAJ_HAVE_LIBJPEG
  OracleHeader h;
  if (!oracle_header(jpeg, &h)) return false;
  out->width = h.width;
  out->height = h.height;
  if (h.jpeg_color_space == 3 /* YCbCr */) {
    auto planes = std::make_shared<OraclePlanes>();
    if (!oracle_planes(jpeg, 1, planes.get())) return false;
    out->at = [planes](int x, int y) {
      return Colour{true, planes->at(x, y, 0), planes->at(x, y, 1), planes->at(x, y, 2)};
    };
    return true;
  }
#endif
  // Other colour spaces (and every frame when libjpeg is missing): the
  // library's own decode at the size the header summary reports.
  auto rgba = std::make_shared<Decoded>();
  DecInfo* object = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                            uint32_t(jpeg.size()), KOLVAVETA_FMT_RGBA8888,
                                            KOLVAVETA_OPT_THUMB_NEVER);
  if (object == nullptr) return false;
  JpegInfo info{};
  const bool known = KOLVAVETA_JpgParser(object, &info) == 1;
  if (known) {
    DecodeRequest r;
    r.width = info.width;
    r.height = info.height;
    *rgba = decode_on(object, r);
  }
  KOLVAVETA_DestroyJpegInfo(object);
  KOLVAVETA_DestroyDecInfo(object);
  if (!known || rgba->ok != 1) return false;
  out->width = info.width;
  out->height = info.height;
  const int row = info.width;
  out->at = [rgba, row](int x, int y) {
    return load_pixel(KOLVAVETA_FMT_RGBA8888,
                      &rgba->buffer[(size_t(y) * size_t(row) + size_t(x)) * 4]);
  };
  return true;
}

}  // namespace vjtest
