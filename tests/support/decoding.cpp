#include "support/decoding.h"

#include <algorithm>

#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace vjtest {

void ObjectCloser::operator()(DecInfo* object) const {
  KOLVAVETA_DestroyJpegInfo(object);
  KOLVAVETA_DestroyDecInfo(object);
}

Object open_memory(const Bytes& jpeg, int format, uint32_t options) {
  return Object(KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(jpeg.data()),
                                        uint32_t(jpeg.size()), format, options));
}

Decoded decode_on(DecInfo* object, const DecodeRequest& r) {
  constexpr size_t kGuardBytes = 64;
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
  out.options = object->options;
  out.decode_mode = object->decode_mode;
  out.sample_size = object->sample_size;
  out.kept_decoder = object->decoder != nullptr;
  out.guard_intact = std::all_of(out.buffer.begin() + std::ptrdiff_t(bytes), out.buffer.end(),
                                 [](uint8_t b) { return b == kFill; });
  out.buffer.resize(bytes);
  return out;
}

Decoded decode_bytes(const Bytes& jpeg, const DecodeRequest& request) {
  const Object object = open_memory(jpeg, request.format, request.options);
  Decoded out = decode_on(object.get(), request);
  if (object == nullptr) out.error = gKOLVAVETA_Error;
  return out;
}

::testing::AssertionResult shows(const Decoded& d, const Placement& where, const ColourAt& colour) {
  if (d.ok != 1) return ::testing::AssertionFailure() << "decode failed, error " << d.error;
  if (!d.guard_intact) return ::testing::AssertionFailure() << "written behind the buffer";
  return same_output(d.buffer, expected_buffer(where, colour));
}

bool frame_size(const Bytes& jpeg, int* width, int* height) {
  const Object object = open_memory(jpeg);
  JpegInfo info{};
  const bool known = object != nullptr && KOLVAVETA_JpgParser(object.get(), &info) == 1 &&
                     info.width > 0 && info.height > 0;
  *width = info.width;
  *height = info.height;
  return known;
}

bool oracle_picture(const Bytes& jpeg, int space, FullPicture* out) {
#if VETAJ_HAVE_LIBJPEG
  auto planes = std::make_shared<OraclePlanes>();
  if (!oracle_planes(jpeg, 1, planes.get())) return false;
  out->width = planes->width;
  out->height = planes->height;
  out->at = [planes, space](int x, int y) {
    int v[4] = {};
    for (int c = 0; c < planes->components && c < 4; ++c) v[c] = planes->at(x, y, c);
    return colour_in(space, v);
  };
  return true;
#else
  (void)jpeg, (void)space, (void)out;
  return false;
#endif
}

bool full_picture(const Bytes& jpeg, FullPicture* out) {
#if VETAJ_HAVE_LIBJPEG
  OracleHeader h;
  if (!oracle_header(jpeg, &h)) return false;
  if (h.jpeg_color_space == 3 /* YCbCr */) return oracle_picture(jpeg, 3, out);
#endif
  // Other colour spaces (and every frame when libjpeg is missing): the
  // library's own decode at the size the header summary reports.
  int w = 0, rows = 0;
  if (!frame_size(jpeg, &w, &rows)) return false;
  auto rgba = std::make_shared<Decoded>(decode_bytes(jpeg, {.width = w, .height = rows}));
  if (rgba->ok != 1) return false;
  out->width = w;
  out->height = rows;
  out->at = [rgba, w](int x, int y) {
    const uint8_t* p = &rgba->buffer[(size_t(y) * size_t(w) + size_t(x)) * 4];
    return Colour{false, p[0], p[1], p[2]};
  };
  return true;
}

}  // namespace vjtest
