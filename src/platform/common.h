// Internal definitions shared by every stage of the decoder: status words,
// small allocation helpers and a scope guard for leak-free early returns.
#ifndef VETAJ_PLATFORM_COMMON_H
#define VETAJ_PLATFORM_COMMON_H

#include <cstddef>
#include <cstdint>
#include <utility>

#include "VetaJpegDecoder.h"

namespace vj {

// Status words of the internal steps.
constexpr int32_t kStatusNextRow = 100;   // iMCU row decoded, more follow
constexpr int32_t kStatusEnd = 101;       // end of image or region
constexpr int32_t kStatusCorrupt = 102;   // corrupt entropy data
constexpr int32_t kStatusOk = 200;
constexpr int32_t kStatusFail = 201;
constexpr int32_t kStatusSos = 0xDA;      // start of scan reached
constexpr int32_t kStatusCancelled = 6;

constexpr uint32_t kWindowSize = KOLVAVETA_WINDOW_SIZE;

// Input kinds.
constexpr int32_t kIoFilePath = 0;
constexpr int32_t kIoMemory = 1;
constexpr int32_t kIoFileHandle = 2;
constexpr int32_t kIoStream = 4;
constexpr int32_t kIoMemoryOwned = 5;

// Most bytes held through the allocation wrappers since the last reset.
size_t allocation_peak();
void reset_allocation_peak();

// Sets the process-wide error word.
inline void set_error(int32_t code) { gKOLVAVETA_Error = code; }

// Zeroed allocation of one T through the platform allocator.
template <class T>
T* alloc_zeroed(uint32_t count = 1) {
  const uint32_t bytes = static_cast<uint32_t>(sizeof(T)) * count;
  void* p = KOLVAVETA_OsMalloc(bytes);
  if (p != nullptr) KOLVAVETA_OsMemset(p, 0, bytes);
  return static_cast<T*>(p);
}

// Zeroed 16-byte-aligned allocation through VETA_FakeMalloc.
template <class T>
T* fake_alloc_zeroed(uint32_t count = 1) {
  const uint32_t bytes = static_cast<uint32_t>(sizeof(T)) * count;
  void* p = VETA_FakeMalloc(nullptr, bytes);
  if (p != nullptr) KOLVAVETA_OsMemset(p, 0, bytes);
  return static_cast<T*>(p);
}

// Frees *p with KOLVAVETA_OsFree and clears it.
template <class T>
void os_free(T*& p) {
  if (p != nullptr) KOLVAVETA_OsFree(const_cast<void*>(static_cast<const void*>(p)));
  p = nullptr;
}

// Frees *p with VETA_FakeFree and clears it.
template <class T>
void fake_free(T*& p) {
  if (p != nullptr) VETA_FakeFree(const_cast<void*>(static_cast<const void*>(p)));
  p = nullptr;
}

// Runs a callable when leaving scope unless dismissed.
template <class F>
class ScopeGuard {
 public:
  explicit ScopeGuard(F f) : f_(std::move(f)) {}
  ScopeGuard(const ScopeGuard&) = delete;
  ScopeGuard& operator=(const ScopeGuard&) = delete;
  ~ScopeGuard() {
    if (active_) f_();
  }
  void dismiss() { active_ = false; }

 private:
  F f_;
  bool active_ = true;
};

template <class F>
ScopeGuard<F> on_exit(F f) {
  return ScopeGuard<F>(std::move(f));
}

// Big-endian reads from a byte pointer.
inline uint32_t be16(const uint8_t* p) { return (uint32_t(p[0]) << 8) | p[1]; }
inline uint32_t be32(const uint8_t* p) {
  return (uint32_t(p[0]) << 24) | (uint32_t(p[1]) << 16) | (uint32_t(p[2]) << 8) | p[3];
}
inline uint32_t le16(const uint8_t* p) { return (uint32_t(p[1]) << 8) | p[0]; }
inline uint32_t le32(const uint8_t* p) {
  return (uint32_t(p[3]) << 24) | (uint32_t(p[2]) << 16) | (uint32_t(p[1]) << 8) | p[0];
}

}  // namespace vj

#endif  // VETAJ_PLATFORM_COMMON_H
