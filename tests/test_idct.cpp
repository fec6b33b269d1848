// Inverse transforms, slot templates and range-limit tables, checked against
// a reference written here from the arithmetic of each transform (64-bit
// integers, wrapped to 32 bits wherever the transform keeps a 32-bit value),
// against a floating-point transform, and, when available, against
// libjpeg's accurate integer transform.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <numbers>
#include <random>
#include <string>
#include <vector>

#include "recon/idct.h"

#ifdef VETAJ_HAVE_LIBJPEG
#include <jpeglib.h>

#include <cstdio>
extern "C" void jpeg_idct_islow(j_decompress_ptr, jpeg_component_info*, JCOEFPTR, JSAMPARRAY,
                                JDIMENSION);
#endif

namespace {

// ---------------------------------------------------------------------------
// Reference arithmetic

using i64 = int64_t;

// The 32-bit value the transform holds for an exact result x.
i64 wrap(i64 x) { return static_cast<int32_t>(static_cast<uint32_t>(static_cast<uint64_t>(x))); }
i64 shr(i64 x, int s) { return wrap(x) >> s; }

// Centre of a range-limit table built from its index description: for a
// 10-bit index m, 0..127 -> 128 + m, 128..511 -> 255, 512..895 -> 0,
// 896..1023 -> m - 896; below the centre 384 bytes of plain clamping.
struct RefTable {
  uint8_t bytes[1408];
  RefTable() {
    for (int i = -384; i < 1024; ++i) {
      int v;
      if (i < 0)
        v = i < -128 ? 0 : i + 128;
      else if (i < 128)
        v = 128 + i;
      else if (i < 512)
        v = 255;
      else if (i < 896)
        v = 0;
      else
        v = i - 896;
      bytes[i + 384] = static_cast<uint8_t>(v);
    }
  }
  const uint8_t* centre() const { return bytes + 384; }
  uint8_t out(i64 x, int s) const { return centre()[shr(x, s) & 1023]; }
};
const RefTable& ref_table() {
  static const RefTable t;
  return t;
}
uint8_t out(i64 x, int s) { return ref_table().out(x, s); }

struct Block {
  int16_t coef[64] = {};
  uint32_t mult[64] = {};
  i64 d(int r, int c) const {
    return wrap(i64{coef[8 * r + c]} * static_cast<int32_t>(mult[8 * r + c]));
  }
  bool zero(int r, int c) const { return coef[8 * r + c] == 0; }
};

using Samples = std::vector<uint8_t>;  // row-major, W x H

// 8-point flow graph on x[0..7] with tmp0/tmp1 = (x0 + bias0 +- x4) * 8192 + bias1.
void ref_kernel8(const i64 x[8], i64 bias0, i64 bias1, i64 y[8]) {
  const i64 e1 = (x[2] + x[6]) * 4433;
  const i64 t2 = e1 - x[6] * 15137, t3 = e1 + x[2] * 6270;
  const i64 t0 = (x[0] + bias0 + x[4]) * 8192 + bias1, t1 = (x[0] + bias0 - x[4]) * 8192 + bias1;
  const i64 a10 = t0 + t3, a13 = t0 - t3, a11 = t1 + t2, a12 = t1 - t2;
  i64 z1 = x[7] + x[1], z2 = x[5] + x[3], z3 = x[7] + x[3], z4 = x[5] + x[1];
  const i64 z5 = (z3 + z4) * 9633;
  i64 o0 = x[7] * 2446, o1 = x[5] * 16819, o2 = x[3] * 25172, o3 = x[1] * 12299;
  z1 *= -7373;
  z2 *= -20995;
  z3 = z3 * -16069 + z5;
  z4 = z4 * -3196 + z5;
  o0 += z1 + z3;
  o1 += z2 + z4;
  o2 += z2 + z3;
  o3 += z1 + z4;
  const i64 r[8] = {a10 + o3, a11 + o2, a12 + o1, a13 + o0, a13 - o0, a12 - o1, a11 - o2, a10 - o3};
  for (int i = 0; i < 8; ++i) y[i] = r[i];
}

// 4-point flow graph: outputs E + p, F + q, F - q, E - p with the caller's E, F
// and p, q from x1, x3 (plus `round` on the shared product).
void ref_kernel4(i64 e, i64 f, i64 x1, i64 x3, i64 round, int pq_shift, i64 y[4]) {
  const i64 z1 = (x1 + x3) * 4433 + round;
  const i64 p = shr(z1 + x1 * 6270, pq_shift), q = shr(z1 - x3 * 15137, pq_shift);
  y[0] = e + p;
  y[1] = f + q;
  y[2] = f - q;
  y[3] = e - p;
}

// 8-point first pass of column c with its zero-AC shortcut into ws[r][c].
void ref_column8(const Block& b, int c, i64 ws[8][8]) {
  bool ac_zero = true;
  for (int r = 1; r < 8; ++r) ac_zero = ac_zero && b.zero(r, c);
  if (ac_zero) {
    for (int r = 0; r < 8; ++r) ws[r][c] = wrap(b.d(0, c) * 4);
    return;
  }
  i64 x[8], y[8];
  for (int r = 0; r < 8; ++r) x[r] = b.d(r, c);
  ref_kernel8(x, 0, 1024, y);
  for (int r = 0; r < 8; ++r) ws[r][c] = shr(y[r], 11);
}

Samples ref_islow(const Block& b) {
  i64 ws[8][8];
  for (int c = 0; c < 8; ++c) ref_column8(b, c, ws);
  Samples s(64);
  for (int r = 0; r < 8; ++r) {
    bool ac_zero = true;
    for (int c = 1; c < 8; ++c) ac_zero = ac_zero && ws[r][c] == 0;
    i64 y[8];
    ref_kernel8(ws[r], 16, 0, y);
    for (int c = 0; c < 8; ++c) s[8 * r + c] = ac_zero ? out(ws[r][0] + 16, 5) : out(y[c], 18);
  }
  return s;
}

Samples ref_4x4(const Block& b) {
  // Rows and columns 0..3 and 5..7; t0 = x0 * 16384 (+ rounding).
  auto kernel = [](const i64 x[8], i64 t0, i64 y[4]) {
    const i64 t2 = 15137 * x[2] - 6270 * x[6];
    const i64 a = -1730 * x[7] + 11893 * x[5] - 17799 * x[3] + 8697 * x[1];
    const i64 bb = -4176 * x[7] - 4926 * x[5] + 7373 * x[3] + 20995 * x[1];
    y[0] = t0 + t2 + bb;
    y[1] = t0 - t2 + a;
    y[2] = t0 - t2 - a;
    y[3] = t0 + t2 - bb;
  };
  i64 ws[4][8] = {};
  for (int c = 0; c < 8; ++c) {
    if (c == 4) continue;
    i64 x[8];
    for (int r = 0; r < 8; ++r) x[r] = b.d(r, c);
    if (b.zero(1, c) && b.zero(2, c) && b.zero(3, c) && b.zero(5, c) && b.zero(6, c) &&
        b.zero(7, c)) {
      for (int r = 0; r < 4; ++r) ws[r][c] = wrap(x[0] * 4);
      continue;
    }
    i64 y[4];
    kernel(x, x[0] * 16384, y);
    for (int r = 0; r < 4; ++r) ws[r][c] = shr(y[r] + 2048, 12);
  }
  Samples s(16);
  for (int r = 0; r < 4; ++r) {
    const i64* w = ws[r];
    i64 y[4];
    kernel(w, w[0] * 16384 + (1 << 18), y);
    const bool ac_zero = !(w[1] | w[2] | w[3] | w[5] | w[6] | w[7]);
    for (int c = 0; c < 4; ++c) s[4 * r + c] = ac_zero ? out(w[0] + 16, 5) : out(y[c], 19);
  }
  return s;
}

Samples ref_2x2(const Block& b) {
  auto odd = [](const i64 x[8]) { return 29692 * x[1] - 10426 * x[3] + 6967 * x[5] - 5906 * x[7]; };
  i64 ws[2][8] = {};
  for (int c : {0, 1, 3, 5, 7}) {
    i64 x[8];
    for (int r = 0; r < 8; ++r) x[r] = b.d(r, c);
    if (b.zero(1, c) && b.zero(3, c) && b.zero(5, c) && b.zero(7, c)) {
      ws[0][c] = ws[1][c] = wrap(x[0] * 4);
      continue;
    }
    const i64 t10 = x[0] * 32768 + 4096;
    ws[0][c] = shr(t10 + odd(x), 13);
    ws[1][c] = shr(t10 - odd(x), 13);
  }
  Samples s(4);
  for (int r = 0; r < 2; ++r) {
    const i64* w = ws[r];
    const bool ac_zero = !(w[1] | w[3] | w[5] | w[7]);
    const i64 t10 = w[0] * 32768 + (1 << 19);
    s[2 * r] = ac_zero ? out(w[0] + 16, 5) : out(t10 + odd(w), 20);
    s[2 * r + 1] = ac_zero ? out(w[0] + 16, 5) : out(t10 - odd(w), 20);
  }
  return s;
}

Samples ref_1x1(const Block& b) { return {out(b.d(0, 0) + 4, 3)}; }
Samples ref_2x1(const Block& b) {
  return {out(b.d(0, 0) + 4 + b.d(0, 1), 3), out(b.d(0, 0) + 4 - b.d(0, 1), 3)};
}
Samples ref_1x2(const Block& b) {
  return {out(b.d(0, 0) + 4 + b.d(1, 0), 3), out(b.d(0, 0) + 4 - b.d(1, 0), 3)};
}

Samples ref_8x4(const Block& b) {
  i64 ws[4][8];
  for (int c = 0; c < 8; ++c) {
    i64 y[4];
    ref_kernel4((b.d(0, c) + b.d(2, c)) * 4, (b.d(0, c) - b.d(2, c)) * 4, b.d(1, c), b.d(3, c),
                1024, 11, y);
    for (int r = 0; r < 4; ++r) ws[r][c] = wrap(y[r]);
  }
  Samples s(32);
  for (int r = 0; r < 4; ++r) {
    i64 y[8];
    ref_kernel8(ws[r], 16, 0, y);
    for (int c = 0; c < 8; ++c) s[8 * r + c] = out(y[c], 18);
  }
  return s;
}

Samples ref_4x8(const Block& b) {
  i64 ws[8][8] = {};
  for (int c = 0; c < 4; ++c) ref_column8(b, c, ws);
  Samples s(32);
  for (int r = 0; r < 8; ++r) {
    const i64* w = ws[r];
    i64 y[4];
    ref_kernel4((w[0] + 16 + w[2]) * 8192, (w[0] + 16 - w[2]) * 8192, w[1], w[3], 0, 0, y);
    for (int c = 0; c < 4; ++c) s[4 * r + c] = out(y[c], 18);
  }
  return s;
}

Samples ref_4x2(const Block& b) {
  Samples s(8);
  for (int r = 0; r < 2; ++r) {
    i64 w[4];
    for (int c = 0; c < 4; ++c) w[c] = wrap(r == 0 ? b.d(0, c) + b.d(1, c) : b.d(0, c) - b.d(1, c));
    i64 y[4];
    ref_kernel4((w[0] + 4 + w[2]) * 8192, (w[0] + 4 - w[2]) * 8192, w[1], w[3], 0, 0, y);
    for (int c = 0; c < 4; ++c) s[4 * r + c] = out(y[c], 16);
  }
  return s;
}

Samples ref_2x4(const Block& b) {
  i64 ws[4][2];
  for (int c = 0; c < 2; ++c) {
    i64 y[4];
    ref_kernel4((b.d(0, c) + b.d(2, c)) * 8192, (b.d(0, c) - b.d(2, c)) * 8192, b.d(1, c),
                b.d(3, c), 0, 0, y);
    for (int r = 0; r < 4; ++r) ws[r][c] = wrap(y[r]);
  }
  Samples s(8);
  for (int r = 0; r < 4; ++r) {
    const i64 a = ws[r][0] + 32768;
    s[2 * r] = out(a + ws[r][1], 16);
    s[2 * r + 1] = out(a - ws[r][1], 16);
  }
  return s;
}

Samples ref_8to3(const Block& b) {
  auto m8 = [](i64 k, i64 x) { return shr(k * x, 8); };
  i64 ws[3][3];
  for (int c = 0; c < 3; ++c) {
    i64 e[4];
    for (int r = 0; r < 4; ++r) e[r] = shr(b.d(r, c), 10);
    if (b.zero(1, c) && b.zero(2, c)) {
      ws[0][c] = ws[1][c] = ws[2][c] = e[0];
      continue;
    }
    const i64 s = e[1] + e[3], u = e[1] - e[3];
    const i64 m = m8(473, u);
    const i64 n = m8(669, e[3]) - s + m;
    ws[0][c] = wrap(e[0] + e[2] + s);
    ws[1][c] = wrap(m8(277, e[1]) + m8(362, u) - m - n + (e[0] - e[2]));
    ws[2][c] = wrap(e[0] - e[2] - n + m8(362, e[2]));
  }
  Samples out3(9);
  for (int r = 0; r < 3; ++r) {
    const i64 w0 = ws[r][0], w1 = ws[r][1], w2 = ws[r][2];
    if (w1 == 0 && w2 == 0) {
      out3[3 * r] = out3[3 * r + 1] = out3[3 * r + 2] = out(w0, 5);
      continue;
    }
    const i64 g = m8(473, w1) - w1, h = w0 - w2, k = h + m8(362, w2);
    out3[3 * r] = static_cast<uint8_t>((out(k + g, 5) + out(w2 + w0 + w1, 5)) >> 1);
    out3[3 * r + 1] = out(h, 5);
    out3[3 * r + 2] = static_cast<uint8_t>((out(k - g, 5) + out(w2 + w0 - w1, 5)) >> 1);
  }
  return out3;
}

// ---------------------------------------------------------------------------
// Running a routine on a guarded canvas

// Runs `fn` on a canvas of 12 rows x 32 bytes filled with `pattern`-derived
// bytes, the block at rows 2.. and column 11; returns the W x H block and
// fails the test if any other byte changed.
Samples run_guarded(VETAJ_IdctFn fn, const uint8_t* centre, const Block& b, int w, int h,
                    uint8_t pattern) {
  constexpr int kStride = 32, kRows = 12, kTop = 2, kCol = 11;
  std::vector<uint8_t> canvas(kStride * kRows);
  for (size_t i = 0; i < canvas.size(); ++i) canvas[i] = static_cast<uint8_t>(i * 37 + pattern);
  const std::vector<uint8_t> before = canvas;
  uint8_t* rows[8];
  for (int r = 0; r < 8; ++r) rows[r] = canvas.data() + (kTop + r) * kStride;
  fn(centre, b.mult, b.coef, rows, kCol);
  Samples s(static_cast<size_t>(w * h));
  for (int i = 0; i < kStride * kRows; ++i) {
    const int r = i / kStride - kTop, c = i % kStride - kCol;
    if (r >= 0 && r < h && c >= 0 && c < w) {
      s[static_cast<size_t>(r * w + c)] = canvas[static_cast<size_t>(i)];
    } else if (canvas[static_cast<size_t>(i)] != before[static_cast<size_t>(i)]) {
      ADD_FAILURE() << "byte outside the block written at row " << r << " column " << c;
    }
  }
  return s;
}

// Output of `fn`, checked with two different guard patterns.
Samples run(VETAJ_IdctFn fn, const uint8_t* centre, const Block& b, int w, int h) {
  Samples a = run_guarded(fn, centre, b, w, h, 0);
  Samples c = run_guarded(fn, centre, b, w, h, 0x5A);
  EXPECT_EQ(a, c) << "output depends on the bytes it overwrites";
  return a;
}

struct LibTable {
  uint8_t bytes[kRangeLimitBytes];
  const uint8_t* identity;
  LibTable() : identity(vj_fill_range_limit(bytes)) {}
  const uint8_t* centre() const { return vj_range_limit_centre(identity); }
};
const uint8_t* lib_centre() {
  static const LibTable t;
  return t.centre();
}

// ---------------------------------------------------------------------------
// Block generators

enum class Kind {
  kTypical,    // decaying amplitudes, small quantisers, many zeros
  kExtreme,    // +-2047 and zeros with quantisers up to 65535
  kWild,       // any 16-bit coefficient, any 32-bit multiplier
  kShortcuts,  // whole zero rows or columns, to exercise both shortcuts
};

const char* kind_name(Kind k) {
  switch (k) {
    case Kind::kTypical: return "Typical";
    case Kind::kExtreme: return "Extreme";
    case Kind::kWild: return "Wild";
    case Kind::kShortcuts: return "Shortcuts";
  }
  return "?";
}

class Gen {
 public:
  explicit Gen(uint32_t seed) : rng_(seed) {}
  int uniform(int lo, int hi) { return std::uniform_int_distribution<int>(lo, hi)(rng_); }
  uint32_t bits() { return static_cast<uint32_t>(rng_()); }

