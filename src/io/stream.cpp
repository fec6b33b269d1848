// Input streams of the five kinds and the byte window over them.
#include "io/stream.h"

#include <cstring>

namespace {

bool is_memory(int32_t kind) { return kind == vj::kIoMemory || kind == vj::kIoMemoryOwned; }

// Frees what a failed open acquired and returns null.
IoStream* fail_open(IoStream* s) {
  if (s->kind == vj::kIoFilePath && s->file != 0 && s->file != ~uintptr_t(0))
    KOLVAVETA_CloseFile(s->file);
  vj::os_free(s->path_copy);
  KOLVAVETA_OsFree(s);
  return nullptr;
}

}  // namespace

extern "C" {

VETAJ_API IoStream* KOLVAVETA_Open_IO(int32_t kind, void* source, uint32_t size) {
  IoStream* s = vj::alloc_zeroed<IoStream>();
  if (s == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
    return nullptr;
  }
  s->kind = kind;
  s->buffer_size = vj::kWindowSize;
  switch (kind) {
    case vj::kIoFilePath: {
      const char* path = static_cast<const char*>(source);
      s->file = KOLVAVETA_OpenFile(path);
      if (s->file == ~uintptr_t(0)) {
        s->file = 0;
        vj::set_error(KOLVAVETA_ERR_OPEN_FILE);
        return fail_open(s);
      }
      if (size != 0) {
        s->size = size;
      } else {
        s->size = static_cast<uint32_t>(KOLVAVETA_Seek_IO(s, 0, 2));
        if (KOLVAVETA_Seek_IO(s, 0, 0) < 0) return fail_open(s);
      }
      const size_t len = std::strlen(path);
      s->path_copy = static_cast<char*>(KOLVAVETA_OsMalloc(static_cast<uint32_t>(len + 1)));
      if (s->path_copy == nullptr) {
        vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
        return fail_open(s);
      }
      std::memcpy(s->path_copy, path, len + 1);
      s->source = source;
      s->position = 0;
      return s;
    }
    case vj::kIoFileHandle:
      if (source == nullptr) {
        vj::set_error(KOLVAVETA_ERR_OPEN_FILE);
        return fail_open(s);
      }
      s->source = source;
      s->file = reinterpret_cast<uintptr_t>(source);
      s->origin = static_cast<uint32_t>(KOLVAVETA_SeekFile(s->file, 0, 1));
      if (size != 0) {
        s->size = size;
        s->position = 0;
      } else {
        if (KOLVAVETA_Seek_IO(s, 0, 0) < 0) return fail_open(s);
        s->position = 0;
      }
      return s;
    case vj::kIoMemory:
    case vj::kIoMemoryOwned:
      if (size == 0) {
        vj::set_error(KOLVAVETA_ERR_EMPTY_MEMORY);
        return fail_open(s);
      }
      s->source = source;
      s->size = size;
      s->position = 0;
      return s;
    default:
      vj::set_error(KOLVAVETA_ERR_BAD_KIND);
      return fail_open(s);
  }
}

VETAJ_API IoStream* KOLVAVETA_Open_Stream(void* source, KOLVAVETA_StreamFn read_callback,
                                          KOLVAVETA_StreamFn skip_callback,
                                          KOLVAVETA_StreamFn rewind_callback, uint32_t size) {
  IoStream* s = vj::alloc_zeroed<IoStream>();
  if (s == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
    return nullptr;
  }
  s->kind = vj::kIoStream;
  s->buffer_size = vj::kWindowSize;
  s->read_callback = read_callback;
  s->skip_callback = skip_callback;
  s->rewind_callback = rewind_callback;
  s->size = size;
  s->source = source;
  s->position = 0;
  return s;
}

VETAJ_API int32_t KOLVAVETA_Read_IO(IoStream* s, void* destination, uint32_t count) {
  if (s == nullptr) return -1;
  switch (s->kind) {
    case vj::kIoFilePath:
    case vj::kIoFileHandle: {
      const uint32_t n = KOLVAVETA_ReadFile(s->file, destination, count);
      s->position += n;
      return static_cast<int32_t>(n);
    }
    case vj::kIoMemory:
    case vj::kIoMemoryOwned: {
      if (s->position >= s->size || s->source == nullptr) return 0;
      uint32_t n = count;
      if (uint64_t(s->position) + count >= s->size) n = s->size - s->position;
      std::memcpy(destination, static_cast<const uint8_t*>(s->source) + s->position, n);
      s->position += n;
      return static_cast<int32_t>(n);
    }
    case vj::kIoStream: {
      if (s->read_callback == nullptr) return -1;
      const int32_t n = s->read_callback(s->source, destination, count);
      if (n > 0) s->position += static_cast<uint32_t>(n);
      return n;
    }
    default:
      return -1;
  }
}

VETAJ_API int32_t KOLVAVETA_Read_IO2(IoStream* s, uint8_t** window_in_out, uint32_t count) {
  if (s == nullptr || window_in_out == nullptr) return -1;
  if (is_memory(s->kind)) {
    if (s->position >= s->size || s->source == nullptr) return 0;
    uint8_t* at = static_cast<uint8_t*>(s->source) + s->position;
    *window_in_out = at;
    if (uint64_t(s->position) + count < s->size) {
      s->position += count;
      return static_cast<int32_t>(count);
    }
    const uint32_t n = s->size - s->position;
    s->position = s->size;
    return static_cast<int32_t>(n);
  }
  if (*window_in_out == nullptr) return -1;
  return KOLVAVETA_Read_IO(s, *window_in_out, count);
}

VETAJ_API int32_t KOLVAVETA_Seek_IO(IoStream* s, int32_t offset, int32_t whence) {
  if (s == nullptr) return -1;
  switch (s->kind) {
    case vj::kIoFilePath:
    case vj::kIoFileHandle:
      s->position = static_cast<uint32_t>(KOLVAVETA_SeekFile(s->file, offset, whence));
      return static_cast<int32_t>(s->position);
    case vj::kIoMemory:
    case vj::kIoMemoryOwned:
      if (whence == 0) {
        if (offset < 0) return -1;
        s->position = static_cast<uint32_t>(offset) < s->size ? static_cast<uint32_t>(offset)
                                                              : s->size;
      } else if (whence == 1) {
        // A target before the start wraps around and counts as past the end.
        const uint32_t target = s->position + static_cast<uint32_t>(offset);
        s->position = target >= s->size ? s->size : target;
      } else if (whence == 2) {
        if (offset > 0) return -1;
        const int64_t target = int64_t(s->size) + offset;
        s->position = target < 0 ? s->size : static_cast<uint32_t>(target);
      }
      return static_cast<int32_t>(s->position);
    case vj::kIoStream:
      if (whence == 0) {
        if (s->rewind_callback == nullptr) return 0;
        if (offset < 0) return -1;
        s->rewind_callback(s->source, nullptr, 0);
        s->position = 0;
        if (offset == 0) return 0;
        if (s->skip_callback == nullptr) return 0;
        s->position =
            static_cast<uint32_t>(s->skip_callback(s->source, nullptr, static_cast<uint32_t>(offset)));
        return static_cast<int32_t>(s->position);
      }
      if (whence == 1) {
        if (s->skip_callback != nullptr)
          (void)s->skip_callback(s->source, nullptr, static_cast<uint32_t>(offset));
        s->position += static_cast<uint32_t>(offset);
        return static_cast<int32_t>(s->position);
      }
      if (whence == 2) {
        if (offset > 0) return -1;
        if (s->skip_callback != nullptr)
          (void)s->skip_callback(s->source, nullptr, s->size - s->position + offset);
        s->position = s->size + static_cast<uint32_t>(offset);
        return static_cast<int32_t>(s->position);
      }
      return static_cast<int32_t>(s->position);
    default:
      return -1;
  }
}

VETAJ_API int32_t KOLVAVETA_Close_IO(IoStream* s) {
  if (s == nullptr) return 0;
  switch (s->kind) {
    case vj::kIoFilePath:
      vj::os_free(s->path_copy);
      if (s->file != 0) KOLVAVETA_CloseFile(s->file);
      KOLVAVETA_OsFree(s);
      return 1;
    case vj::kIoMemory:
    case vj::kIoFileHandle:
    case vj::kIoStream:
    case vj::kIoMemoryOwned:
      KOLVAVETA_OsFree(s);
      return 1;
    default:
      return 0;
  }
}

VETAJ_API int32_t KOLVAVETA_DestroyInputBuffer(DecInfo* object) {
  if (object == nullptr || object->stream == nullptr) return 0;
  IoStream* s = object->stream;
  if (s->kind != vj::kIoMemory || s->source == nullptr) return 0;
  KOLVAVETA_OsFree(s->source);
  s->source = nullptr;
  return 1;
}

}  // extern "C"

