// Byte-level reading of marker segments through a StreamWindow.
#include "syntax/marker_io.h"

#include <cstring>

namespace vj {

bool read_be16(StreamWindow* w, uint32_t* value) {
  if (VETAJ_CheckBuffer(w, 2) == 0) return false;
  *value = be16(window_take(w, 2));
  return true;
}

bool read_bytes(StreamWindow* w, uint8_t* dst, uint32_t n) {
  while (n > 0) {
    if (w->remaining == 0 && VETAJ_CheckBuffer(w, 1) == 0) return false;
    const uint32_t k = n < w->remaining ? n : w->remaining;
    std::memcpy(dst, window_take(w, k), k);
    dst += k;
    n -= k;
  }
  return true;
}

bool skip_bytes(StreamWindow* w, uint32_t n) {
  if (n == 0) return true;
  if (!window_skip(w, n - 1)) return false;
  return window_byte(w) >= 0;
}

bool skip_segment(StreamWindow* w) {
  uint32_t length = 0;
  if (!read_be16(w, &length) || length < 2) return false;
  return skip_bytes(w, length - 2);
}

bool pass_over(StreamWindow* w, uint32_t code) {
  const bool segment = code == kMarkerDht || code == kMarkerDqt || code == kMarkerDri ||
                       is_skippable_segment(code);
  return !segment || skip_segment(w);
}

int32_t next_marker(StreamWindow* w) {
  for (;;) {
    int32_t b = window_byte(w);
    if (b < 0) return -1;
    if (b != 0xFF) continue;
    do {
      b = window_byte(w);
      if (b < 0) return -1;
    } while (b == 0xFF);
    return b;
  }
}

bool scan_to_soi(StreamWindow* w, int32_t mode) {
  if (mode != 8 && mode != 2) return false;
  if (VETAJ_CheckBuffer(w, 1) == 0) return false;
  int32_t previous = -1;
  for (;;) {
    const int32_t b = window_byte(w);
    if (b < 0) return false;
    if (previous == 0xFF && b == static_cast<int32_t>(kMarkerSoi)) return true;
    previous = b;
  }
}

bool read_frame_fields(StreamWindow* w, FrameFields* f) {
  if (VETAJ_CheckBuffer(w, kFrameFixedBytes) == 0) return false;
  const uint8_t* p = window_take(w, kFrameFixedBytes);
  f->length = be16(p);
  f->precision = p[2];
  f->height = be16(p + 3);
  f->width = be16(p + 5);
  f->count = p[7];
  return true;
}

bool read_frame_size(StreamWindow* w, bool sampling, FrameSize* out) {
  FrameFields f;
  if (!read_frame_fields(w, &f)) return false;
  out->height = f.height;
  out->width = f.width;
  if (f.length < kFrameFixedBytes || f.precision != 8) return false;
  if (f.height < 1 || f.height > kMaxImageSide) return false;
  if (f.width < 1 || f.width > kMaxImageSide) return false;
  if (!sampling) return skip_bytes(w, f.length - kFrameFixedBytes);

  // The whole segment is brought into the window before its entries are read.
  if (f.length != 3 * f.count + kFrameFixedBytes) return false;
  if (f.count == 0) return true;
  if (VETAJ_CheckBuffer(w, 3 * f.count) == 0) return false;
  const uint8_t* c = window_take(w, 3 * f.count);
  for (uint32_t i = 0; i < f.count; ++i) {
    uint32_t h = 0, v = 0;
    if (!split_sampling(c[3 * i + 1], &h, &v)) return false;
    if (h > out->max_h) out->max_h = h;
    if (v > out->max_v) out->max_v = v;
  }
  return true;
}

}  // namespace vj
