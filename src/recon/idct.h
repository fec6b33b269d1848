// Inverse DCT: the full-size 8x8 transform, the reduced and rectangular
// transforms, the slot templates the decoder copies its transform table
// from, and the sample range-limit (clamping) tables.
//
// Every transform has the VETAJ_IdctFn signature:
//   routine(centre, multipliers, coefficients, output_rows, output_col)
// - centre: the range-limit table's centre (see below);
// - multipliers: 64 dequantisation values in natural order;
// - coefficients: 64 quantised coefficients in natural (row-major) order;
// - output_rows: one row pointer per output row, top to bottom;
// - output_col: byte offset of the block's left edge within each row.
// A routine writes exactly its W x H output bytes (W bytes at output_col in
// each of the first H rows) and nothing else. Coefficient x multiplier and
// all later arithmetic is 32-bit two's complement: hostile values wrap, the
// final value is masked to 0..1023 and looked up in the table, so no input
// can index outside it.
#ifndef VETAJ_RECON_IDCT_H
#define VETAJ_RECON_IDCT_H

#include <cstdint>

#include "VetaJpegDecoder.h"

// --- Transforms (the name gives output width x height) ---

// Function type of every transform (the type VETAJ_IdctFn points to).
using IdctRoutine = void(const uint8_t* centre, const uint32_t* multipliers,
                         const int16_t* coefficients, uint8_t** output_rows, uint32_t output_col);

// 8x8 accurate integer transform.
IdctRoutine VETAJ_DoIdct_islow;
// The 1x1 transform: the DC value's sample, (DC x multiplier + 4) >> 3.
// Inline for the 1/8 row driver, which calls it for every block.
inline void vj_idct_1x1(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                        uint8_t** rows, uint32_t col) {
  const uint32_t v = static_cast<uint32_t>(static_cast<int32_t>(coef[0])) * mult[0] + 4;
  rows[0][col] = centre[(v >> 3) & 1023u];
}

// Square reductions: 1/2 (4x4), 1/4 (2x2), 1/8 (1x1).
IdctRoutine VETAJ_DoIdct_4x4;
IdctRoutine VETAJ_DoIdct_2x2;
IdctRoutine VETAJ_DoIdct_1x1;
// VETAJ_DoIdct_4x4 for a block whose coefficients end by zig-zag position
// 18 (as the 1/2 decoder leaves them) or 5, and VETAJ_DoIdct_2x2 for one
// that ends by position 4 (as the 1/4 decoder leaves it): the same output,
// reading less.
IdctRoutine vj_idct_4x4_low;
IdctRoutine vj_idct_4x4_lower;
IdctRoutine vj_idct_2x2_low;
// Rectangular sizes of the per-component scaled mode.
IdctRoutine VETAJ_DoIdct_8x4;
IdctRoutine VETAJ_DoIdct_4x8;
IdctRoutine VETAJ_DoIdct_4x2;
IdctRoutine VETAJ_DoIdct_2x4;
IdctRoutine VETAJ_DoIdct_2x1;
IdctRoutine VETAJ_DoIdct_1x2;
// 3/8 scale: 3x3 output. Its multipliers carry the AAN scale factors (build
// them with vj_build_aan_multipliers), not the plain quantisers.
IdctRoutine VETAJ_DoIdct_8to3;

// --- Slot templates ---
//
// Full size (pIDctFunc, pIDctFuncIslow; 29 entries, public header): the
// driver calls slot min(k, 28) for a block whose last decoded coefficient
// sits at zig-zag position k. pIDctFunc holds, in slot k < 28, a routine
// specialised for blocks whose coefficients past zig-zag position k are all
// zero (bit-identical to VETAJ_DoIdct_islow on every such block); slot 28
// and every slot of pIDctFuncIslow hold VETAJ_DoIdct_islow itself. A caller
// that cannot vouch for k must use pIDctFuncIslow or VETAJ_DoIdct_islow.
//
// Reduced sizes (7 entries, called with slot min(k, 6) or with the
// component index): every entry holds the same routine, so any slot number
// 0..6 is safe.
extern const VETAJ_IdctFn pIDctResizeFunc2to1[7];  // VETAJ_DoIdct_4x4
extern const VETAJ_IdctFn pIDctResizeFunc4to1[7];  // VETAJ_DoIdct_2x2
extern const VETAJ_IdctFn pIDctResizeFunc8to1[7];  // VETAJ_DoIdct_1x1
extern const VETAJ_IdctFn pIDctResizeFunc8to3[7];  // VETAJ_DoIdct_8to3
//
// pIDctResizeFunc[scale index] (public header) points at a 7-entry
// template: [0] full size (pIDctFuncIslow, every entry the full routine, so
// it is safe with any slot number up to 28), [1] 1/2, [2] 1/4, [3] 1/8. The
// 3/8 template is not in it (its scale index is also 3): use
// vj_idct_template().

