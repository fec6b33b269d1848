// iMCU-row drivers of full-size and reduced output, the DC-only drivers
// beyond 1/8, and the row controller of reduced output.
#include "drivers/scaled.h"

#include <cstring>

#include "drivers/init.h"
#include "entropy/mcu.h"
#include "recon/idct.h"
#include "recon/upsample.h"
#include "syntax/scan_setup.h"

namespace {

// Rows of the decoded (reduced) picture handed to the converters so far.
uint32_t rows_consumed(const DecoderInfo* d) {
  return d->reduced_height - d->upsampler->rows_to_go;
}

int32_t full_index(int32_t last) { return last > 28 ? 28 : (last < 0 ? 0 : last); }

// Top image row of the current MCU row and the block rows per MCU row.
struct McuRowGeometry {
  uint32_t mcu_px;    // MCU height in image pixels
  uint32_t block_px;  // image rows one MCU row of this scan covers
  bool single;        // single-component scan
};

McuRowGeometry row_geometry(const DecoderInfo* d) {
  McuRowGeometry g;
  g.mcu_px = d->mcu_height_px != 0 ? d->mcu_height_px : 8;
  g.single = d->comps_in_scan == 1;
  g.block_px = g.single ? g.mcu_px / d->scan_components[0]->v_samp : g.mcu_px;
  return g;
}

// Region decoding: true when the rows decoded so far have passed the bottom
// of the requested window.
bool past_region(const DecoderInfo* d) {
  const DecInfo* o = d->owner;
  if (o == nullptr || o->region_mode == 0 || d->cropped_reduced_height <= 0) return false;
  const uint64_t seen = uint64_t(d->visible_height) * rows_consumed(d) /
                        static_cast<uint32_t>(d->cropped_reduced_height);
  return seen > uint64_t(o->region_top) + o->region_height;
}

// Region decoding: true while the current iMCU row lies above the window.
bool above_region(const DecoderInfo* d, uint32_t mcu_px) {
  const DecInfo* o = d->owner;
  return o != nullptr && o->region_mode != 0 && d->imcu_row < o->region_top / mcu_px;
}

// Coefficient blocks start empty and are emptied again after use: only the
// positions up to the block's last coefficient can hold values. Zig-zag
// positions up to 18 (all the reduced decoders keep, and where most blocks
// end) lie in the first five rows: those are cleared with fixed-size stores,
// which is cheaper than a loop whose length varies from block to block.
inline void clear_block(int16_t* blk, int32_t last) {
  if (last >= 0 && last <= 18) {
    std::memset(blk, 0, 5 * 8 * sizeof(int16_t));
  } else {
    std::memset(blk, 0, 64 * sizeof(int16_t));
  }
}

// Decodes one MCU into the (empty) blocks; on failure applies the rule for
// damaged data: more than 15 picture rows below the MCU's top fail the row,
// otherwise the MCU decodes flat. Returns false when the row must fail.
bool decode_one(DecoderInfo* d, McuDecodeFn decode, bool skipping, uint32_t top) {
  const uint32_t nb = d->blocks_in_mcu;
  const int32_t ok = skipping ? VETAJ_SkipMcu(d) : decode(d, d->imcu.blocks);
  if (ok != 0) return true;
  ++d->error_count;
  if (d->image_height > top && d->image_height - top > 15) return false;
  std::memset(d->coef_area, 0, nb * 64 * sizeof(int16_t));
  for (uint32_t b = 0; b < nb; ++b) d->last_nonzero[b] = 0;
  return true;
}

// Advances to the next iMCU row: 101 after the last one.
int32_t next_imcu_row(DecoderInfo* d) {
  ++d->imcu_row;
  if (d->imcu_row >= d->total_imcu_rows) return vj::kStatusEnd;
  VETAJ_SetupiMcu(d);
  return vj::kStatusNextRow;
}

// Block (bx, by) of block b within its MCU, and its component.
struct BlockPlace {
  const ComponentInfo* comp;
  uint32_t bx, by;
};

template <class F>
void for_each_block(const DecoderInfo* d, F&& f) {
  const bool single = d->comps_in_scan == 1;
  uint32_t b = 0;
  for (uint32_t p = 0; p < d->comps_in_scan; ++p) {
    const ComponentInfo* c = d->scan_components[p];
    const uint32_t mw = single ? 1 : c->mcu_width;
    const uint32_t mh = single ? 1 : c->mcu_height;
    for (uint32_t by = 0; by < mh; ++by)
      for (uint32_t bx = 0; bx < mw; ++bx, ++b) f(b, BlockPlace{c, bx, by});
  }
}

const uint8_t* centre_for(const DecoderInfo* d, const ComponentInfo* c) {
  return vj_range_limit_centre(c->index == 0 ? d->range_limit : d->range_limit_chroma);
}

}  // namespace