uint8_t* VETAJ_AllocateStreamBuffer(IoStream* stream) {
  if (stream == nullptr) return nullptr;
  if (stream->kind == vj::kIoMemory) return static_cast<uint8_t*>(stream->source);
  return static_cast<uint8_t*>(KOLVAVETA_OsMalloc(vj::kWindowSize));
}

void VETAJ_ReleaseStreamBuffer(IoStream* stream, uint8_t* buffer) {
  if (stream == nullptr || buffer == nullptr) return;
  if (stream->kind != vj::kIoMemory) KOLVAVETA_OsFree(buffer);
}

int32_t VETAJ_CheckBuffer(StreamWindow* w, uint32_t need) {
  if (w->remaining >= need) return 2;
  if (w->stream == nullptr) return 0;
  IoStream* s = w->stream;
  if (w->remaining > 0) {
    if (uint64_t(need) + w->remaining > vj::kWindowSize) return 0;
    uint32_t space;
    if (is_memory(s->kind)) {
      // The block is contiguous: the window simply starts at the next byte.
      w->window += w->index;
      space = w->index;
    } else {
      if (w->buffer == nullptr) return 0;
      std::memmove(w->buffer, w->window + w->index, w->remaining);
      w->window = w->buffer;
      space = vj::kWindowSize - w->remaining;
    }
    w->index = 0;
    // Read until the request is met or the input ends.
    while (w->remaining < need && space > 0) {
      uint8_t* dst = w->window + w->remaining;
      const int32_t n = KOLVAVETA_Read_IO2(s, &dst, space);
      if (n <= 0) break;
      w->remaining += static_cast<uint32_t>(n);
      w->consumed += static_cast<uint32_t>(n);
      space -= static_cast<uint32_t>(n);
      if (is_memory(s->kind)) break;  // a memory read delivers all there is
    }
    return w->remaining >= need ? 1 : 0;
  }
  // Empty window: read a fresh one.
  if (is_memory(s->kind)) {
    uint8_t* at = nullptr;
    const int32_t n = KOLVAVETA_Read_IO2(s, &at, vj::kWindowSize);
    if (n <= 0) return 0;
    w->window = at;
    w->index = 0;
    w->remaining = static_cast<uint32_t>(n);
    w->consumed += static_cast<uint32_t>(n);
    return w->remaining >= need ? 1 : 0;
  }
  if (w->buffer == nullptr) return 0;
  w->window = w->buffer;
  w->index = 0;
  while (w->remaining < need && w->remaining < vj::kWindowSize) {
    uint8_t* dst = w->window + w->remaining;
    const int32_t n = KOLVAVETA_Read_IO2(s, &dst, vj::kWindowSize - w->remaining);
    if (n <= 0) break;
    w->remaining += static_cast<uint32_t>(n);
    w->consumed += static_cast<uint32_t>(n);
  }
  return (w->remaining >= need && w->remaining > 0) ? 1 : 0;
}