// Number of slots of a reduced template.
constexpr int32_t kIdctResizeSlots = 7;
// Number of slots of the full-size template.
constexpr int32_t kIdctSlots = 29;

// The template to install for a decode at scale 1/2^shift (shift 0..3) or,
// with numerator 3, at 3/8; `islow` picks the uniform full-size template
// at shift 0. Null for any other combination. At shift 0 the result has 29
// entries, otherwise 7.
const VETAJ_IdctFn* vj_idct_template(int32_t shift, int32_t numerator, bool islow);

// Routine of the per-component scaled mode for a DCT scaled width x height
// (each 1, 2, 4 or 8); null for a size without a routine.
VETAJ_IdctFn vj_idct_for_size(int32_t width, int32_t height);

// Index functions of the reduced drivers (the exported one,
// VETAJ_GetDctMethodIndex, gives min(k, 6), and 0 for a negative k). This
// one always gives 0: the paths that use it do not track k.
int32_t VETAJ_GetDctMethodIndexFirst(int32_t last_index);
inline int32_t vj_reduced_slot(int32_t last_index) {
  if (last_index < 0) return 0;
  return last_index < kIdctResizeSlots - 1 ? last_index : kIdctResizeSlots - 1;
}

// floor(log2 n) for n >= 1; -1 for n <= 0.
int32_t VETAJ_LOGN(int32_t n);

// --- Range-limit tables ---
//
// A 1408-byte table, addressed from two points:
//   identity part (table + 256), used by the colour converters for plain
//     clamping: identity[i] = clamp(i, 0, 255) for i in -256..+639;
//   centre (table + 384 = identity + 128), passed to the transforms, which
//     index it with a 10-bit masked value m in 0..1023:
//       m 0..127 -> 128 + m, m 128..511 -> 255, m 512..895 -> 0,
//       m 896..1023 -> m - 896 (a transform output of m - 1024).
//     centre[v] is also clamp(v + 128, 0, 255) for v in -384..+511.
// Layout: 256 x 0, identity 0..255, 384 x 255, 384 x 0, identity 0..127.
constexpr uint32_t kRangeLimitBytes = 1408;
constexpr uint32_t kRangeLimitIdentityOffset = 256;
constexpr uint32_t kRangeLimitCentreOffset = 384;

// Fills the main table (kRangeLimitBytes bytes at `table`) and returns its
// identity part.
uint8_t* vj_fill_range_limit(uint8_t* table);

// Fills the chroma table of option KOLVAVETA_OPT_CHROMA_RANGE and returns
// its identity part. Every entry is the main table's entry passed through
// the compression map: v < 16 -> 23, v > 240 -> 233, otherwise
// 128 + trunc((v - 128) * 120 / 128). Overflowing transform outputs thus
// saturate at 23 and 233 like in-range ones.
uint8_t* vj_fill_range_limit_chroma(uint8_t* table);

// The chroma compression map itself (v in 0..255).
uint8_t vj_chroma_compress(uint32_t v);

// Centre of a table given its identity part (what the transforms take).
inline const uint8_t* vj_range_limit_centre(const uint8_t* identity) { return identity + 128; }

// --- AAN scaling ---

// 16384 x c(u) x c(v) rounded, c(0) = 1, c(k) = sqrt(2) cos(k pi / 16), in
// natural order (row u = vertical frequency).
extern const uint16_t kAanScale[64];

// Multipliers for VETAJ_DoIdct_8to3: (quant[i] x kAanScale[i]) >> 2, that
// is 12 fractional bits. `quant` is in natural order.
void vj_build_aan_multipliers(const uint16_t quant[64], uint32_t out[64]);

#endif  // VETAJ_RECON_IDCT_H
