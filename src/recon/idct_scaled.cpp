// Reduced and rectangular inverse transforms: 4x4, 2x2 and 1x1 for the 1/2,
// 1/4 and 1/8 scales, the mixed sizes of the per-component scaled mode and
// the 3x3 transform of the 3/8 scale.
#include "recon/idct.h"
#include "recon/idct_kernels.h"

namespace vj::idct {
namespace {

// --- 4-point passes of the rectangular sizes ---

// First pass over rows 0..3 of column c into ws[r * stride]:
// E, F = (e0 +- e2) << e_shift; p, q = odd4(e1, e3, round) >> pq_shift;
// rows E + p, F + q, F - q, E - p.
inline void column4(const uint32_t* mult, const int16_t* coef, int c, w32* ws, int stride,
                    int e_shift, w32 round, int pq_shift) {
  const w32 e0 = dequant(coef[c], mult[c]);
  const w32 e1 = dequant(coef[8 + c], mult[8 + c]);
  const w32 e2 = dequant(coef[16 + c], mult[16 + c]);
  const w32 e3 = dequant(coef[24 + c], mult[24 + c]);
  const w32 e = (e0 + e2) << e_shift;
  const w32 f = (e0 - e2) << e_shift;
  const Odd4 o = odd4(e1, e3, round);
  const w32 p = sra(o.p, pq_shift);
  const w32 q = sra(o.q, pq_shift);
  ws[0] = e + p;
  ws[stride] = f + q;
  ws[2 * stride] = f - q;
  ws[3 * stride] = e - p;
}

// Second pass of one workspace row w[0..3] into 4 samples:
// E, F = (w0 + bias +- w2) << 13, samples out(E + p, F + q, F - q, E - p).
inline void row4(const uint8_t* centre, const w32* w, w32 bias, int shift, uint8_t* out) {
  const w32 e = (w[0] + bias + w[2]) << kConstBits;
  const w32 f = (w[0] + bias - w[2]) << kConstBits;
  const Odd4 o = odd4(w[1], w[3], 0);
  out[0] = sample(centre, e + o.p, shift);
  out[1] = sample(centre, f + o.q, shift);
  out[2] = sample(centre, f - o.q, shift);
  out[3] = sample(centre, e - o.p, shift);
}

// --- Reduced square transforms ---

// 4 outputs of the 1/2-scale kernel from inputs 0..3 and 5..7 (input 4 is
// not used); `t0` is input 0 already scaled and rounded.
struct Out4 {
  w32 v0, v1, v2, v3;
};
inline Out4 kernel4x4(w32 t0, w32 i1, w32 i2, w32 i3, w32 i5, w32 i6, w32 i7) {
  const w32 t2 = i2 * kFix_1_847759065 - i6 * kFix_0_765366865;
  const w32 t10 = t0 + t2;
  const w32 t12 = t0 - t2;
  const w32 a = i7 * fix(-1730) + i5 * fix(11893) + i3 * fix(-17799) + i1 * fix(8697);
  const w32 b = i7 * fix(-4176) + i5 * fix(-4926) + i3 * fix(7373) + i1 * fix(20995);
  return Out4{t10 + b, t12 + a, t12 - a, t10 - b};
}

// Odd sum of the 1/4-scale kernel from inputs 1, 3, 5, 7.
inline w32 odd2x2(w32 i1, w32 i3, w32 i5, w32 i7) {
  return i1 * fix(29692) + i3 * fix(-10426) + i5 * fix(6967) + i7 * fix(-5906);
}

}  // namespace
}  // namespace vj::idct

using namespace vj::idct;