namespace {

// Transform policies of the row driver. Each gives the routine for a block
// whose last coefficient is at zig-zag index `last`.
struct InstalledSlots {  // the decoder's table, indexed by min(last, 28)
  const DecoderInfo* d;
  VETAJ_IdctFn operator()(int32_t last) const { return d->idct_slots[full_index(last)]; }
};
struct ReducedSlots {  // the reduced table, indexed by min(last, 6)
  const DecoderInfo* d;
  VETAJ_IdctFn operator()(int32_t last) const {
    const VETAJ_IdctFn f = d->idct_slots[vj_reduced_slot(last)];
    if (last < 0) return f;
    if (f == VETAJ_DoIdct_4x4 && last <= 18) return last <= 5 ? vj_idct_4x4_lower : vj_idct_4x4_low;
    return f == VETAJ_DoIdct_2x2 && last <= 4 ? vj_idct_2x2_low : f;
  }
};
struct DcSample {  // the 1x1 transform for every block, inlined
  struct Call {
    void operator()(const uint8_t* centre, const uint32_t* mult, const int16_t* coef,
                    uint8_t** rows, uint32_t col) const {
      vj_idct_1x1(centre, mult, coef, rows, col);
    }
  };
  Call operator()(int32_t) const { return {}; }
};
struct Selectors {  // index and method functions given by the caller
  DecoderInfo* d;
  IdctIndexFn index;
  IdctMethodFn method;
  VETAJ_IdctFn operator()(int32_t last) const { return method(d, index(last)); }
};

// Where one block of an MCU goes within an MCU row.
struct BlockTarget {
  const uint8_t* centre;
  const uint32_t* mult;
  uint8_t** rows;   // the component's first output row of the block
  uint32_t x0;      // output column of the block in the MCU at column 0
  uint32_t x_step;  // output columns per MCU
  bool visible;     // inside the component's height (else only emptied)
};

// One iMCU row: decode each MCU with `decode`, transform each block into the
// sample rows (blocks `block_step` samples apart), empty the blocks.
template <class Transform>
int32_t decode_rows(DecoderInfo* d, uint8_t*** rows, McuDecodeFn decode, Transform transform,
                    uint32_t block_step) {
  if (past_region(d)) return vj::kStatusEnd;
  const McuRowGeometry g = row_geometry(d);
  const bool skipping = above_region(d, g.mcu_px);
  const uint32_t nb = d->blocks_in_mcu < 10 ? d->blocks_in_mcu : 10;
  BlockTarget targets[10];
  for (uint32_t mr = d->imcu.mcu_row; mr < d->imcu.mcu_rows; ++mr) {
    const uint32_t scan_row =
        g.single ? d->imcu_row * d->scan_components[0]->v_samp + mr : d->imcu_row;
    const uint32_t top = d->imcu_row * g.mcu_px + (g.single ? mr * g.block_px : 0);
    // The blocks' places are the same for every MCU of the row.
    for_each_block(d, [&](uint32_t b, const BlockPlace& p) {
      if (b >= nb) return;
      const ComponentInfo* c = p.comp;
      const uint32_t block_row_in_imcu = g.single ? mr : p.by;
      const uint32_t mw = g.single ? 1 : c->mcu_width;
      targets[b] = BlockTarget{centre_for(d, c),
                               c->multipliers,
                               rows[c->index] + block_row_in_imcu * block_step,
                               p.bx * block_step,
                               mw * block_step,
                               d->imcu_row * c->v_samp + block_row_in_imcu < c->height_blocks};
    });
    for (uint32_t col = d->imcu.first_col; col < d->mcus_per_row; ++col) {
      d->current_mcu_row = scan_row;
      d->current_mcu_col = col;
      if (!decode_one(d, decode, skipping, top)) {
        d->imcu.mcu_row = mr;
        d->imcu.first_col = col;
        return vj::kStatusCorrupt;
      }
      if (skipping) continue;
      for (uint32_t b = 0; b < nb; ++b) {
        const BlockTarget& t = targets[b];
        int16_t* blk = d->imcu.blocks[b];
        const int32_t last = d->last_nonzero[b];
        if (t.visible) transform(last)(t.centre, t.mult, blk, t.rows, col * t.x_step + t.x0);
        clear_block(blk, last);
      }
    }
    d->imcu.first_col = 0;
  }
  return next_imcu_row(d);
}

}  // namespace

