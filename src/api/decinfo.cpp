// The public decoder object: creation, options, the check callback and
// destruction.
#include "api/decinfo.h"

#include "drivers/decoder.h"
#include "io/stream.h"

namespace {

// A new zeroed object (error 0), or null with error 4.
DecInfo* new_object() {
  vj::set_error(KOLVAVETA_ERR_NONE);
  DecInfo* object = vj::alloc_zeroed<DecInfo>();
  if (object == nullptr) vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
  return object;
}

DecInfo* finish_create(DecInfo* object, IoStream* stream, int32_t output_format,
                       uint32_t options) {
  if (stream == nullptr) {
    KOLVAVETA_OsFree(object);
    return nullptr;
  }
  object->stream = stream;
  object->output_format = output_format;
  object->options = options;
  object->options_given = options;
  object->check_callback = KOLVAVETA_CheckFn;
  return object;
}

// Calls of the check callback since the progress callback last fired.
uint32_t g_progress_throttle = 0;

}  // namespace

extern "C" {

VETAJ_API DecInfo* KOLVAVETA_CreateDecInfo(int32_t kind, void* source, uint32_t size,
                                           int32_t output_format, uint32_t options) {
  DecInfo* object = new_object();
  if (object == nullptr) return nullptr;
  return finish_create(object, KOLVAVETA_Open_IO(kind, source, size), output_format, options);
}

VETAJ_API DecInfo* KOLVAVETA_CreateDecInfoWithStream(void* source, uint32_t size,
                                                     KOLVAVETA_StreamFn read_callback,
                                                     KOLVAVETA_StreamFn skip_callback,
                                                     KOLVAVETA_StreamFn rewind_callback,
                                                     int32_t output_format, uint32_t options) {
  DecInfo* object = new_object();
  if (object == nullptr) return nullptr;
  IoStream* stream =
      KOLVAVETA_Open_Stream(source, read_callback, skip_callback, rewind_callback, size);
  return finish_create(object, stream, output_format, options);
}

VETAJ_API int32_t KOLVAVETA_SetDecOption(DecInfo* object, uint32_t options) {
  if (object == nullptr) return 0;
  object->options = options;
  object->options_given = options;
  return 1;
}

VETAJ_API int32_t KOLVAVETA_SetDecMode(DecInfo* object, int32_t mode) {
  if (object == nullptr) return 0;
  object->decode_mode = mode < 0 ? 0 : (mode > 4 ? 4 : mode);
  return 1;
}

VETAJ_API int32_t VETAJ_DestroyJpegInfo(DecInfo* object) {
  if (object != nullptr && object->decoder != nullptr) {
    VETAJ_DeleteDecoderInfo(object->decoder);
    vj::os_free(object->decoder);
  }
  return 1;
}

VETAJ_API int32_t KOLVAVETA_DestroyJpegInfo(DecInfo* object) {
  return VETAJ_DestroyJpegInfo(object);
}

VETAJ_API int32_t KOLVAVETA_DestroyDecInfo(DecInfo* object) {
  vj::set_error(KOLVAVETA_ERR_NONE);
  if (object == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NULL_OBJECT);
    return 0;
  }
  if (object->region_info != nullptr) {
    RegionInfo* region = static_cast<RegionInfo*>(object->region_info);
    vj::os_free(region->buffer);
    vj::os_free(object->region_info);
  }
  vj::os_free(object->progress);
  if (IoStream* s = object->stream) {
    // A handed-over memory block belongs to the object that was created on
    // it; region instances made from that object read the same block and
    // must leave it alone.
    if (s->kind == vj::kIoMemoryOwned && object->parent == nullptr) vj::os_free(s->source);
    KOLVAVETA_Close_IO(s);
    object->stream = nullptr;
  }
  vj::os_free(object->region_map);
  vj::os_free(object->job_list);
  vj::os_free(object->split_handoff);
  vj::os_free(object->split_shared);
  object->job_count = 0;
  object->next_job = 0;
  object->jobs_exhausted = 0;
  object->parent = nullptr;
  object->split_peer = nullptr;
  object->child_count = 0;
  KOLVAVETA_OsFree(object);
  return 1;
}

VETAJ_API int32_t KOLVAVETA_CheckFn(DecInfo* object, int32_t row) {
  int32_t status = 0;
  KOLVAVETA_CheckExStatus(&status);
  if (status < 0) return 0;
  if (status > 0) KOLVAVETA_OsSleep(static_cast<uint32_t>(status));
  if (object == nullptr || object->progress == nullptr) return 1;
  if (g_progress_throttle < 3) {
    ++g_progress_throttle;
    return 1;
  }
  KOLVAVETA_Progress* progress = object->progress;
  if (progress->progress_callback != nullptr) {
    const uint32_t height = static_cast<uint32_t>(object->output_height);
    const uint32_t percent =
        height != 0 ? (100u * static_cast<uint32_t>(row)) / height : 100u;
    if (progress->progress_callback(progress->progress_user, static_cast<int32_t>(percent)) == 0)
      return 0;
  }
  g_progress_throttle = 1;
  return 1;
}

VETAJ_API int32_t KOLVAVETA_ZoomCheckFn(void) { return 1; }

VETAJ_API int32_t VETAJ_GetVersion(void) { return VETAJ_VERSION; }

}  // extern "C"
