// Byte-level reading of marker segments through a StreamWindow, shared by the
// decoder's marker reader, the file-header pre-scan and the quick scanners.
#ifndef VETAJ_SYNTAX_MARKER_IO_H
#define VETAJ_SYNTAX_MARKER_IO_H

#include <cstdint>

#include "io/stream.h"

namespace vj {

// Marker codes.
constexpr uint32_t kMarkerSof0 = 0xC0;
constexpr uint32_t kMarkerSof1 = 0xC1;
constexpr uint32_t kMarkerSof2 = 0xC2;
constexpr uint32_t kMarkerDht = 0xC4;
constexpr uint32_t kMarkerSoi = 0xD8;
constexpr uint32_t kMarkerEoi = 0xD9;
constexpr uint32_t kMarkerSos = 0xDA;
constexpr uint32_t kMarkerDqt = 0xDB;
constexpr uint32_t kMarkerDnl = 0xDC;
constexpr uint32_t kMarkerDri = 0xDD;
constexpr uint32_t kMarkerApp0 = 0xE0;
constexpr uint32_t kMarkerApp1 = 0xE1;
constexpr uint32_t kMarkerApp13 = 0xED;
constexpr uint32_t kMarkerApp14 = 0xEE;
constexpr uint32_t kMarkerApp15 = 0xEF;
constexpr uint32_t kMarkerCom = 0xFE;

// Largest picture side accepted.
constexpr uint32_t kMaxImageSide = 50000;

// True for APPn, COM and DNL: segments that carry a length and are skipped.
inline bool is_skippable_segment(uint32_t code) {
  return (code >= kMarkerApp0 && code <= kMarkerApp15) || code == kMarkerCom ||
         code == kMarkerDnl;
}

// Takes `n` bytes that the caller made available with VETAJ_CheckBuffer.
inline const uint8_t* window_take(StreamWindow* w, uint32_t n) {
  const uint8_t* p = w->window + w->index;
  w->index += n;
  w->remaining -= n;
  return p;
}

// Reads a big-endian 16-bit value. False at the end of input.
bool read_be16(StreamWindow* w, uint32_t* value);

// Copies `n` bytes of input to `dst`, refilling the window as often as
// needed. False when the input ends first.
bool read_bytes(StreamWindow* w, uint8_t* dst, uint32_t n);

// Skips `n` bytes; the last of them must exist (a seek past the end of a file
// is only noticed by reading). False when the input ends first.
bool skip_bytes(StreamWindow* w, uint32_t n);

// Reads a segment length and skips the segment's remaining bytes. False for a
// length below 2 or when the input ends first.
bool skip_segment(StreamWindow* w);

// Passes over the segment of a marker that the caller does not read: table,
// restart-interval, APPn, COM and DNL segments are skipped by their length;
// every other code carries no segment. False for a bad length or when the
// input ends first.
bool pass_over(StreamWindow* w, uint32_t code);

// Reads up to and including the next marker code: bytes before a 0xFF are
// passed over and any run of 0xFF fill bytes is accepted. Returns the code,
// or -1 at the end of input.
int32_t next_marker(StreamWindow* w);

// Shared start of the scanners: checks the mode (8 or 2), then reads up to
// and including the start-of-image pair 0xFF 0xD8. False when the mode is
// wrong or the input holds no SOI.
bool scan_to_soi(StreamWindow* w, int32_t mode);

// Fixed part of a frame header: everything before the component entries.
struct FrameFields {
  uint32_t length = 0;
  uint32_t precision = 0;
  uint32_t height = 0;
  uint32_t width = 0;
  uint32_t count = 0;  // Nf
};
constexpr uint32_t kFrameFixedBytes = 8;

// Reads the fixed part of the frame header that follows an SOF marker.
// False when the input ends first.
bool read_frame_fields(StreamWindow* w, FrameFields* f);

// Splits a component's sampling byte. False unless both factors lie in 1..4.
inline bool split_sampling(uint8_t byte, uint32_t* h, uint32_t* v) {
  *h = byte >> 4;
  *v = byte & 15u;
  return *h >= 1 && *h <= 4 && *v >= 1 && *v <= 4;
}

// Size fields of a frame header read by the light scanners. The caller
// preloads width and height with its current values; they are replaced as
// soon as the header's are read, even when a later check fails.
struct FrameSize {
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t max_h = 0;  // largest sampling factors (only when asked for)
  uint32_t max_v = 0;
};

// Reads the frame header that follows an SOF marker, leaving the window after
// the segment. The length must cover the fixed part, the precision must be 8
// and both sides must lie in 1..50000. With `sampling`, the length must also
// match the component count and every sampling factor must lie in 1..4;
// max_h and max_v then receive the largest. Returns false on any failure.
bool read_frame_size(StreamWindow* w, bool sampling, FrameSize* out);

// read_frame_size without sampling, storing the size in two words of the
// caller's record (left as they are when the input ends before the size).
template <class T>
bool read_frame_size_into(StreamWindow* w, T* width, T* height) {
  FrameSize f;
  f.width = static_cast<uint32_t>(*width);
  f.height = static_cast<uint32_t>(*height);
  const bool ok = read_frame_size(w, false, &f);
  *width = static_cast<T>(f.width);
  *height = static_cast<T>(f.height);
  return ok;
}

// What a scanner's marker handler asks of the walk.
enum class Step {
  kNext,  // the marker was handled: search for the next one
  kPass,  // not handled: pass over its segment (see pass_over)
  kDone,  // finished: the walk returns 200
  kFail,  // the walk returns 201
};

// The walk shared by the light scanners: checks the mode, finds SOI, then
// hands every marker code to `handle` (uint32_t code -> Step). Input running
// out returns 201.
template <class Handler>
int32_t walk_markers(StreamWindow* w, int32_t mode, Handler handle) {
  if (!scan_to_soi(w, mode)) return kStatusFail;
  for (;;) {
    const int32_t code = next_marker(w);
    if (code < 0) return kStatusFail;
    switch (handle(static_cast<uint32_t>(code))) {
      case Step::kNext:
        break;
      case Step::kPass:
        if (!pass_over(w, static_cast<uint32_t>(code))) return kStatusFail;
        break;
      case Step::kDone:
        return kStatusOk;
      case Step::kFail:
        return kStatusFail;
    }
  }
}

}  // namespace vj

#endif  // VETAJ_SYNTAX_MARKER_IO_H
