// The byte window through which every parser and decoder reads an input.
#ifndef VETAJ_IO_STREAM_H
#define VETAJ_IO_STREAM_H

#include <cstdint>

#include "platform/common.h"

// A window of at most 16384 bytes over an IoStream. Consumers take bytes at
// window[index], increment index and decrement remaining, and call
// VETAJ_CheckBuffer(window, n) before they need n more bytes.
struct StreamWindow {
  IoStream* stream;   // the input read from
  uint32_t consumed;  // input position just past the last byte brought in
  uint32_t size;      // copy of the stream's size
  uint32_t index;     // offset in the window of the next byte to read
  uint32_t remaining; // bytes left in the window from index onwards
  uint8_t* window;    // first byte of the window (memory inputs: inside the block)
  uint8_t* buffer;    // the window buffer this window owns (freed by its owner), or
                      // the caller's block for memory inputs of kind 1
};

// Window buffer for a new StreamWindow: the caller's block for kind 1,
// otherwise a fresh 16384-byte block (null on failure).
uint8_t* VETAJ_AllocateStreamBuffer(IoStream* stream);
// Frees a buffer from VETAJ_AllocateStreamBuffer unless the stream is of kind 1.
void VETAJ_ReleaseStreamBuffer(IoStream* stream, uint8_t* buffer);
// Ensures `need` bytes are in the window. Returns 2 when they already were,
// 1 after a refill that brought them in, 0 when they cannot be had.
int32_t VETAJ_CheckBuffer(StreamWindow* window, uint32_t need);

namespace vj {

// Sets up an empty window on `stream` with a buffer from
// VETAJ_AllocateStreamBuffer. Returns false (and sets error 4) when the
// buffer cannot be allocated.
bool window_open(StreamWindow* w, IoStream* stream);
// Releases the window's buffer.
void window_close(StreamWindow* w);
// Drops the window's content (the next read refills it).
inline void window_empty(StreamWindow* w) {
  w->index = 0;
  w->remaining = 0;
}
// Seeks the stream to an absolute position and empties the window. Returns
// false when the stream refuses the seek.
bool window_seek(StreamWindow* w, uint32_t position);
// Absolute input position of the next unread byte of the window.
inline uint32_t window_tell(const StreamWindow* w) { return w->consumed - w->remaining; }
// Reads one byte (refilling as needed). Returns -1 at the end of input.
inline int32_t window_byte(StreamWindow* w) {
  if (w->remaining == 0 && VETAJ_CheckBuffer(w, 1) == 0) return -1;
  --w->remaining;
  return w->window[w->index++];
}
// Skips `count` bytes: inside the window when they are there, otherwise by
// seeking the stream forward. Returns false when the input ends first.
bool window_skip(StreamWindow* w, uint32_t count);

}  // namespace vj

#endif  // VETAJ_IO_STREAM_H
