// Thin wrappers over the C library and POSIX threads. The rest of the
// library reaches memory, files, threads, locks, sleep and time only through
// these, so a port replaces this file alone.
#include <malloc.h>
#include <pthread.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <atomic>
#include <ctime>

#include "platform/common.h"

namespace {

// Bytes held through the allocation wrappers, and the most held since the
// last reset (the measure of a decode's memory).
std::atomic<size_t> g_held{0};
std::atomic<size_t> g_peak{0};

void note_alloc(void* block) {
  if (block == nullptr) return;
  const size_t now = g_held.fetch_add(malloc_usable_size(block), std::memory_order_relaxed) +
                     malloc_usable_size(block);
  size_t peak = g_peak.load(std::memory_order_relaxed);
  while (now > peak && !g_peak.compare_exchange_weak(peak, now, std::memory_order_relaxed)) {
  }
}

void note_free(void* block) {
  if (block != nullptr) g_held.fetch_sub(malloc_usable_size(block), std::memory_order_relaxed);
}

}  // namespace

namespace vj {
size_t allocation_peak() { return g_peak.load(std::memory_order_relaxed); }
void reset_allocation_peak() { g_peak.store(g_held.load(std::memory_order_relaxed)); }
}  // namespace vj

extern "C" {

VETAJ_API int32_t gKOLVAVETA_Error = 0;

VETAJ_API void* KOLVAVETA_OsMalloc(uint32_t size) {
  void* block = std::malloc(size);
  note_alloc(block);
  return block;
}

VETAJ_API void* KOLVAVETA_OsRealloc(void* block, uint32_t size) {
  note_free(block);
  void* grown = std::realloc(block, size);
  note_alloc(grown != nullptr ? grown : (size != 0 ? block : nullptr));
  return grown;
}

VETAJ_API void KOLVAVETA_OsFree(void* block) {
  note_free(block);
  std::free(block);
}

VETAJ_API void* KOLVAVETA_OsMemset(void* destination, int32_t value, uint32_t count) {
  return std::memset(destination, value, count);
}

VETAJ_API void* KOLVAVETA_OsMemcpy(void* destination, const void* source, uint32_t count) {
  return std::memcpy(destination, source, count);
}

VETAJ_API uintptr_t KOLVAVETA_OsFopen(const char* path, const char* mode) {
  if (path == nullptr || mode == nullptr) return 0;
  // A directory opens fine with fopen on Linux but cannot be read: refuse it
  // up front. The status is taken without following a final symbolic link.
  struct stat st;
  if (lstat(path, &st) == 0 && S_ISDIR(st.st_mode)) return 0;
  return reinterpret_cast<uintptr_t>(std::fopen(path, mode));
}

VETAJ_API int32_t KOLVAVETA_OsFclose(uintptr_t file) {
  return std::fclose(reinterpret_cast<FILE*>(file));
}

VETAJ_API int32_t KOLVAVETA_OsFseek(uintptr_t file, int32_t offset, int32_t whence) {
  return std::fseek(reinterpret_cast<FILE*>(file), offset, whence);
}

VETAJ_API int32_t KOLVAVETA_OsFtell(uintptr_t file) {
  return static_cast<int32_t>(std::ftell(reinterpret_cast<FILE*>(file)));
}

VETAJ_API uint32_t KOLVAVETA_OsFread(void* buffer, uint32_t element_size, uint32_t count,
                                     uintptr_t file) {
  return static_cast<uint32_t>(
      std::fread(buffer, element_size, count, reinterpret_cast<FILE*>(file)));
}

VETAJ_API uint32_t KOLVAVETA_OsFwrite(const void* buffer, uint32_t element_size,
                                      uint32_t count, uintptr_t file) {
  return static_cast<uint32_t>(
      std::fwrite(buffer, element_size, count, reinterpret_cast<FILE*>(file)));
}

VETAJ_API uintptr_t KOLVAVETA_OpenFile(const char* path) {
  const uintptr_t f = KOLVAVETA_OsFopen(path, "rb");
  return f == 0 ? ~uintptr_t(0) : f;
}

VETAJ_API int32_t KOLVAVETA_CloseFile(uintptr_t file) { return KOLVAVETA_OsFclose(file); }

VETAJ_API int32_t KOLVAVETA_SeekFile(uintptr_t file, int32_t offset, int32_t whence) {
  (void)KOLVAVETA_OsFseek(file, offset, whence);
  return KOLVAVETA_OsFtell(file);
}

VETAJ_API uint32_t KOLVAVETA_ReadFile(uintptr_t file, void* buffer, uint32_t count) {
  return KOLVAVETA_OsFread(buffer, 1, count, file);
}

VETAJ_API int32_t KOLVAVETA_OsThreadCreate(void* (*start)(void*), void* argument,
                                           uintptr_t* thread_out) {
  pthread_attr_t attr;
  if (pthread_attr_init(&attr) != 0) return 0;
  pthread_attr_setscope(&attr, PTHREAD_SCOPE_SYSTEM);
  pthread_t thread;
  const int rc = pthread_create(&thread, &attr, start, argument);
  pthread_attr_destroy(&attr);
  if (rc != 0) return 0;
  if (thread_out != nullptr) *thread_out = static_cast<uintptr_t>(thread);
  return 1;
}

VETAJ_API int32_t KOLVAVETA_OsThreadWait(uintptr_t thread, uint32_t /*unused*/) {
  return pthread_join(static_cast<pthread_t>(thread), nullptr);
}

VETAJ_API int32_t KOLVAVETA_OsThreadMutex_Init(pthread_mutex_t* mutex,
                                               const pthread_mutexattr_t* attributes) {
  return pthread_mutex_init(mutex, attributes);
}

VETAJ_API int32_t KOLVAVETA_OsThreadMutex_Lock(pthread_mutex_t* mutex) {
  return pthread_mutex_lock(mutex);
}

VETAJ_API int32_t KOLVAVETA_OsThreadMutex_Unlock(pthread_mutex_t* mutex) {
  return pthread_mutex_unlock(mutex);
}

VETAJ_API int32_t KOLVAVETA_OsSleep(uint32_t microseconds) { return usleep(microseconds); }

VETAJ_API int32_t KOLVAVETA_OsClock(void) { return static_cast<int32_t>(std::clock()); }

VETAJ_API void KOLVAVETA_CheckExStatus(int32_t* status) {
  if (status != nullptr) *status = 0;
}

// Aligned blocks: the raw block is size + 32 bytes rounded up to 16; the
// returned address is 16-byte aligned and at least one pointer past the raw
// start, and the pointer-sized word just below it holds the raw address.
VETAJ_API void* VETA_FakeMalloc(void* /*context*/, uint32_t size) {
  const uint32_t total = (size + 32u + 15u) & ~15u;
  if (total < size) return nullptr;  // size wrapped around
  uint8_t* raw = static_cast<uint8_t*>(KOLVAVETA_OsMalloc(total));
  if (raw == nullptr) return nullptr;
  const uintptr_t aligned =
      (reinterpret_cast<uintptr_t>(raw) + sizeof(void*) + 15u) & ~uintptr_t(15);
  void** slot = reinterpret_cast<void**>(aligned) - 1;
  *slot = raw;
  return reinterpret_cast<void*>(aligned);
}

VETAJ_API void VETA_FakeFree(void* block) {
  if (block == nullptr) return;
  void* raw = *(static_cast<void**>(block) - 1);
  KOLVAVETA_OsFree(raw);
}

}  // extern "C"