int32_t VETAJ_DecodeSingleiMcuResizeNto1(DecoderInfo* d, uint8_t*** rows, McuDecodeFn decode,
                                         IdctIndexFn index, IdctMethodFn method,
                                         uint32_t block_step) {
  return decode_rows(d, rows, decode, Selectors{d, index, method}, block_step);
}

int32_t VETAJ_DecodeSingleiMcu(DecoderInfo* d, uint8_t*** rows) {
  return decode_rows(d, rows, d->decode_mcu, InstalledSlots{d}, 8);
}

int32_t VETAJ_DecodeSingleiMcuResize2to1(DecoderInfo* d, uint8_t*** rows) {
  return decode_rows(d, rows, VETAJ_DecodeMcu_2to1, ReducedSlots{d}, 4);
}

int32_t VETAJ_DecodeSingleiMcuResize4to1(DecoderInfo* d, uint8_t*** rows) {
  return decode_rows(d, rows, VETAJ_DecodeMcu_4to1, ReducedSlots{d}, 2);
}

int32_t VETAJ_DecodeSingleiMcuResize8to1(DecoderInfo* d, uint8_t*** rows) {
  return decode_rows(d, rows, VETAJ_DecodeMcu_8to1, DcSample{}, 1);
}

int32_t VETAJ_DecompressOnepass(DecoderInfo* d, uint8_t*** rows) {
  switch (d->scale_shift) {
    case 1:
      return decode_rows(d, rows, d->decode_mcu_reduced, ReducedSlots{d}, 4);
    case 2:
      return decode_rows(d, rows, d->decode_mcu_reduced, ReducedSlots{d}, 2);
    default:
      return decode_rows(d, rows, d->decode_mcu_reduced, DcSample{}, 1);
  }
}

namespace {

// The 1/8 sample of a DC value, through the 1x1 transform.
inline void store_dc(DecoderInfo* d, const ComponentInfo* c, int32_t dc, uint8_t** row,
                     uint32_t col) {
  int16_t block[64];
  block[0] = static_cast<int16_t>(dc);
  VETAJ_DoIdct_1x1(centre_for(d, c), c->multipliers, block, row, col);
}

// Beyond 1/8: DC values only. With `average`, the DC values of 2 x 2
// neighbouring MCUs (two columns of two iMCU rows) are averaged into one
// sample per block position; otherwise one MCU column in a run of k + 1 is
// passed over and one iMCU row in 2^k reaches the output.
int32_t dc_only_rows(DecoderInfo* d, uint8_t*** rows, bool average) {
  if (past_region(d)) return vj::kStatusEnd;
  const uint32_t k = d->scale_shift - 3;  // 1, 2, 3
  const uint32_t shift = d->scale_shift;
  const uint32_t period = average ? 2u : (1u << k);
  const McuRowGeometry g = row_geometry(d);
  const uint32_t nb = d->blocks_in_mcu;
  const uint32_t pairs = (d->mcus_per_row + 1) / 2;
  if (average && d->dc_sums == nullptr) {
    d->dc_sums = vj::alloc_zeroed<int32_t>(pairs * kMaxBlocksInMcu);
    if (d->dc_sums == nullptr) return vj::kStatusCorrupt;
  }
  const uint32_t rows_here = d->total_imcu_rows - d->imcu_row;
  const uint32_t rows_in_group = rows_here < period ? rows_here : period;
  for (uint32_t p = 0; p < period && d->imcu_row < d->total_imcu_rows; ++p) {
    for (uint32_t mr = d->imcu.mcu_row; mr < d->imcu.mcu_rows; ++mr) {
      const uint32_t scan_row =
          g.single ? d->imcu_row * d->scan_components[0]->v_samp + mr : d->imcu_row;
      const uint32_t top = d->imcu_row * g.mcu_px + (g.single ? mr * g.block_px : 0);
      uint32_t run = 0;
      for (uint32_t col = d->imcu.first_col; col < d->mcus_per_row; ++col) {
        d->current_mcu_row = scan_row;
        d->current_mcu_col = col;
        if (!decode_one(d, VETAJ_DecodeMcu_8to1, false, top)) {
          d->imcu.mcu_row = mr;
          d->imcu.first_col = col;
          return vj::kStatusCorrupt;
        }
        if (average) {
          // Each DC enters with the weight of the MCUs that share its sample.
          const uint32_t cols_in_pair = (col | 1) < d->mcus_per_row ? 2u : 1u;
          const uint32_t n = cols_in_pair * rows_in_group;
          const int32_t half = static_cast<int32_t>(n / 2);
          const uint32_t log = n == 4 ? 2 : (n == 2 ? 1 : 0);
          int32_t* slot = d->dc_sums + (col / 2) * kMaxBlocksInMcu;
          for (uint32_t b = 0; b < nb; ++b) {
            slot[b] += (d->imcu.blocks[b][0] + half) >> log;
            d->imcu.blocks[b][0] = 0;
          }
          continue;
        }
        // iMCU rows between the kept ones are only decoded; in a kept row
        // one MCU column in each run of k + 1 is passed over.
        const bool used = p == 0 && run != k;
        run = (p == 0 && run == k) ? 0 : run + 1;
        for_each_block(d, [&](uint32_t b, const BlockPlace& pl) {
          if (used) {
            const ComponentInfo* c = pl.comp;
            const uint32_t row = g.single ? mr : pl.by;
            const uint32_t x = ((c->h_samp * 8u * col) >> shift) + pl.bx;
            store_dc(d, c, d->imcu.blocks[b][0], rows[c->index] + row, x);
          }
          d->imcu.blocks[b][0] = 0;
        });
      }
      d->imcu.first_col = 0;
    }
    ++d->imcu_row;
    if (d->imcu_row < d->total_imcu_rows) VETAJ_SetupiMcu(d);
  }
  if (average) {
    for (uint32_t pc = 0; pc < pairs; ++pc) {
      int32_t* slot = d->dc_sums + pc * kMaxBlocksInMcu;
      for_each_block(d, [&](uint32_t b, const BlockPlace& pl) {
        const ComponentInfo* c = pl.comp;
        store_dc(d, c, slot[b], rows[c->index] + pl.by, pc * c->h_samp + pl.bx);
        slot[b] = 0;
      });
    }
  }
  return d->imcu_row >= d->total_imcu_rows ? vj::kStatusEnd : vj::kStatusNextRow;
}

}  // namespace