namespace {

// The 4x4 transform reads rows and columns 0..3 and 5..7. A block whose
// coefficients all lie in rows 0..kMaxRow and columns 0..kMaxCol is
// transformed reading only those, the rest taken as zero: zig-zag positions
// up to 18 (all the 1/2 decoder keeps) lie in rows 0..4 and columns 0..5,
// positions up to 5 in rows and columns 0..2.
template <int kMaxCol, int kMaxRow>
inline void idct_4x4(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                     uint8_t** rows, uint32_t col) {
  w32 ws[4][8];  // column 4 is not used
  for (int c = 0; c <= kMaxCol; ++c) {
    if (c == 4) continue;
    auto q = [&](int r) -> int32_t { return r > kMaxRow ? 0 : coef[8 * r + c]; };
    auto d = [&](int r) -> w32 {
      return r > kMaxRow ? 0 : dequant(coef[8 * r + c], mult[8 * r + c]);
    };
    if ((q(1) | q(2) | q(3) | q(5) | q(6) | q(7)) == 0) {
      const w32 dc = d(0) << 2;
      for (int r = 0; r < 4; ++r) ws[r][c] = dc;
      continue;
    }
    const Out4 o = kernel4x4(d(0) << 14, d(1), d(2), d(3), d(5), d(6), d(7));
    ws[0][c] = sra(o.v0 + 2048, 12);
    ws[1][c] = sra(o.v1 + 2048, 12);
    ws[2][c] = sra(o.v2 + 2048, 12);
    ws[3][c] = sra(o.v3 + 2048, 12);
  }
  // A row without other terms comes out as (w0 + 16) >> 5 either way: the
  // 10 bits kept of ((w0 << 14) + (1 << 18)) >> 19 are those of
  // (w0 + 16) >> 5.
  for (int r = 0; r < 4; ++r) {
    auto w = [&](int c) -> w32 { return c > kMaxCol ? 0 : ws[r][c]; };
    uint8_t* out = rows[r] + col;
    const Out4 o = kernel4x4((w(0) << 14) + (1u << 18), w(1), w(2), w(3), w(5), w(6), w(7));
    out[0] = sample(centre, o.v0, 19);
    out[1] = sample(centre, o.v1, 19);
    out[2] = sample(centre, o.v2, 19);
    out[3] = sample(centre, o.v3, 19);
  }
}

}  // namespace

void VETAJ_DoIdct_4x4(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  idct_4x4<7, 7>(centre, mult, coef, rows, col);
}

void vj_idct_4x4_low(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                     uint8_t** rows, uint32_t col) {
  idct_4x4<5, 4>(centre, mult, coef, rows, col);
}

void vj_idct_4x4_lower(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                       uint8_t** rows, uint32_t col) {
  idct_4x4<2, 2>(centre, mult, coef, rows, col);
}

namespace {

// The 2x2 transform reads columns and rows 0, 1, 3, 5 and 7. A block whose
// coefficients end by zig-zag position 4 has nothing outside rows and
// columns 0..2 (and row or column 2 is not read): kLow reads only the
// first two rows and columns and takes the rest as zero.
template <bool kLow>
inline void idct_2x2(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                     uint8_t** rows, uint32_t col) {
  static constexpr int kUsed[5] = {0, 1, 3, 5, 7};
  constexpr int kColumns = kLow ? 2 : 5;
  w32 ws[2][8] = {};  // columns 2, 4 and 6 are not used
  for (int i = 0; i < kColumns; ++i) {
    const int c = kUsed[i];
    auto q = [&](int r) -> int32_t { return kLow && r > 1 ? 0 : coef[8 * r + c]; };
    auto d = [&](int r) -> w32 {
      return kLow && r > 1 ? 0 : dequant(coef[8 * r + c], mult[8 * r + c]);
    };
    // Selected rather than branched on: blocks mix both kinds unpredictably.
    const bool flat = (q(1) | q(3) | q(5) | q(7)) == 0;
    const w32 t10 = (d(0) << 15) + 4096;
    const w32 t0 = odd2x2(d(1), d(3), d(5), d(7));
    ws[0][c] = pick(flat, d(0) << 2, sra(t10 + t0, 13));
    ws[1][c] = pick(flat, d(0) << 2, sra(t10 - t0, 13));
  }
  // A row without odd terms comes out as (w0 + 16) >> 5 either way: the
  // 10 bits kept of ((w0 + 16) << 15) >> 20 are those of (w0 + 16) >> 5.
  for (int r = 0; r < 2; ++r) {
    const w32* w = ws[r];
    uint8_t* out = rows[r] + col;
    const w32 t10 = (w[0] << 15) + (1u << 19);
    const w32 t0 = odd2x2(w[1], w[3], w[5], w[7]);
    out[0] = sample(centre, t10 + t0, 20);
    out[1] = sample(centre, t10 - t0, 20);
  }
}

}  // namespace

void VETAJ_DoIdct_2x2(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  idct_2x2<false>(centre, mult, coef, rows, col);
}

void vj_idct_2x2_low(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                     uint8_t** rows, uint32_t col) {
  idct_2x2<true>(centre, mult, coef, rows, col);
}

void VETAJ_DoIdct_1x1(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  vj_idct_1x1(centre, mult, coef, rows, col);
}

// --- Rectangular sizes ---

void VETAJ_DoIdct_8x4(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  w32 ws[4 * 8];
  for (int c = 0; c < 8; ++c) column4(mult, coef, c, ws + c, 8, 2, 1u << 10, 11);
  for (int r = 0; r < 4; ++r) row8<8>(centre, ws + 8 * r, rows[r] + col);
}

