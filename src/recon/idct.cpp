// The full-size 8x8 inverse DCT, its sparse-block forms, the slot templates
// and the selectors used by the scaled drivers.
#include "recon/idct.h"

#include "recon/idct_kernels.h"

namespace vj::idct {
namespace {

// 8x8 transform of a block whose non-zero coefficients all lie in its first
// R rows and C columns. Coefficients outside that box are never read and
// enter the arithmetic as the zeros they are, so every instance gives
// exactly the output of the full <8, 8> instance on such a block.
template <int R, int C>
void islow(const uint8_t* centre, const uint32_t* mult, const int16_t* coef, uint8_t** rows,
           uint32_t col) {
  if constexpr (R == 1 && C == 1) {
    // DC only: every column but the first is zero, the first takes DC x 4,
    // and every row then takes its zero-AC shortcut with that value.
    const w32 dc = dequant(coef[0], mult[0]) << 2;
    fill_block(rows, col, sample(centre, dc + 16, 5), 8, 8);
  } else {
    // Pass 1: columns into the workspace; columns past C are zero and are
    // left out (row8<C> treats them as zero).
    w32 ws[8 * C];
    for (int c = 0; c < C; ++c) column8<R>(mult, coef, c, ws + c, C);

    // Pass 2: rows, with the zero-AC shortcut.
    for (int r = 0; r < 8; ++r) {
      const w32* w = ws + r * C;
      uint8_t* out = rows[r] + col;
      w32 ac = 0;
      for (int c = 1; c < C; ++c) ac |= w[c];
      if (ac == 0) {
        std::memset(out, sample(centre, w[0] + 16, 5), 8);
      } else {
        row8<C>(centre, w, out);
      }
    }
  }
}

// Natural-order position of each zig-zag index 0..27.
constexpr uint8_t kZigzag[28] = {0, 1, 8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11,
                                 4, 5, 12, 19, 26, 33, 40, 48, 41, 34, 27, 20, 13, 6};

// Side of the square box (top-left n x n coefficients) that holds every
// zig-zag position up to k, for k < 28. Square boxes keep the number of
// distinct routines small: 1, 2, 3, 4, 5, 6 and 7.
constexpr int box_side(int k) {
  int n = 1;
  for (int i = 0; i <= k; ++i) {
    const int row = kZigzag[i] / 8 + 1;
    const int column = kZigzag[i] % 8 + 1;
    if (row > n) n = row;
    if (column > n) n = column;
  }
  return n;
}

// Routine of sparse slot k (k < 28): the box transform for its side.
template <int K>
constexpr VETAJ_IdctFn kSparseSlot = &islow<box_side(K), box_side(K)>;

}  // namespace
}  // namespace vj::idct

using vj::idct::kSparseSlot;

void VETAJ_DoIdct_islow(const uint8_t* centre, const uint32_t* multipliers,
                        const int16_t* coefficients, uint8_t** output_rows, uint32_t output_col) {
  vj::idct::islow<8, 8>(centre, multipliers, coefficients, output_rows, output_col);
}

// Slot k holds the routine for blocks whose coefficients end at zig-zag
// position k; slot 28 (k >= 28) the full transform.
extern "C" const VETAJ_IdctFn pIDctFunc[29] = {
    kSparseSlot<0>,  kSparseSlot<1>,  kSparseSlot<2>,  kSparseSlot<3>,    kSparseSlot<4>,
    kSparseSlot<5>,  kSparseSlot<6>,  kSparseSlot<7>,  kSparseSlot<8>,    kSparseSlot<9>,
    kSparseSlot<10>, kSparseSlot<11>, kSparseSlot<12>, kSparseSlot<13>,   kSparseSlot<14>,
    kSparseSlot<15>, kSparseSlot<16>, kSparseSlot<17>, kSparseSlot<18>,   kSparseSlot<19>,
    kSparseSlot<20>, kSparseSlot<21>, kSparseSlot<22>, kSparseSlot<23>,   kSparseSlot<24>,
    kSparseSlot<25>, kSparseSlot<26>, kSparseSlot<27>, VETAJ_DoIdct_islow};

