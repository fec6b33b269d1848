// Inverse transforms, slot templates and range-limit tables: every routine
// against a reference written here from its arithmetic (64-bit integers,
// wrapped to 32 bits wherever the transform keeps a 32-bit value) on a
// guarded canvas (the decoding tests compare whole pictures with libjpeg's).
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <numbers>
#include <random>
#include <string>
#include <vector>

#include "entropy/huffman.h"
#include "recon/idct.h"


namespace {

// ---------------------------------------------------------------------------
// Reference arithmetic

using i64 = int64_t;

// The 32-bit value the transform holds for an exact result x.
i64 wrap(i64 x) { return static_cast<int32_t>(static_cast<uint32_t>(static_cast<uint64_t>(x))); }
i64 shr(i64 x, int s) { return wrap(x) >> s; }

// The library's range-limit table, checked on its own below.
struct LibTable {
  uint8_t bytes[kRangeLimitBytes];
  const uint8_t* identity = vj_fill_range_limit(bytes);
};
const uint8_t* lib_centre() {
  static LibTable t;
  return vj_range_limit_centre(t.identity);
}
// Sample of value x descaled by s: the table entry of its low 10 bits.
uint8_t out(i64 x, int s) { return lib_centre()[shr(x, s) & 1023]; }

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

Samples ref_1x1(const Block& b) { return {out(b.d(0, 0) + 4, 3)}; }
// Two samples from the DC and the coefficient at (r, c).
template <int r, int c>
Samples ref_pair(const Block& b) {
  return {out(b.d(0, 0) + 4 + b.d(r, c), 3), out(b.d(0, 0) + 4 - b.d(r, c), 3)};
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

// 1/2 scale: rows and columns 0..3 and 5..7 (4 ignored), even part from
// t0 and inputs 2, 6, odd part from inputs 1, 3, 5, 7.
void ref_kernel4x4(i64 t0, const i64 x[8], i64 y[4]) {
  const i64 t2 = 15137 * x[2] - 6270 * x[6], t10 = t0 + t2, t12 = t0 - t2;
  const i64 a = -1730 * x[7] + 11893 * x[5] - 17799 * x[3] + 8697 * x[1];
  const i64 o = -4176 * x[7] - 4926 * x[5] + 7373 * x[3] + 20995 * x[1];
  y[0] = t10 + o, y[1] = t12 + a, y[2] = t12 - a, y[3] = t10 - o;
}

Samples ref_4x4(const Block& b) {
  i64 ws[4][8] = {};
  for (int c : {0, 1, 2, 3, 5, 6, 7}) {
    i64 x[8], y[4];
    bool flat = true;
    for (int r = 0; r < 8; ++r) {
      x[r] = b.d(r, c);
      flat = flat && (r == 0 || r == 4 || b.zero(r, c));
    }
    ref_kernel4x4(x[0] * 16384, x, y);
    for (int r = 0; r < 4; ++r) ws[r][c] = flat ? wrap(x[0] * 4) : shr(y[r] + 2048, 12);
  }
  Samples s(16);
  for (int r = 0; r < 4; ++r) {
    const i64* w = ws[r];
    const bool flat = (w[1] | w[2] | w[3] | w[5] | w[6] | w[7]) == 0;
    i64 y[4];
    ref_kernel4x4(w[0] * 16384 + (1 << 18), w, y);
    for (int c = 0; c < 4; ++c) s[4 * r + c] = flat ? out(w[0] + 16, 5) : out(y[c], 19);
  }
  return s;
}

// 1/4 scale: rows and columns 0, 1, 3, 5, 7.
Samples ref_2x2(const Block& b) {
  auto odd = [](i64 x1, i64 x3, i64 x5, i64 x7) {
    return 29692 * x1 - 10426 * x3 + 6967 * x5 - 5906 * x7;
  };
  i64 ws[2][8] = {};
  for (int c : {0, 1, 3, 5, 7}) {
    const i64 t10 = b.d(0, c) * 32768 + 4096;
    const i64 t0 = odd(b.d(1, c), b.d(3, c), b.d(5, c), b.d(7, c));
    const bool flat = b.zero(1, c) && b.zero(3, c) && b.zero(5, c) && b.zero(7, c);
    ws[0][c] = flat ? wrap(b.d(0, c) * 4) : shr(t10 + t0, 13);
    ws[1][c] = flat ? wrap(b.d(0, c) * 4) : shr(t10 - t0, 13);
  }
  Samples s(4);
  for (int r = 0; r < 2; ++r) {
    const i64* w = ws[r];
    const bool flat = (w[1] | w[3] | w[5] | w[7]) == 0;
    const i64 t10 = w[0] * 32768 + (1 << 19), t0 = odd(w[1], w[3], w[5], w[7]);
    s[2 * r] = flat ? out(w[0] + 16, 5) : out(t10 + t0, 20);
    s[2 * r + 1] = flat ? out(w[0] + 16, 5) : out(t10 - t0, 20);
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

// Runs `fn` on canvases of 12 rows x 32 bytes filled from two patterns, the
// block at row 2, column 11; returns the W x H block, failing the test if any
// other byte changed or the output depends on the bytes it overwrites.
Samples run(VETAJ_IdctFn fn, const Block& b, int w, int h) {
  constexpr int kStride = 32, kTop = 2, kCol = 11;
  Samples got[2];
  for (int p = 0; p < 2; ++p) {
    std::vector<uint8_t> canvas(kStride * 12);
    for (size_t i = 0; i < canvas.size(); ++i) canvas[i] = static_cast<uint8_t>(i * 37 + p * 0x5A);
    const std::vector<uint8_t> before = canvas;
    uint8_t* rows[8];
    for (int r = 0; r < 8; ++r) rows[r] = canvas.data() + (kTop + r) * kStride;
    fn(lib_centre(), b.mult, b.coef, rows, kCol);
    for (size_t i = 0; i < canvas.size(); ++i) {
      const int r = int(i) / kStride - kTop, c = int(i) % kStride - kCol;
      if (r >= 0 && r < h && c >= 0 && c < w) {
        got[p].push_back(canvas[i]);
      } else if (canvas[i] != before[i]) {
        ADD_FAILURE() << "byte outside the block written at row " << r << " column " << c;
      }
    }
  }
  EXPECT_EQ(got[0], got[1]) << "output depends on the bytes it overwrites";
  return got[0];
}

// ---------------------------------------------------------------------------
// Block generators

enum Kind {
  kTypical,    // decaying amplitudes, small quantisers, many zeros
  kExtreme,    // +-2047 and zeros with quantisers up to 65535
  kWild,       // any 16-bit coefficient, any 32-bit multiplier
  kShortcuts,  // whole zero rows or columns, to exercise both shortcuts
};

struct Gen {
  std::mt19937 rng;
  explicit Gen(uint32_t seed) : rng(seed) {}
  int uniform(int lo, int hi) { return std::uniform_int_distribution<int>(lo, hi)(rng); }

  Block block(Kind kind) {
    Block b;
    const int shape = uniform(0, 2);
    for (int i = 0; i < 64; ++i) {
      const int r = i / 8, c = i % 8, amp = 1024 / (1 + r + c), pick = uniform(0, 3);
      if (kind == kWild) {
        b.coef[i] = static_cast<int16_t>(rng());
        b.mult[i] = static_cast<uint32_t>(rng());
      } else if (kind == kExtreme) {
        const int v = pick == 0 ? 2047 : pick == 1 ? -2047 : pick == 2 ? 0 : uniform(-2047, 2047);
        b.coef[i] = static_cast<int16_t>(v);
        b.mult[i] = static_cast<uint32_t>(uniform(0, 3) ? uniform(1, 65535) : 65535);
      } else {
        b.coef[i] = static_cast<int16_t>(pick == 0 ? 0 : uniform(-amp, amp));
        b.mult[i] = static_cast<uint32_t>(uniform(1, 99));
      }
      // Shortcuts keep only row 0, only column 0, or a few scattered columns.
      const bool keep = shape == 0 ? r == 0 : shape == 1 ? c == 0 : (c % 3 == 0 && r < 3);
      if (kind == kShortcuts && !keep) b.coef[i] = 0;
    }
    return b;
  }
  // The block with AAN multipliers from random quantisers (for the 3/8
  // routine); wild blocks keep any multiplier at all.
  Block aan(Block b, Kind kind) {
    if (kind == kWild) return b;
    uint16_t q[64];
    for (auto& v : q) v = static_cast<uint16_t>(uniform(1, kind == kExtreme ? 65535 : 99));
    vj_build_aan_multipliers(q, b.mult);
    return b;
  }
};

// Blocks of one AC coefficient whose product is +-2^p (p < 16), with a DC
// of -3..4: such values land exactly on the rounding boundaries of the
// descaling shifts. Last, a block whose column 0 has only a DC with a
// product whose x 8192 wraps to 0 (the column shortcut's DC x 4 must be
// used), column 1 an AC value so that the rows take no shortcut.
std::vector<Block> boundary_blocks() {
  std::vector<Block> out;
  for (int k = 1; k < 64; ++k) {
    for (int p = 0; p < 16; ++p) {
      for (int sign : {1, -1}) {
        for (int16_t dc = -3; dc <= 4; ++dc) {
          Block& b = out.emplace_back();
          std::fill(b.mult, b.mult + 64, 1u);
          b.coef[0] = dc;
          b.coef[k] = static_cast<int16_t>(sign * (1 << (p % 8)));
          b.mult[k] = 1u << (p - p % 8);
        }
      }
    }
  }
  Block& b = out.emplace_back();
  std::fill(b.mult, b.mult + 64, 1u);
  b.coef[0] = 1024, b.mult[0] = 1024, b.coef[8 + 1] = 100;
  return out;
}

// ---------------------------------------------------------------------------
// Every routine against its reference

struct Routine {
  const char* name;
  VETAJ_IdctFn fn;
  int w, h;
  Samples (*ref)(const Block&);
  uint64_t used;                 // bit 8r+c: coefficient read
  bool aan;                      // takes AAN multipliers
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
    // The forms for blocks that end early read only the band such blocks use.
    {"4x4to18", vj_idct_4x4_low, 4, 4, ref_4x4, box({0, 1, 2, 3}, {0, 1, 2, 3, 5}), false},
    {"4x4to5", vj_idct_4x4_lower, 4, 4, ref_4x4, box({0, 1, 2}, {0, 1, 2}), false},
    {"2x2to4", vj_idct_2x2_low, 2, 2, ref_2x2, box({0, 1}, {0, 1}), false},
    {"1x1", VETAJ_DoIdct_1x1, 1, 1, ref_1x1, box({0}, {0}), false},
    {"8x4", VETAJ_DoIdct_8x4, 8, 4, ref_8x4, box({0, 1, 2, 3}, {0, 1, 2, 3, 4, 5, 6, 7}), false},
    {"4x8", VETAJ_DoIdct_4x8, 4, 8, ref_4x8, box({0, 1, 2, 3, 4, 5, 6, 7}, {0, 1, 2, 3}), false},
    {"4x2", VETAJ_DoIdct_4x2, 4, 2, ref_4x2, box({0, 1}, {0, 1, 2, 3}), false},
    {"2x4", VETAJ_DoIdct_2x4, 2, 4, ref_2x4, box({0, 1, 2, 3}, {0, 1}), false},
    {"2x1", VETAJ_DoIdct_2x1, 2, 1, ref_pair<0, 1>, box({0}, {0, 1}), false},
    {"1x2", VETAJ_DoIdct_1x2, 1, 2, ref_pair<1, 0>, box({0, 1}, {0}), false},
    {"8to3", VETAJ_DoIdct_8to3, 3, 3, ref_8to3, box({0, 1, 2, 3}, {0, 1, 2}), true},
};

class RoutineTest : public ::testing::TestWithParam<Routine> {};

// Random blocks of every kind match the reference, and a routine reads only
// the coefficients and multipliers of its band (the others may hold
// anything). A DC-only block with product D x Q gives 128 + round(D x Q / 8),
// clamped, at every size; blocks on rounding boundaries match the reference.
TEST_P(RoutineTest, MatchesReferenceAndTouchesOnlyItsBlock) {
  const Routine& rt = GetParam();
  Gen g(static_cast<uint32_t>(rt.w * 131 + rt.h * 7));
  for (int i = 0; i < 6000 && !HasFailure(); ++i) {
    const Kind kind = Kind(i % 4);
    Block b = g.block(kind);
    for (int k = 0; k < 64; ++k)
      if ((rt.used >> k & 1) == 0) b.coef[k] = 0;
    if (rt.aan) b = g.aan(b, kind);
    const Samples got = run(rt.fn, b, rt.w, rt.h);
    ASSERT_EQ(got, rt.ref(b)) << "block " << i;
    if (i % 16 >= 4) continue;
    for (int k = 0; k < 64; ++k) {
      if (rt.used >> k & 1) continue;
      b.coef[k] = static_cast<int16_t>(g.rng());
      b.mult[k] = static_cast<uint32_t>(g.rng());
    }
    ASSERT_EQ(run(rt.fn, b, rt.w, rt.h), got) << "unused input read, block " << i;
  }
  const struct {
    int16_t d;
    uint16_t q;
    uint8_t want;
  } cases[] = {{0, 16, 128},  {1, 8, 129},   {4, 2, 129},  {-64, 16, 0}, {-1, 1024, 0},
               {127, 8, 255}, {8, 127, 255}, {-8, 1, 127}, {3, 1, 128}};
  for (const auto& c : cases) {
    Block b;
    b.coef[0] = c.d;
    uint16_t q[64];
    std::fill(q, q + 64, c.q);
    if (rt.aan) {
      vj_build_aan_multipliers(q, b.mult);
    } else {
      std::copy(q, q + 64, b.mult);
    }
    const Samples got = run(rt.fn, b, rt.w, rt.h);
    EXPECT_EQ(got, Samples(got.size(), c.want)) << "D=" << c.d << " Q=" << c.q;
  }
  for (Block b : boundary_blocks()) {
    for (int k = 0; k < 64; ++k)
      if ((rt.used >> k & 1) == 0) b.coef[k] = 0;
    ASSERT_EQ(run(rt.fn, b, rt.w, rt.h), rt.ref(b));
  }
}

INSTANTIATE_TEST_SUITE_P(All, RoutineTest, ::testing::ValuesIn(kRoutines),
                         [](const auto& p) { return std::string("R") + p.param.name; });

// Slot k of the full-size template equals the full transform on every block
// whose coefficients past zig-zag position k are zero.
class SlotTest : public ::testing::TestWithParam<int> {};

TEST_P(SlotTest, SparseSlotEqualsFullTransformForBlocksEndingThere) {
  const int slot = GetParam();
  Gen g(static_cast<uint32_t>(9000 + slot));
  for (int i = 0; i < 2000; ++i) {
    Block b = g.block(Kind(i % 4));
    const int last = slot < 28 ? slot : g.uniform(28, 63);
    // Every fifth block has only its last coefficient: the sparsest one.
    for (int z = 0; z < 64; ++z)
      if (z > last || (i % 5 == 0 && z < last)) b.coef[VETAJ_NATURAL_ORDER[z]] = 0;
    if (b.coef[VETAJ_NATURAL_ORDER[last]] == 0) b.coef[VETAJ_NATURAL_ORDER[last]] = static_cast<int16_t>(g.uniform(1, 9));
    ASSERT_EQ(run(pIDctFunc[slot], b, 8, 8), run(VETAJ_DoIdct_islow, b, 8, 8)) << "block " << i;
  }
}

INSTANTIATE_TEST_SUITE_P(All, SlotTest, ::testing::Range(0, kIdctSlots));

// ---------------------------------------------------------------------------
// Selectors and small helpers

TEST(Templates, SelectorsRefuseWhatTheyDoNotHold) {
  for (auto [shift, numerator] : {std::pair{4, 1}, {-1, 1}, {1, 3}, {0, 3}})
    EXPECT_EQ(vj_idct_template(shift, numerator, false), nullptr) << shift << "/" << numerator;
  for (auto [w, h] : {std::pair{8, 2}, {0, 0}, {16, 1}, {-8, 8}})
    EXPECT_EQ(vj_idct_for_size(w, h), nullptr) << w << "x" << h;
  // Slot index min(k, 6), never negative; floor(log2 n), -1 below 1.
  for (auto [k, want] : {std::pair{-1, 0}, {6, 6}, {63, 6}})
    EXPECT_EQ(VETAJ_GetDctMethodIndex(k), want) << k;
  for (auto [n, want] : {std::pair{1, 0}, {0, -1}, {12, 3}, {INT32_MAX, 30}})
    EXPECT_EQ(VETAJ_LOGN(n), want) << n;
}

// ---------------------------------------------------------------------------
// Range-limit tables and AAN factors

TEST(RangeLimit, MainTableClampsFromBothAddresses) {
  uint8_t table[kRangeLimitBytes + 2];
  std::memset(table, 0xEE, sizeof table);
  const uint8_t* identity = vj_fill_range_limit(table + 1);
  EXPECT_EQ(identity, table + 1 + kRangeLimitIdentityOffset);
  EXPECT_EQ(table[0], 0xEE);
  EXPECT_EQ(table[kRangeLimitBytes + 1], 0xEE);
  // Plain clamping from the identity part over -256..639; from the centre,
  // the value a 10-bit index stands for (-512..511) + 128, clamped, with 0
  // below -384. Together the two cover every byte.
  for (int i = -256; i < 640; ++i) EXPECT_EQ(identity[i], std::clamp(i, 0, 255)) << i;
  const uint8_t* centre = vj_range_limit_centre(identity);
  for (int m = 0; m < 1024; ++m) {
    const int v = m < 512 ? m : m - 1024;
    EXPECT_EQ(centre[m], v < -384 ? 0 : std::clamp(v + 128, 0, 255)) << m;
  }
}

TEST(RangeLimit, ChromaTableCompressesEveryEntry) {
  for (int i = 0; i < 256; ++i) {
    const int want = i < 16 ? 23 : i > 240 ? 233 : 128 + (i - 128) * 120 / 128;  // truncated
    EXPECT_EQ(vj_chroma_compress(uint32_t(i)), want) << i;
  }
  uint8_t main_table[kRangeLimitBytes], chroma[kRangeLimitBytes];
  vj_fill_range_limit(main_table);
  EXPECT_EQ(vj_fill_range_limit_chroma(chroma), chroma + kRangeLimitIdentityOffset);
  for (uint32_t i = 0; i < kRangeLimitBytes; ++i)
    EXPECT_EQ(chroma[i], vj_chroma_compress(main_table[i])) << i;
}

TEST(Aan, ScaleTableAndMultipliers) {
  auto c = [](int k) {
    return k == 0 ? 1.0 : std::sqrt(2.0) * std::cos(k * std::numbers::pi / 16);
  };
  uint16_t q[64];
  for (int i = 0; i < 64; ++i) q[i] = static_cast<uint16_t>(i == 9 ? 65535 : i + 1);
  uint32_t m[64];
  vj_build_aan_multipliers(q, m);
  for (int i = 0; i < 64; ++i) {
    EXPECT_EQ(kAanScale[i], std::lround(16384 * c(i / 8) * c(i % 8))) << i;
    // 12 fractional bits, truncated; the largest product does not overflow.
    EXPECT_EQ(m[i], uint32_t(uint64_t{q[i]} * kAanScale[i] / 4)) << i;
  }
}

}  // namespace
