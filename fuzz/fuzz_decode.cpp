// libFuzzer harness: decodes arbitrary bytes as a JPEG in several formats,
// sizes and modes, through a memory input and a caller stream. Any crash,
// out-of-bounds access or leak is a finding; results are ignored.
#include <cstdint>
#include <cstring>
#include <vector>

#include "VetaJpegDecoder.h"

namespace {

struct Source {
  const uint8_t* data;
  size_t size;
  size_t pos;
};

int32_t read_cb(void* s, void* buf, uint32_t n) {
  auto* src = static_cast<Source*>(s);
  const size_t k = n < src->size - src->pos ? n : src->size - src->pos;
  std::memcpy(buf, src->data + src->pos, k);
  src->pos += k;
  return static_cast<int32_t>(k);
}
int32_t skip_cb(void* s, void*, uint32_t n) {
  auto* src = static_cast<Source*>(s);
  src->pos = n < src->size - src->pos ? src->pos + n : src->size;
  return static_cast<int32_t>(src->pos);
}
int32_t rewind_cb(void* s, void*, uint32_t) {
  static_cast<Source*>(s)->pos = 0;
  return 0;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 4 || size > (1u << 20)) return 0;
  // The first byte picks the request; the rest is the input.
  const uint8_t pick = data[0];
  const uint8_t* jpeg = data + 1;
  const uint32_t n = static_cast<uint32_t>(size - 1);
  static const int32_t kFormats[] = {0, 2, 5, 7, 8, 1};
  static const int32_t kSizes[][2] = {{64, 48}, {17, 9}, {200, 150}, {8, 8}};
  const int32_t format = kFormats[pick % 6];
  const int32_t* wh = kSizes[(pick / 6) % 4];
  const uint32_t options = static_cast<uint32_t>((pick & 0x3) | ((pick >> 2) & 0xC) |
                                                 ((pick & 0x40) ? 0x300u : 0u) |
                                                 ((pick & 0x80) ? 0x1000u : 0u));
  std::vector<uint8_t> out(size_t(wh[0]) * wh[1] * 4);
  DecInfo* o = nullptr;
  Source src{jpeg, n, 0};
  if ((pick & 0x20) != 0) {
    o = KOLVAVETA_CreateDecInfoWithStream(&src, n, read_cb, skip_cb, rewind_cb, format, options);
  } else {
    o = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg), n, format, options);
  }
  if (o == nullptr) return 0;
  KOLVAVETA_SetDecMode(o, pick % 5);
  JpegInfo info;
  (void)KOLVAVETA_Parser(o, &info);
  (void)KOLVAVETA_DecodeJPEG(o, out.data(), wh[0], wh[1]);
  KOLVAVETA_DestroyJpegInfo(o);
  KOLVAVETA_DestroyDecInfo(o);
  return 0;
}