#define VJ_SLOTS7(fn) \
  { fn, fn, fn, fn, fn, fn, fn }

// Every slot the full transform.
extern "C" const VETAJ_IdctFn pIDctFuncIslow[29] = {
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow, VETAJ_DoIdct_islow,
    VETAJ_DoIdct_islow};

const VETAJ_IdctFn pIDctResizeFunc2to1[7] = VJ_SLOTS7(VETAJ_DoIdct_4x4);
const VETAJ_IdctFn pIDctResizeFunc4to1[7] = VJ_SLOTS7(VETAJ_DoIdct_2x2);
const VETAJ_IdctFn pIDctResizeFunc8to1[7] = VJ_SLOTS7(VETAJ_DoIdct_1x1);
const VETAJ_IdctFn pIDctResizeFunc8to3[7] = VJ_SLOTS7(VETAJ_DoIdct_8to3);

#undef VJ_SLOTS7

// By scale index; entry 0 is the uniform full-size template, which is safe
// under any slot numbering.
extern "C" const VETAJ_IdctFn* const pIDctResizeFunc[4] = {
    pIDctFuncIslow, pIDctResizeFunc2to1, pIDctResizeFunc4to1, pIDctResizeFunc8to1};

const VETAJ_IdctFn* vj_idct_template(int32_t shift, int32_t numerator, bool islow) {
  if (numerator == 3) return shift == 3 ? pIDctResizeFunc8to3 : nullptr;
  if (numerator != 1 || shift < 0 || shift > 3) return nullptr;
  if (shift == 0) return islow ? pIDctFuncIslow : pIDctFunc;
  return pIDctResizeFunc[shift];
}

VETAJ_IdctFn vj_idct_for_size(int32_t width, int32_t height) {
  if (width < 1 || width > 8 || height < 1 || height > 8) return nullptr;
  switch (width * 16 + height) {
    case 8 * 16 + 8: return VETAJ_DoIdct_islow;
    case 8 * 16 + 4: return VETAJ_DoIdct_8x4;
    case 4 * 16 + 8: return VETAJ_DoIdct_4x8;
    case 4 * 16 + 4: return VETAJ_DoIdct_4x4;
    case 4 * 16 + 2: return VETAJ_DoIdct_4x2;
    case 2 * 16 + 4: return VETAJ_DoIdct_2x4;
    case 2 * 16 + 2: return VETAJ_DoIdct_2x2;
    case 2 * 16 + 1: return VETAJ_DoIdct_2x1;
    case 1 * 16 + 2: return VETAJ_DoIdct_1x2;
    case 1 * 16 + 1: return VETAJ_DoIdct_1x1;
    default: return nullptr;
  }
}

// The selectors give the scale's routine whatever the index: the paths that
// use them pass an index that does not bound the block's coefficients.
extern "C" VETAJ_IdctFn VETAJ_GetDctMethod8to1(DecoderInfo*, int32_t) { return VETAJ_DoIdct_1x1; }
extern "C" VETAJ_IdctFn VETAJ_GetDctMethod4to1(DecoderInfo*, int32_t) { return VETAJ_DoIdct_2x2; }
extern "C" VETAJ_IdctFn VETAJ_GetDctMethod2to1(DecoderInfo*, int32_t) { return VETAJ_DoIdct_4x4; }
extern "C" VETAJ_IdctFn VETAJ_GetDctMethod8to3(DecoderInfo*, int32_t) { return VETAJ_DoIdct_8to3; }

extern "C" int32_t VETAJ_GetDctMethodIndex(int32_t last_index) {
  return vj_reduced_slot(last_index);
}

int32_t VETAJ_GetDctMethodIndexFirst(int32_t) { return 0; }

int32_t VETAJ_LOGN(int32_t n) {
  if (n < 1) return -1;
  int32_t halvings = 0;
  while (n > 1) {
    n /= 2;
    ++halvings;
  }
  return halvings;
}
