// Building blocks shared by the inverse transforms: 32-bit wrapping
// arithmetic, the fixed-point constants and the 8- and 4-point kernels.
//
// All intermediate values are 32-bit two's-complement integers. They are
// carried in uint32_t so that overflow on hostile coefficients wraps (as the
// hardware does) instead of being undefined; right shifts that need the sign
// go through sra(). Values are converted to signed only for those shifts.
#ifndef VETAJ_RECON_IDCT_KERNELS_H
#define VETAJ_RECON_IDCT_KERNELS_H

#include <cstdint>
#include <cstring>

namespace vj::idct {

using w32 = uint32_t;  // a 32-bit two's-complement value, wrapping

// Arithmetic shift right.
inline w32 sra(w32 x, int s) { return static_cast<w32>(static_cast<int32_t>(x) >> s); }

// Coefficient times its dequantisation multiplier (32-bit product).
inline w32 dequant(int16_t coef, uint32_t mult) {
  return static_cast<w32>(static_cast<int32_t>(coef)) * mult;
}

// 13-bit fixed-point constants, round(c x 8192).
constexpr w32 fix(int32_t c) { return static_cast<w32>(c); }
constexpr w32 kFix_0_298631336 = fix(2446);
constexpr w32 kFix_0_390180644 = fix(3196);
constexpr w32 kFix_0_541196100 = fix(4433);
constexpr w32 kFix_0_765366865 = fix(6270);
constexpr w32 kFix_0_899976223 = fix(7373);
constexpr w32 kFix_1_175875602 = fix(9633);
constexpr w32 kFix_1_501321110 = fix(12299);
constexpr w32 kFix_1_847759065 = fix(15137);
constexpr w32 kFix_1_961570560 = fix(16069);
constexpr w32 kFix_2_053119869 = fix(16819);
constexpr w32 kFix_2_562915447 = fix(20995);
constexpr w32 kFix_3_072711026 = fix(25172);
constexpr int kConstBits = 13;

// c ? a : b without a branch, for choices that vary unpredictably from
// block to block.
inline w32 pick(bool c, w32 a, w32 b) {
  const w32 m = 0u - static_cast<w32>(c);
  return (a & m) | (b & ~m);
}

// Final sample lookup: the value shifted right by s, masked to 10 bits, in
// the table's centre. For s <= 22 the low 10 bits of a logical and an
// arithmetic shift agree, so the unsigned shift is exact.
inline uint8_t sample(const uint8_t* centre, w32 x, int s) { return centre[(x >> s) & 1023u]; }

// The 8 outputs of a kernel before descaling.
struct Out8 {
  w32 v[8];
};

// 8-point kernel on inputs i0..i7. `dc_bias` is added to i0 before the
// even part and `round` to tmp0/tmp1 after scaling: the first pass uses
// (0, 1 << 10) and the second pass (16, 0) so that both rounding terms are
// in place for the shifts by 11 and 18. Outputs are in sample order.
inline Out8 kernel8(w32 i0, w32 i1, w32 i2, w32 i3, w32 i4, w32 i5, w32 i6, w32 i7, w32 dc_bias,
                    w32 round) {
  // Even part.
  w32 z1 = (i2 + i6) * kFix_0_541196100;
  const w32 tmp2 = z1 - i6 * kFix_1_847759065;
  const w32 tmp3 = z1 + i2 * kFix_0_765366865;
  const w32 dc = i0 + dc_bias;
  const w32 tmp0 = ((dc + i4) << kConstBits) + round;
  const w32 tmp1 = ((dc - i4) << kConstBits) + round;
  const w32 tmp10 = tmp0 + tmp3;
  const w32 tmp13 = tmp0 - tmp3;
  const w32 tmp11 = tmp1 + tmp2;
  const w32 tmp12 = tmp1 - tmp2;

  // Odd part: t0..t3 are inputs 7, 5, 3, 1.
  z1 = i7 + i1;
  w32 z2 = i5 + i3;
  w32 z3 = i7 + i3;
  w32 z4 = i5 + i1;
  const w32 z5 = (z3 + z4) * kFix_1_175875602;
  w32 o0 = i7 * kFix_0_298631336;
  w32 o1 = i5 * kFix_2_053119869;
  w32 o2 = i3 * kFix_3_072711026;
  w32 o3 = i1 * kFix_1_501321110;
  z1 *= fix(-7373);            // -0.899976223
  z2 *= fix(-20995);           // -2.562915447
  z3 = z3 * fix(-16069) + z5;  // -1.961570560
  z4 = z4 * fix(-3196) + z5;   // -0.390180644
  o0 += z1 + z3;
  o1 += z2 + z4;
  o2 += z2 + z3;
  o3 += z1 + z4;

  return Out8{{tmp10 + o3, tmp11 + o2, tmp12 + o1, tmp13 + o0, tmp13 - o0, tmp12 - o1, tmp11 - o2,
               tmp10 - o3}};
}

// Odd half of the 4-point kernel: p and q from inputs e1 and e3, with
// `round` added to the shared product.
struct Odd4 {
  w32 p, q;
};
inline Odd4 odd4(w32 e1, w32 e3, w32 round) {
  const w32 z1 = (e1 + e3) * kFix_0_541196100 + round;
  return Odd4{z1 + e1 * kFix_0_765366865, z1 - e3 * kFix_1_847759065};
}

// One column of the 8-point first pass: column c of the block, of whose
// rows only the first R can be non-zero, into ws[r * stride] for r = 0..7.
// A column whose AC coefficients are all zero (tested on the coefficients,
// not the products) takes the DC value times 4 in every row.
template <int R>
inline void column8(const uint32_t* mult, const int16_t* coef, int c, w32* ws, int stride) {
  static_assert(R >= 1 && R <= 8);
  const w32 d0 = dequant(coef[c], mult[c]);
  int ac = 0;
  for (int r = 1; r < R; ++r) ac |= coef[8 * r + c];
  if (ac == 0) {
    for (int r = 0; r < 8; ++r) ws[r * stride] = d0 << 2;
    return;
  }
  auto d = [&](int r) -> w32 { return r < R ? dequant(coef[8 * r + c], mult[8 * r + c]) : 0; };
  const Out8 o = kernel8(d0, d(1), d(2), d(3), d(4), d(5), d(6), d(7), 0, 1u << 10);
  for (int r = 0; r < 8; ++r) ws[r * stride] = sra(o.v[r], 11);
}

// One row of the 8-point second pass: w[0..C-1] (the rest known zero) to 8
// samples.
template <int C>
inline void row8(const uint8_t* centre, const w32* w, uint8_t* out) {
  static_assert(C >= 1 && C <= 8);
  auto v = [&](int c) -> w32 { return c < C ? w[c] : 0; };
  const Out8 o = kernel8(w[0], v(1), v(2), v(3), v(4), v(5), v(6), v(7), 16, 0);
  for (int k = 0; k < 8; ++k) out[k] = sample(centre, o.v[k], 18);
}

// Fills a w x h block of one value.
inline void fill_block(uint8_t** rows, uint32_t col, uint8_t value, int w, int h) {
  for (int r = 0; r < h; ++r) std::memset(rows[r] + col, value, static_cast<size_t>(w));
}

}  // namespace vj::idct

#endif  // VETAJ_RECON_IDCT_KERNELS_H