void VETAJ_DoIdct_4x8(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  w32 ws[8 * 4];
  for (int c = 0; c < 4; ++c) column8<8>(mult, coef, c, ws + c, 4);
  for (int r = 0; r < 8; ++r) row4(centre, ws + 4 * r, 16, 18, rows[r] + col);
}

void VETAJ_DoIdct_4x2(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  w32 ws[2 * 4];
  for (int c = 0; c < 4; ++c) {
    const w32 d0 = dequant(coef[c], mult[c]);
    const w32 d1 = dequant(coef[8 + c], mult[8 + c]);
    ws[c] = d0 + d1;
    ws[4 + c] = d0 - d1;
  }
  for (int r = 0; r < 2; ++r) row4(centre, ws + 4 * r, 4, 16, rows[r] + col);
}

void VETAJ_DoIdct_2x4(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  w32 ws[4 * 2];
  for (int c = 0; c < 2; ++c) column4(mult, coef, c, ws + c, 2, kConstBits, 0, 0);
  for (int r = 0; r < 4; ++r) {
    const w32 a = ws[2 * r] + (1u << 15);
    uint8_t* out = rows[r] + col;
    out[0] = sample(centre, a + ws[2 * r + 1], 16);
    out[1] = sample(centre, a - ws[2 * r + 1], 16);
  }
}

namespace {

// Two samples from the DC and one first-order coefficient (natural index
// `second`): side by side (2x1, second = 1) or one above the other (1x2,
// second = 8).
template <int kSecond>
void idct_pair(const uint8_t* centre, const uint32_t* mult, const int16_t* coef, uint8_t** rows,
               uint32_t col) {
  const w32 a = dequant(coef[0], mult[0]) + 4;
  const w32 b = dequant(coef[kSecond], mult[kSecond]);
  const uint8_t s0 = sample(centre, a + b, 3);
  const uint8_t s1 = sample(centre, a - b, 3);
  if constexpr (kSecond == 1) {
    rows[0][col] = s0;
    rows[0][col + 1] = s1;
  } else {
    rows[0][col] = s0;
    rows[1][col] = s1;
  }
}

}  // namespace

void VETAJ_DoIdct_2x1(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  idct_pair<1>(centre, mult, coef, rows, col);
}

void VETAJ_DoIdct_1x2(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                      uint8_t** rows, uint32_t col) {
  idct_pair<8>(centre, mult, coef, rows, col);
}

// --- 3/8 scale ---
//
// 3x3 output from rows 0..3 and columns 0..2 with 8-bit constants. The
// multipliers carry the AAN factors with 12 fractional bits, so each
// product is shifted right by 10, leaving 2 fractional bits that the final
// shift by 5 removes together with the 8-point normalisation.
void VETAJ_DoIdct_8to3(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                       uint8_t** rows, uint32_t col) {
  constexpr w32 k1_414 = 362, k1_847 = 473, k2_613 = 669, k1_082 = 277;
  w32 ws[3][3];
  for (int c = 0; c < 3; ++c) {
    auto e = [&](int r) { return sra(dequant(coef[8 * r + c], mult[8 * r + c]), 10); };
    const w32 e0 = e(0);
    if ((coef[8 + c] | coef[16 + c]) == 0) {
      ws[0][c] = ws[1][c] = ws[2][c] = e0;
      continue;
    }
    const w32 e1 = e(1), e2 = e(2), e3 = e(3);
    const w32 s = e1 + e3;
    const w32 u = e1 - e3;
    const w32 m = sra(k1_847 * u, 8);
    const w32 n = sra(k2_613 * e3, 8) - s + m;
    ws[0][c] = e0 + e2 + s;
    ws[1][c] = sra(k1_082 * e1, 8) + sra(k1_414 * u, 8) - m - n + (e0 - e2);
    ws[2][c] = e0 - e2 - n + sra(k1_414 * e2, 8);
  }
  for (int r = 0; r < 3; ++r) {
    const w32 w0 = ws[r][0], w1 = ws[r][1], w2 = ws[r][2];
    uint8_t* out = rows[r] + col;
    if ((w1 | w2) == 0) {
      out[0] = out[1] = out[2] = sample(centre, w0, 5);
      continue;
    }
    const w32 g = sra(k1_847 * w1, 8) - w1;
    const w32 h = w0 - w2;
    const w32 k = h + sra(k1_414 * w2, 8);
    out[0] =
        static_cast<uint8_t>((sample(centre, k + g, 5) + sample(centre, w2 + w0 + w1, 5)) >> 1);
    out[1] = sample(centre, h, 5);
    out[2] =
        static_cast<uint8_t>((sample(centre, k - g, 5) + sample(centre, w2 + w0 - w1, 5)) >> 1);
  }
}
