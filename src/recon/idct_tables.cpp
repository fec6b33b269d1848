// Sample range-limit tables and the AAN scale factors of the transforms.
#include <cstring>

#include "recon/idct.h"

namespace {

// Region sizes of the range-limit table, in order.
constexpr uint32_t kLowZeros = 256;         // below the identity part
constexpr uint32_t kIdentity = 256;         // 0..255
constexpr uint32_t kHighSaturate = 384;     // positive overflow: 255
constexpr uint32_t kWrappedZeros = 384;     // negative overflow after the 10-bit wrap: 0
constexpr uint32_t kWrappedIdentity = 128;  // transform outputs -128..-1: 0..127
static_assert(kLowZeros + kIdentity + kHighSaturate + kWrappedZeros + kWrappedIdentity ==
              kRangeLimitBytes);
static_assert(kRangeLimitIdentityOffset == kLowZeros);
static_assert(kRangeLimitCentreOffset == kLowZeros + 128);
// Every 10-bit index from the centre stays inside the table.
static_assert(kRangeLimitCentreOffset + 1023 < kRangeLimitBytes);

}  // namespace

uint8_t* vj_fill_range_limit(uint8_t* table) {
  uint8_t* p = table;
  std::memset(p, 0, kLowZeros);
  p += kLowZeros;
  for (uint32_t i = 0; i < kIdentity; ++i) p[i] = static_cast<uint8_t>(i);
  p += kIdentity;
  std::memset(p, 255, kHighSaturate);
  p += kHighSaturate;
  std::memset(p, 0, kWrappedZeros);
  p += kWrappedZeros;
  for (uint32_t i = 0; i < kWrappedIdentity; ++i) p[i] = static_cast<uint8_t>(i);
  return table + kRangeLimitIdentityOffset;
}

uint8_t vj_chroma_compress(uint32_t v) {
  if (v < 16) return 23;
  if (v > 240) return 233;
  // Division of a signed value truncates toward zero.
  return static_cast<uint8_t>(128 + (static_cast<int32_t>(v) - 128) * 120 / 128);
}

uint8_t* vj_fill_range_limit_chroma(uint8_t* table) {
  vj_fill_range_limit(table);
  for (uint32_t i = 0; i < kRangeLimitBytes; ++i) table[i] = vj_chroma_compress(table[i]);
  return table + kRangeLimitIdentityOffset;
}

const uint16_t kAanScale[64] = {16384, 22725, 21407, 19266, 16384, 12873, 8867,  4520,  //
                                22725, 31521, 29692, 26722, 22725, 17855, 12299, 6270,  //
                                21407, 29692, 27969, 25172, 21407, 16819, 11585, 5906,  //
                                19266, 26722, 25172, 22654, 19266, 15137, 10426, 5315,  //
                                16384, 22725, 21407, 19266, 16384, 12873, 8867,  4520,  //
                                12873, 17855, 16819, 15137, 12873, 10114, 6967,  3552,  //
                                8867,  12299, 11585, 10426, 8867,  6967,  4799,  2446,  //
                                4520,  6270,  5906,  5315,  4520,  3552,  2446,  1247};

void vj_build_aan_multipliers(const uint16_t quant[64], uint32_t out[64]) {
  // 65535 x 31521 < 2^32: the product cannot overflow.
  for (int i = 0; i < 64; ++i) out[i] = (static_cast<uint32_t>(quant[i]) * kAanScale[i]) >> 2;
}