  int16_t coefficient(Kind kind, int r, int c) {
    switch (kind) {
      case Kind::kTypical:
      case Kind::kShortcuts: {
        if (uniform(0, 2) == 0) return 0;
        const int amp = 1024 / (1 + r + c);
        return static_cast<int16_t>(uniform(-amp, amp));
      }
      case Kind::kExtreme: {
        static constexpr int16_t kPicks[3] = {2047, -2047, 0};
        const int pick = uniform(0, 3);
        return pick < 3 ? kPicks[pick] : static_cast<int16_t>(uniform(-2047, 2047));
      }
      case Kind::kWild: return static_cast<int16_t>(bits());
    }
    return 0;
  }
  uint32_t multiplier(Kind kind) {
    switch (kind) {
      case Kind::kTypical:
      case Kind::kShortcuts: return static_cast<uint32_t>(uniform(1, 99));
      case Kind::kExtreme: return static_cast<uint32_t>(uniform(0, 3) ? uniform(1, 65535) : 65535);
      case Kind::kWild: return bits();
    }
    return 1;
  }

  Block block(Kind kind) {
    Block b;
    for (int i = 0; i < 64; ++i) {
      b.coef[i] = coefficient(kind, i / 8, i % 8);
      b.mult[i] = multiplier(kind);
    }
    if (kind == Kind::kShortcuts) {
      // Keep only row 0, only column 0, or a few scattered columns.
      const int shape = uniform(0, 2);
      for (int i = 0; i < 64; ++i) {
        const int r = i / 8, c = i % 8;
        const bool keep = shape == 0 ? r == 0 : shape == 1 ? c == 0 : (c % 3 == 0 && r < 3);
        if (!keep) b.coef[i] = 0;
      }
    }
    return b;
  }