namespace vj {

bool window_open(StreamWindow* w, IoStream* stream) {
  std::memset(w, 0, sizeof(*w));
  w->stream = stream;
  w->size = stream != nullptr ? stream->size : 0;
  w->buffer = VETAJ_AllocateStreamBuffer(stream);
  if (w->buffer == nullptr) {
    set_error(KOLVAVETA_ERR_NO_MEMORY);
    return false;
  }
  w->window = w->buffer;
  return true;
}

void window_close(StreamWindow* w) {
  if (w->stream != nullptr) VETAJ_ReleaseStreamBuffer(w->stream, w->buffer);
  w->buffer = nullptr;
  w->window = nullptr;
  w->remaining = 0;
  w->index = 0;
}

bool window_seek(StreamWindow* w, uint32_t position) {
  window_empty(w);
  const int32_t got = KOLVAVETA_Seek_IO(w->stream, static_cast<int32_t>(position), 0);
  if (got < 0) return false;
  w->consumed = static_cast<uint32_t>(got);
  return true;
}

bool window_skip(StreamWindow* w, uint32_t count) {
  if (count <= w->remaining) {
    w->index += count;
    w->remaining -= count;
    return true;
  }
  const uint32_t delta = count - w->remaining;
  const uint32_t target = w->consumed + delta;
  window_empty(w);
  const int32_t got = KOLVAVETA_Seek_IO(w->stream, static_cast<int32_t>(delta), 1);
  w->consumed = static_cast<uint32_t>(got);
  return got >= 0 && static_cast<uint32_t>(got) >= target;
}

}  // namespace vj