int32_t VETAJ_DecodeSingleiMcuResizeMore16(DecoderInfo* d, uint8_t*** rows) {
  return dc_only_rows(d, rows, false);
}
int32_t VETAJ_DecodeSingleiMcuResize16_YUV420(DecoderInfo* d, uint8_t*** rows) {
  return dc_only_rows(d, rows, true);
}
int32_t VETAJ_DecodeSingleiMcuResize16_YUV422H2V1(DecoderInfo* d, uint8_t*** rows) {
  return dc_only_rows(d, rows, true);
}
int32_t VETAJ_DecodeSingleiMcuResize16_YUV444(DecoderInfo* d, uint8_t*** rows) {
  return dc_only_rows(d, rows, true);
}

int32_t VETAJ_DecodeSingleiMcu_resize(DecoderInfo* d, uint8_t*** rows) {
  const uint32_t s = d->scale_shift;
  if (s == 0) return vj::kStatusFail;
  if (d->scale_num == 3) {
    return VETAJ_DecodeSingleiMcuResizeNto1(
        d, rows, VETAJ_DecodeMcu_8to3, VETAJ_GetDctMethodIndexFirst, VETAJ_GetDctMethod8to3, 3);
  }
  if (s <= 3) {
    if (d->fast_reduced) return VETAJ_DecompressOnepass(d, rows);
    switch (s) {
      case 1:
        return VETAJ_DecodeSingleiMcuResize2to1(d, rows);
      case 2:
        return VETAJ_DecodeSingleiMcuResize4to1(d, rows);
      default:
        return VETAJ_DecodeSingleiMcuResize8to1(d, rows);
    }
  }
  // Beyond 1/8: three-component baseline pictures at 1/16 average 2 x 2 MCUs.
  if (s == 4 && d->num_components == 3 && d->comps_in_scan == 3 &&
      d->marker->frame_kind == kFrameBaseline && d->components[1].h_samp == 1 &&
      d->components[1].v_samp == 1 && d->components[2].h_samp == 1 &&
      d->components[2].v_samp == 1) {
    const uint32_t mh = d->max_h_samp, mv = d->max_v_samp;
    if (mh == 2 && mv == 1) return VETAJ_DecodeSingleiMcuResize16_YUV422H2V1(d, rows);
    if (mh == 1 && mv == 1) return VETAJ_DecodeSingleiMcuResize16_YUV444(d, rows);
    if (mh == 2 && mv == 2) return VETAJ_DecodeSingleiMcuResize16_YUV420(d, rows);
  }
  return VETAJ_DecodeSingleiMcuResizeMore16(d, rows);
}