 private:
  std::mt19937 rng_;
};

// Block with AAN multipliers (from random quantisers) for the 3/8 routine.
Block with_aan(Block b, Gen& g, Kind kind) {
  if (kind == Kind::kWild) return b;  // any multiplier at all
  uint16_t q[64];
  const int top = kind == Kind::kExtreme ? 65535 : 99;
  for (auto& v : q) v = static_cast<uint16_t>(g.uniform(1, top));
  vj_build_aan_multipliers(q, b.mult);
  return b;
}

// ---------------------------------------------------------------------------
// Every routine against its reference

struct Routine {
  const char* name;
  VETAJ_IdctFn fn;
  int w, h;
  Samples (*ref)(const Block&);
  uint64_t used;  // bit 8r+c: coefficient read
  bool aan;       // takes AAN multipliers
};

constexpr uint64_t box(std::initializer_list<int> rows, std::initializer_list<int> cols) {
  uint64_t m = 0;
  for (int r : rows)
    for (int c : cols) m |= uint64_t{1} << (8 * r + c);
  return m;
}

const Routine kRoutines[] = {
    {"islow", VETAJ_DoIdct_islow, 8, 8, ref_islow, ~uint64_t{0}, false},
    {"4x4", VETAJ_DoIdct_4x4, 4, 4, ref_4x4, box({0, 1, 2, 3, 5, 6, 7}, {0, 1, 2, 3, 5, 6, 7}),
     false},
    {"2x2", VETAJ_DoIdct_2x2, 2, 2, ref_2x2, box({0, 1, 3, 5, 7}, {0, 1, 3, 5, 7}), false},
    {"1x1", VETAJ_DoIdct_1x1, 1, 1, ref_1x1, box({0}, {0}), false},
    {"8x4", VETAJ_DoIdct_8x4, 8, 4, ref_8x4, box({0, 1, 2, 3}, {0, 1, 2, 3, 4, 5, 6, 7}), false},
    {"4x8", VETAJ_DoIdct_4x8, 4, 8, ref_4x8, box({0, 1, 2, 3, 4, 5, 6, 7}, {0, 1, 2, 3}), false},
    {"4x2", VETAJ_DoIdct_4x2, 4, 2, ref_4x2, box({0, 1}, {0, 1, 2, 3}), false},
    {"2x4", VETAJ_DoIdct_2x4, 2, 4, ref_2x4, box({0, 1, 2, 3}, {0, 1}), false},
    {"2x1", VETAJ_DoIdct_2x1, 2, 1, ref_2x1, box({0}, {0, 1}), false},
    {"1x2", VETAJ_DoIdct_1x2, 1, 2, ref_1x2, box({0, 1}, {0}), false},
    {"8to3", VETAJ_DoIdct_8to3, 3, 3, ref_8to3, box({0, 1, 2, 3}, {0, 1, 2}), true},
};

class RoutineTest : public ::testing::TestWithParam<std::tuple<Routine, Kind>> {};

TEST_P(RoutineTest, MatchesReferenceAndWritesOnlyItsBlock) {
  const auto& [rt, kind] = GetParam();
  Gen g(static_cast<uint32_t>(rt.w * 131 + rt.h * 7 + static_cast<int>(kind)));
  for (int i = 0; i < 1500; ++i) {
    Block b = g.block(kind);
    if (rt.aan) b = with_aan(b, g, kind);
    const Samples got = run(rt.fn, lib_centre(), b, rt.w, rt.h);
    ASSERT_EQ(got, rt.ref(b)) << "block " << i;
    if (HasFailure()) return;
  }
}

TEST_P(RoutineTest, ReadsOnlyItsCoefficients) {
  const auto& [rt, kind] = GetParam();
  Gen g(static_cast<uint32_t>(rt.w * 17 + rt.h + 1000 * static_cast<int>(kind)));
  for (int i = 0; i < 300; ++i) {
    Block b = g.block(kind);
    if (rt.aan) b = with_aan(b, g, kind);
    const Samples base = run(rt.fn, lib_centre(), b, rt.w, rt.h);
    for (int k = 0; k < 64; ++k) {
      if (rt.used >> k & 1) continue;
      b.coef[k] = static_cast<int16_t>(g.bits());
      b.mult[k] = g.bits();
    }
    ASSERT_EQ(run(rt.fn, lib_centre(), b, rt.w, rt.h), base) << "block " << i;
  }
}

// The edge values every routine shares: a DC-only block with product D x Q
// gives 128 + round(D x Q / 8), clamped.
class RoutineEdgeTest : public ::testing::TestWithParam<Routine> {};

TEST_P(RoutineEdgeTest, DcOnlyBlocksGiveTheRoundedMean) {
  const Routine& rt = GetParam();
  struct Case {
    int16_t d;
    uint16_t q;
    uint8_t want;
  };
  const Case cases[] = {{0, 16, 128},  {1, 8, 129},   {4, 2, 129},  {-64, 16, 0}, {-1, 1024, 0},
                        {127, 8, 255}, {8, 127, 255}, {-8, 1, 127}, {3, 1, 128}};
  for (const Case& c : cases) {
    Block b;
    b.coef[0] = c.d;
    uint16_t q[64];
    for (auto& v : q) v = c.q;
    if (rt.aan) {
      vj_build_aan_multipliers(q, b.mult);
    } else {
      for (int i = 0; i < 64; ++i) b.mult[i] = q[i];
    }
    const Samples got = run(rt.fn, lib_centre(), b, rt.w, rt.h);
    EXPECT_EQ(got, Samples(got.size(), c.want)) << "D=" << c.d << " Q=" << c.q;
  }
}

// One AC coefficient (with or without a DC) whose product is +-2^p: such
// values land exactly on the rounding boundaries of the descaling shifts.
TEST_P(RoutineEdgeTest, SingleAcBlocksOnRoundingBoundaries) {
  const Routine& rt = GetParam();
  for (int k = 1; k < 64; ++k) {
    for (int p = 0; p < 16; ++p) {
      for (int sign : {1, -1}) {
        for (int16_t dc = -3; dc <= 4; ++dc) {
          Block b;
          for (auto& m : b.mult) m = 1;
          b.coef[0] = dc;
          b.coef[k] = static_cast<int16_t>(sign * (1 << (p % 8)));
          b.mult[k] = 1u << (p - p % 8);
          ASSERT_EQ(run(rt.fn, lib_centre(), b, rt.w, rt.h), rt.ref(b))
              << "position " << k << " product " << sign << " x 2^" << p << " dc " << dc;
        }
      }
    }
  }
}

INSTANTIATE_TEST_SUITE_P(All, RoutineEdgeTest, ::testing::ValuesIn(kRoutines),
                         [](const auto& param_info) {
                           return std::string("R") + param_info.param.name;
                         });

INSTANTIATE_TEST_SUITE_P(All, RoutineTest,
                         ::testing::Combine(::testing::ValuesIn(kRoutines),
                                            ::testing::Values(Kind::kTypical, Kind::kExtreme,
                                                              Kind::kWild, Kind::kShortcuts)),
                         [](const auto& param_info) {
                           return std::string("R") + std::get<0>(param_info.param).name + "_" +
                                  kind_name(std::get<1>(param_info.param));
                         });

// ---------------------------------------------------------------------------
// Full-size transform: specific cases and outside oracles

TEST(Islow, ColumnShortcutKeepsHugeDcProducts) {
  // Column 0 has only its DC, with a product whose x 8192 would overflow:
  // the shortcut's DC x 4 must be used. Column 1 carries an AC value so
  // that the rows do not take their own shortcut.
  Block b;
  for (int i = 0; i < 64; ++i) b.mult[i] = 1;
  b.coef[0] = 1024;
  b.mult[0] = 1024;  // DC x 8192 = 2^33 wraps to 0; DC x 4 does not
  b.coef[8 + 1] = 100;
  const Samples got = run(VETAJ_DoIdct_islow, lib_centre(), b, 8, 8);
  EXPECT_EQ(got, ref_islow(b));
  // Without the shortcut the result would differ: the case is meaningful.
  i64 x[8] = {b.d(0, 0)}, y[8];
  ref_kernel8(x, 0, 1024, y);
  EXPECT_NE(shr(y[0], 11), wrap(b.d(0, 0) * 4));
}

// Exact transform: f(x, y) = 1/8 sum a(u) a(v) F(v, u) cos((2x+1)u pi/2W)
// cos((2y+1)v pi/2H), a(0) = 1, a(k) = sqrt(2); sample = clamp(f + 128).
Samples float_idct(const Block& b, int w, int h) {
  Samples s(static_cast<size_t>(w * h));
  for (int y = 0; y < h; ++y) {
    for (int x = 0; x < w; ++x) {
      double sum = 0;
      for (int v = 0; v < h; ++v) {
        for (int u = 0; u < w; ++u) {
          const double a = (u ? std::sqrt(2.0) : 1.0) * (v ? std::sqrt(2.0) : 1.0);
          sum += a * static_cast<double>(b.d(v, u)) *
                 std::cos((2 * x + 1) * u * std::numbers::pi / (2 * w)) *
                 std::cos((2 * y + 1) * v * std::numbers::pi / (2 * h));
        }
      }
      const double f = std::round(sum / 8 + 128);
      s[static_cast<size_t>(y * w + x)] = static_cast<uint8_t>(f < 0 ? 0 : f > 255 ? 255 : f);
    }
  }
  return s;
}

// The exactly-defined sizes stay within 1 of the exact transform.
TEST(Islow, FullAndRectangularSizesApproximateTheExactTransform) {
  Gen g(77);
  for (const Routine& rt : kRoutines) {
    if (rt.fn == VETAJ_DoIdct_4x4 || rt.fn == VETAJ_DoIdct_2x2 || rt.aan) continue;
    for (int i = 0; i < 300; ++i) {
      // Keep every output within the table's unwrapped range: the sum of
      // |product| x 2 / 8 (the largest gain of one term) stays below 380.
      Block b = g.block(Kind::kTypical);
      i64 gain = 0;
      for (int k = 0; k < 64; ++k) gain += std::abs(b.d(k / 8, k % 8)) * 2 / 8;
      for (int k = 0; gain >= 380 && k < 64; ++k)
        b.coef[k] = static_cast<int16_t>(b.coef[k] * 380 / gain);
      const Samples got = run(rt.fn, lib_centre(), b, rt.w, rt.h);
      const Samples want = float_idct(b, rt.w, rt.h);
      for (size_t k = 0; k < got.size(); ++k) {
        ASSERT_LE(std::abs(got[k] - want[k]), 1) << rt.name << " block " << i << " sample " << k;
      }
    }
  }
}

#ifdef VETAJ_HAVE_LIBJPEG
TEST(Islow, BitIdenticalToLibjpegAccurateTransform) {
  Gen g(4242);
  jpeg_decompress_struct cinfo;
  std::memset(&cinfo, 0, sizeof cinfo);
  uint8_t table[kRangeLimitBytes];
  cinfo.sample_range_limit = vj_fill_range_limit(table);
  jpeg_component_info comp;
  std::memset(&comp, 0, sizeof comp);
  for (int i = 0; i < 3000; ++i) {
    Block b = g.block(i % 2 ? Kind::kTypical : Kind::kShortcuts);
    // libjpeg keeps the multipliers as 16-bit values.
    int16_t mult16[64];
    for (int k = 0; k < 64; ++k) mult16[k] = static_cast<int16_t>(b.mult[k]);
    comp.dct_table = mult16;
    uint8_t pixels[64];
    JSAMPROW rows[8];
    for (int r = 0; r < 8; ++r) rows[r] = pixels + 8 * r;
    jpeg_idct_islow(&cinfo, &comp, b.coef, rows, 0);
    ASSERT_EQ(run(VETAJ_DoIdct_islow, vj_range_limit_centre(cinfo.sample_range_limit), b, 8, 8),
              Samples(pixels, pixels + 64))
        << "block " << i;
  }
}
#endif

// ---------------------------------------------------------------------------
// Sparse slots of the full-size template

constexpr uint8_t kZigzag[64] = {0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,
                                 12, 19, 26, 33, 40, 48, 41, 34, 27, 20, 13, 6,  7,  14, 21, 28,
                                 35, 42, 49, 56, 57, 50, 43, 36, 29, 22, 15, 23, 30, 37, 44, 51,
                                 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54, 47, 55, 62, 63};

class SlotTest : public ::testing::TestWithParam<int> {};

TEST_P(SlotTest, SparseSlotEqualsFullTransformForBlocksEndingThere) {
  const int slot = GetParam();
  Gen g(static_cast<uint32_t>(9000 + slot));
  const Kind kinds[] = {Kind::kTypical, Kind::kExtreme, Kind::kWild, Kind::kShortcuts};
  for (int i = 0; i < 2000; ++i) {
    const Kind kind = kinds[i % 4];
    Block b = g.block(kind);
    const int last = slot < 28 ? slot : g.uniform(28, 63);
    for (int z = last + 1; z < 64; ++z) b.coef[kZigzag[z]] = 0;
    if (b.coef[kZigzag[last]] == 0) b.coef[kZigzag[last]] = static_cast<int16_t>(g.uniform(1, 9));
    if (i % 5 == 0) {
      // Only the last coefficient set: the sparsest block of the slot.
      for (int z = 0; z < last; ++z) b.coef[kZigzag[z]] = 0;
    }
    const Samples full = run(VETAJ_DoIdct_islow, lib_centre(), b, 8, 8);
    ASSERT_EQ(run(pIDctFunc[slot], lib_centre(), b, 8, 8), full) << "block " << i;
    if (i % 8 == 0) {
      ASSERT_EQ(full, ref_islow(b)) << "block " << i;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(All, SlotTest, ::testing::Range(0, 29));

// ---------------------------------------------------------------------------
// Templates, selectors and small helpers

TEST(Templates, HoldTheRoutinesOfTheirScale) {
  EXPECT_EQ(pIDctFunc[28], VETAJ_DoIdct_islow);
  for (int k = 0; k < kIdctSlots; ++k) {
    EXPECT_EQ(pIDctFuncIslow[k], VETAJ_DoIdct_islow);
    EXPECT_NE(pIDctFunc[k], nullptr);
  }
  const std::pair<const VETAJ_IdctFn*, VETAJ_IdctFn> reduced[] = {
      {pIDctResizeFunc2to1, VETAJ_DoIdct_4x4},
      {pIDctResizeFunc4to1, VETAJ_DoIdct_2x2},
      {pIDctResizeFunc8to1, VETAJ_DoIdct_1x1},
      {pIDctResizeFunc8to3, VETAJ_DoIdct_8to3}};
  for (const auto& [table, fn] : reduced) {
    for (int k = 0; k < kIdctResizeSlots; ++k) EXPECT_EQ(table[k], fn);
  }
  EXPECT_EQ(pIDctResizeFunc[0], pIDctFuncIslow);
  EXPECT_EQ(pIDctResizeFunc[1], pIDctResizeFunc2to1);
  EXPECT_EQ(pIDctResizeFunc[2], pIDctResizeFunc4to1);
  EXPECT_EQ(pIDctResizeFunc[3], pIDctResizeFunc8to1);

  EXPECT_EQ(vj_idct_template(0, 1, false), pIDctFunc);
  EXPECT_EQ(vj_idct_template(0, 1, true), pIDctFuncIslow);
  EXPECT_EQ(vj_idct_template(1, 1, false), pIDctResizeFunc2to1);
  EXPECT_EQ(vj_idct_template(3, 1, true), pIDctResizeFunc8to1);
  EXPECT_EQ(vj_idct_template(3, 3, false), pIDctResizeFunc8to3);
  EXPECT_EQ(vj_idct_template(4, 1, false), nullptr);
  EXPECT_EQ(vj_idct_template(-1, 1, false), nullptr);
  EXPECT_EQ(vj_idct_template(1, 3, false), nullptr);
}

TEST(Templates, PerComponentSizesAndSelectors) {
  const struct {
    int w, h;
    VETAJ_IdctFn fn;
  } sizes[] = {{8, 8, VETAJ_DoIdct_islow}, {8, 4, VETAJ_DoIdct_8x4}, {4, 8, VETAJ_DoIdct_4x8},
               {4, 4, VETAJ_DoIdct_4x4},   {4, 2, VETAJ_DoIdct_4x2}, {2, 4, VETAJ_DoIdct_2x4},
               {2, 2, VETAJ_DoIdct_2x2},   {2, 1, VETAJ_DoIdct_2x1}, {1, 2, VETAJ_DoIdct_1x2},
               {1, 1, VETAJ_DoIdct_1x1},   {8, 2, nullptr},          {0, 0, nullptr},
               {16, 1, nullptr},           {-8, 8, nullptr}};
  for (const auto& s : sizes) EXPECT_EQ(vj_idct_for_size(s.w, s.h), s.fn) << s.w << "x" << s.h;

  for (int index : {-5, 0, 3, 6, 28, 63}) {
    EXPECT_EQ(VETAJ_GetDctMethod8to1(nullptr, index), VETAJ_DoIdct_1x1);
    EXPECT_EQ(VETAJ_GetDctMethod4to1(nullptr, index), VETAJ_DoIdct_2x2);
    EXPECT_EQ(VETAJ_GetDctMethod2to1(nullptr, index), VETAJ_DoIdct_4x4);
    EXPECT_EQ(VETAJ_GetDctMethod8to3(nullptr, index), VETAJ_DoIdct_8to3);
    EXPECT_EQ(VETAJ_GetDctMethodIndexFirst(index), 0);
  }
  const std::pair<int, int> indexes[] = {{-1, 0}, {0, 0}, {5, 5}, {6, 6}, {7, 6}, {63, 6}};
  for (const auto& [k, want] : indexes) EXPECT_EQ(VETAJ_GetDctMethodIndex(k), want) << k;
}

TEST(Templates, Logn) {
  const std::pair<int32_t, int32_t> cases[] = {{8, 3}, {1, 0},  {0, -1}, {12, 3},  {2, 1},
                                               {3, 1}, {16, 4}, {64, 6}, {-4, -1}, {INT32_MAX, 30}};
  for (const auto& [n, want] : cases) EXPECT_EQ(VETAJ_LOGN(n), want) << n;
}

// ---------------------------------------------------------------------------
// Range-limit tables and AAN factors

TEST(RangeLimit, MainTableMatchesItsLayoutFromBothAddresses) {
  uint8_t table[kRangeLimitBytes + 2];
  std::memset(table, 0xEE, sizeof table);
  const uint8_t* identity = vj_fill_range_limit(table + 1);
  EXPECT_EQ(identity, table + 1 + 256);
  EXPECT_EQ(table[0], 0xEE);
  EXPECT_EQ(table[kRangeLimitBytes + 1], 0xEE);
  // Whole table against the independent description.
  EXPECT_EQ(0, std::memcmp(table + 1, ref_table().bytes, kRangeLimitBytes));
  // Plain clamping from the identity part: -256..639.
  for (int i = -256; i < 640; ++i) EXPECT_EQ(identity[i], i < 0 ? 0 : i > 255 ? 255 : i) << i;
  // From the centre: plain clamping of value + 128 over -384..511, and the
  // 10-bit wrapped indexes 0..1023.
  const uint8_t* centre = vj_range_limit_centre(identity);
  for (int v = -384; v < 512; ++v) {
    EXPECT_EQ(centre[v], std::clamp(v + 128, 0, 255)) << v;
  }
  for (int m = 0; m < 1024; ++m) {
    const int v = m < 512 ? m : m - 1024;  // the value a 10-bit index stands for
    const int want = v < -384 ? 0 : std::clamp(v + 128, 0, 255);
    EXPECT_EQ(centre[m], want) << m;
  }
}

TEST(RangeLimit, ChromaTableCompressesEveryEntry) {
  EXPECT_EQ(vj_chroma_compress(0), 23);
  EXPECT_EQ(vj_chroma_compress(15), 23);
  EXPECT_EQ(vj_chroma_compress(16), 23);
  EXPECT_EQ(vj_chroma_compress(17), 24);    // 128 + trunc(-111 x 120 / 128) = 128 - 104
  EXPECT_EQ(vj_chroma_compress(127), 128);  // trunc(-0.9375) = 0
  EXPECT_EQ(vj_chroma_compress(128), 128);
  EXPECT_EQ(vj_chroma_compress(129), 128);
  EXPECT_EQ(vj_chroma_compress(240), 233);
  EXPECT_EQ(vj_chroma_compress(241), 233);
  EXPECT_EQ(vj_chroma_compress(255), 233);
  for (int i = 16; i <= 240; ++i) EXPECT_EQ(vj_chroma_compress(i), 128 + (i - 128) * 120 / 128);

  uint8_t main_table[kRangeLimitBytes], chroma[kRangeLimitBytes];
  vj_fill_range_limit(main_table);
  EXPECT_EQ(vj_fill_range_limit_chroma(chroma), chroma + kRangeLimitIdentityOffset);
  for (uint32_t i = 0; i < kRangeLimitBytes; ++i) {
    EXPECT_EQ(chroma[i], vj_chroma_compress(main_table[i])) << i;
  }
  // From the centre, outputs saturate monotonically at 23 and 233 over the
  // whole 10-bit range.
  const uint8_t* centre = chroma + kRangeLimitCentreOffset;
  int previous = -1;
  for (int v = -512; v < 512; ++v) {
    const int s = centre[v & 1023];
    EXPECT_GE(s, previous) << v;
    EXPECT_GE(s, 23);
    EXPECT_LE(s, 233);
    previous = s;
  }
}

TEST(Aan, ScaleTableIsTheProductOfCosineFactors) {
  auto c = [](int k) {
    return k == 0 ? 1.0 : std::sqrt(2.0) * std::cos(k * std::numbers::pi / 16);
  };
  for (int u = 0; u < 8; ++u) {
    for (int v = 0; v < 8; ++v) {
      EXPECT_EQ(kAanScale[8 * u + v], std::lround(16384 * c(u) * c(v))) << u << "," << v;
    }
  }
  EXPECT_EQ(kAanScale[1], 22725);
  EXPECT_EQ(kAanScale[7], 4520);
}

TEST(Aan, MultipliersCarryTwelveFractionalBits) {
  uint16_t q[64];
  for (int i = 0; i < 64; ++i) q[i] = static_cast<uint16_t>(i == 9 ? 65535 : i + 1);
  uint32_t m[64];
  vj_build_aan_multipliers(q, m);
  EXPECT_EQ(m[0], 4096u);                  // 1 x 16384 / 4
  EXPECT_EQ(m[1], (2u * 22725) >> 2);      // truncated
  EXPECT_EQ(m[9], (65535u * 31521) >> 2);  // largest product, no overflow
  for (int i = 0; i < 64; ++i) EXPECT_EQ(m[i], (uint32_t{q[i]} * kAanScale[i]) / 4) << i;
}

}  // namespace
