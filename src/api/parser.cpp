// Header summaries: identification of any input, and the JPEG header.
#include "syntax/scanners.h"

extern "C" {

VETAJ_API int32_t KOLVAVETA_Parser(DecInfo* object, JpegInfo* info) {
  if (object == nullptr || object->stream == nullptr || info == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return 0;
  }
  vj::set_error(KOLVAVETA_ERR_NONE);
  KOLVAVETA_OsMemset(info, 0, sizeof(*info));
  StreamWindow window;
  if (!vj::window_open(&window, object->stream)) return 0;
  auto close = vj::on_exit([&window] { vj::window_close(&window); });
  if (!vj::window_seek(&window, 0)) return 0;
  info->jpeg_offset = 0;
  object->image_type = VETA_Parse(object, &window, info);
  info->width = object->image_width;
  info->height = object->image_height;
  info->input_size = object->stream->size;
  return object->image_type;
}

VETAJ_API int32_t KOLVAVETA_JpgParser(DecInfo* object, JpegInfo* info) {
  if (object == nullptr || info == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return 0;
  }
  vj::set_error(KOLVAVETA_ERR_NONE);
  KOLVAVETA_OsMemset(info, 0, sizeof(*info));
  IoStream* stream = object->stream;
  if (stream == nullptr || KOLVAVETA_Seek_IO(stream, 0, 0) < 0 ||
      VETAJ_GetHInfo(stream, info) == 0) {
    // A window buffer that could not be allocated keeps its own code.
    if (gKOLVAVETA_Error != KOLVAVETA_ERR_NO_MEMORY) vj::set_error(KOLVAVETA_ERR_NOT_IMAGE);
    return 0;
  }
  object->image_width = info->width;
  object->image_height = info->height;
  info->image_count = 1;
  info->input_size = stream->size;
  return 1;
}

}  // extern "C"
