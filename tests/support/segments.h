// Hand-built JPEG byte streams and input sources for the syntax tests.
#ifndef VETAJ_TESTS_SUPPORT_SEGMENTS_H
#define VETAJ_TESTS_SUPPORT_SEGMENTS_H

#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "io/stream.h"
#include "support/files.h"

namespace vjtest {

using Bytes = std::vector<uint8_t>;

// Appends a big-endian 16-bit / 32-bit value.
void put16(Bytes* b, uint32_t v);
void put32(Bytes* b, uint32_t v);

struct FrameComp {
  uint8_t id, h, v, tq;
};
struct ScanComp {
  uint8_t id, tables;  // tables: DC number in the high nibble, AC in the low
};

// Builds a stream segment by segment.
class JpegBuilder {
 public:
  JpegBuilder& raw(const Bytes& bytes);
  JpegBuilder& soi() { return raw({0xFF, 0xD8}); }
  JpegBuilder& eoi() { return raw({0xFF, 0xD9}); }
  // 0xFF code, a length of payload + 2, the payload.
  JpegBuilder& segment(uint8_t code, const Bytes& payload);
  JpegBuilder& sof(uint8_t code, uint32_t width, uint32_t height,
                   const std::vector<FrameComp>& comps, uint8_t precision = 8);
  // One 8-bit table whose k-th value in zig-zag order is first + k.
  JpegBuilder& dqt(uint8_t number, uint8_t first = 1);
  // One table definition: class/number byte, counts[16], symbols.
  JpegBuilder& dht(uint8_t class_number, const Bytes& counts, const Bytes& symbols);
  JpegBuilder& dri(uint32_t interval);
  JpegBuilder& sos(const std::vector<ScanComp>& comps, uint8_t ss = 0, uint8_t se = 63,
                   uint8_t ahal = 0);
  JpegBuilder& com(uint32_t payload_bytes, uint8_t fill = 0x20);
  const Bytes& bytes() const { return bytes_; }
  size_t size() const { return bytes_.size(); }

 private:
  Bytes bytes_;
};

// DHT payload of one table (for building multi-table segments).
Bytes dht_table(uint8_t class_number, const Bytes& counts, const Bytes& symbols);

// A syntactically complete baseline stream: SOI, DQT, SOF0 (three components,
// the first sampled h x v), DHT, optional DRI, SOS, a few entropy bytes, EOI.
Bytes small_baseline(uint32_t width, uint32_t height, uint8_t h = 2, uint8_t v = 2,
                     uint32_t restart = 0);
// The same frame as a progressive stream with a DC scan and one AC scan.
Bytes small_progressive(uint32_t width, uint32_t height);

// Runs fn(StreamWindow*) on a fresh window over a memory stream of `bytes`
// and returns its result, or -1 when the stream cannot be opened.
template <class F>
int32_t on_memory_window(const Bytes& bytes, F fn) {
  IoStream* s = KOLVAVETA_Open_IO(1, const_cast<uint8_t*>(bytes.data()),
                                  static_cast<uint32_t>(bytes.size()));
  if (s == nullptr) return -1;
  StreamWindow w;
  vj::window_open(&w, s);
  const int32_t result = fn(&w);
  vj::window_close(&w);
  KOLVAVETA_Close_IO(s);
  return result;
}

// Lengths at which truncation sweeps cut a stream of `size` bytes: every
// length up to `dense`, then a spread of lengths up to the whole, and the
// last few.
std::vector<size_t> cut_lengths(size_t size, size_t dense = 700, size_t spread = 60);

// A caller stream over a byte vector, reached through the three callbacks.
struct CallbackSource {
  Bytes data;
  uint32_t pos = 0;
  static int32_t read(void* self, void* buffer, uint32_t count);
  static int32_t skip(void* self, void* buffer, uint32_t count);
  static int32_t rewind(void* self, void* buffer, uint32_t count);
};

// The input kinds a decoder object can be created on.
enum class InputKind { kPath, kHandle, kMemory, kOwnedMemory, kStream };
const char* input_kind_name(InputKind kind);

// Creates a DecInfo of the given kind over `bytes` and keeps alive what it
// reads from (temporary file, handle, memory block, callback source).
class InputHolder {
 public:
  InputHolder(InputKind kind, const Bytes& bytes, int32_t output_format = 7);
  ~InputHolder();
  InputHolder(const InputHolder&) = delete;
  InputHolder& operator=(const InputHolder&) = delete;
  DecInfo* object() const { return object_; }

 private:
  Bytes bytes_;
  std::unique_ptr<TempFile> file_;
  FILE* handle_ = nullptr;
  CallbackSource source_;
  DecInfo* object_ = nullptr;
};

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_SEGMENTS_H