namespace {

// The buffer is free again once its eight full-size row groups are out.
void release_buffer(DecoderInfo* d) {
  if (d->controller.group_counter >= 8 || d->upsampler->rows_to_go == 0)
    d->controller.buffer_full = 0;
}

}  // namespace

bool vj_refill_rows(DecoderInfo* d, uint32_t which, bool check, int32_t* status) {
  RowController& ctl = d->controller;
  *status = 0;
  if (ctl.buffer_full != 0) return true;
  if (ctl.finished != 0) {
    *status = vj::kStatusEnd;
    return false;
  }
  const int32_t filled = vj_fill_imcu_buffer(d, which, check);
  if (filled == vj::kStatusFail) {
    *status = filled;
    return false;
  }
  *status = filled == vj::kStatusEnd ? 0 : filled;
  return true;
}

namespace {

using Upsample = void (*)(DecoderInfo*, uint8_t*, uint32_t*, uint32_t);

// One step of the reduced row controller: a fresh iMCU row when the last
// one is used up, then its rows through `upsample`.
template <Upsample kUpsample, bool kCheck>
int32_t reduced_step(DecoderInfo* d, uint8_t* output, uint32_t* row_ctr, uint32_t rows_avail) {
  const bool fresh = d->controller.buffer_full == 0;
  int32_t status;
  if (!vj_refill_rows(d, 0, kCheck, &status)) return status;
  if (fresh) d->controller.group_counter = 0;
  kUpsample(d, output, row_ctr, rows_avail);
  release_buffer(d);
  return status;
}

}  // namespace

int32_t VETAJ_ProcessData_resize(DecoderInfo* d, uint8_t* output, uint32_t* row_ctr,
                                 uint32_t rows_avail) {
  return reduced_step<VETAJ_SetupUpsample, true>(d, output, row_ctr, rows_avail);
}

int32_t VETAJ_ProcessDataSkipRow(DecoderInfo* d, uint8_t* output, uint32_t* row_ctr,
                                 uint32_t rows_avail) {
  return reduced_step<VETAJ_SkipRowUpsample, false>(d, output, row_ctr, rows_avail);
}

int32_t vj_fill_imcu_buffer(DecoderInfo* d, uint32_t which, bool check) {
  RowController& ctl = d->controller;
  // The callback sees the output rows written so far: the progress
  // percentage divides them by the output height.
  if (check && d->check_callback != nullptr &&
      d->check_callback(d->owner, static_cast<int32_t>(d->output_rows)) == 0)
    return vj::kStatusFail;
  uint8_t** lists[4];
  for (uint32_t ci = 0; ci < d->num_components; ++ci) lists[ci] = d->sample_lists[ci][which];
  const int32_t status = d->imcu.decode_row(d, lists);
  if (status == vj::kStatusCorrupt || status == vj::kStatusFail) return vj::kStatusFail;
  // After the last iMCU row its rows are still to be delivered.
  if (status == vj::kStatusEnd) ctl.finished = 1;
  ctl.buffer_full = 1;
  ++ctl.imcu_rows_done;
  return status;
}

uint32_t GCD(uint32_t a, uint32_t b) {
  while (b != 0) {
    const uint32_t t = a % b;
    a = b;
    b = t;
  }
  return a;
}

uint32_t LCM(uint32_t a, uint32_t b) {
  const uint32_t g = GCD(a, b);
  return g == 0 ? 0 : a / g * b;
}

uint32_t round_up_pow2(uint32_t x, uint32_t a) { return (x + a - 1) & ~(a - 1); }

uint32_t VETAJ_GetMcuSampleWidth(DecoderInfo* d) {
  const uint32_t w = 8u * d->max_h_samp;
  const DecInfo* o = d->owner;
  if (o != nullptr && o->region_mode != 0 && d->num_components == 3 && d->max_h_samp == 2 &&
      d->max_v_samp == 2 && d->comps_in_scan == 1 && d->mcus_per_row != 0)
    return ((d->image_width + w) / w * w) / d->mcus_per_row;
  return w;
}

void vj_install_row_functions(DecoderInfo* d) {
  const uint32_t r = d->scale_shift;
  if (r == 0) {
    d->imcu.decode_row = VETAJ_DecodeSingleiMcu;
    return;
  }
  d->imcu.decode_row = VETAJ_DecodeSingleiMcu_resize;
  if (d->fast_reduced && d->scale_num == 1 && r <= 3) {
    static const McuDecodeFn kReduced[4] = {nullptr, VETAJ_DecodeMcu_2to1, VETAJ_DecodeMcu_4to1,
                                            VETAJ_DecodeMcu_8to1};
    d->decode_mcu_reduced = kReduced[r];
  }
}
