// Header summary of a JPEG input.
#include "syntax/scanners.h"

extern "C" {

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
