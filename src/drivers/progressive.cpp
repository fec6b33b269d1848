// The scan walk and the row decoder of progressive (and multi-scan
// sequential) frames.
#include "drivers/progressive.h"

#include <cstring>

#include "drivers/decode.h"
#include "drivers/init.h"
#include "drivers/scan_info.h"
#include "drivers/scaled.h"
#include "entropy/mcu.h"
#include "entropy/progressive.h"
#include "recon/idct.h"
#include "recon/upsample.h"

namespace {

uint32_t frame_mcus_per_row(const DecoderInfo* d) {
  const uint32_t w = 8u * (d->max_h_samp != 0 ? d->max_h_samp : 1);
  return (d->image_width + w - 1) / w;
}

// One MCU row of coefficient blocks for every component: v block rows of
// (MCUs per row x h) blocks each.
bool allocate_workspace(DecoderInfo* d) {
  if (d->prog_workspace != nullptr) return true;
  const uint32_t mcus = frame_mcus_per_row(d);
  uint64_t blocks = 0;
  for (uint32_t ci = 0; ci < d->num_components; ++ci) {
    const ComponentInfo& c = d->components[ci];
    d->prog_offset[ci] = static_cast<uint32_t>(blocks);
    d->prog_stride[ci] = mcus * c.h_samp;
    blocks += uint64_t(d->prog_stride[ci]) * c.v_samp;
  }
  const uint64_t bytes = blocks * 64 * sizeof(int16_t);
  if (bytes == 0 || bytes > 0x7FFFFFFF) return false;
  d->prog_workspace = vj::fake_alloc_zeroed<int16_t>(static_cast<uint32_t>(blocks * 64));
  if (d->prog_workspace == nullptr) return false;
  d->prog_workspace_bytes = static_cast<uint32_t>(bytes);
  return true;
}

inline int16_t* workspace_block(DecoderInfo* d, const ComponentInfo* c, uint32_t row,
                                uint32_t col) {
  return d->prog_workspace + (size_t(d->prog_offset[c->index]) + size_t(row) * d->prog_stride[c->index] + col) * 64;
}

// The MCU decoder of the current scan.
McuDecodeFn scan_decoder(const DecoderInfo* d) {
  if (d->marker->frame_kind == kFrameBaseline) return VETAJ_DecodeMcu;
  if (d->Ah == 0) return d->Ss == 0 ? VETAJ_ProgDecodeMcu_DC : VETAJ_ProgDecodeMcu_AC;
  return d->Ss == 0 ? VETAJ_ProgDecodeMcuRefine_DC : VETAJ_ProgDecodeMcuRefine_AC;
}

// Decodes this iMCU row's part of the current scan into the workspace.
bool decode_scan_rows(DecoderInfo* d) {
  const McuDecodeFn decode = scan_decoder(d);
  const bool single = d->comps_in_scan == 1;
  const uint32_t mcu_px = d->mcu_height_px != 0 ? d->mcu_height_px : 8;
  int16_t** blocks = d->imcu.blocks;
  for (uint32_t mr = 0; mr < d->imcu.mcu_rows; ++mr) {
    const ComponentInfo* c0 = d->scan_components[0];
    const uint32_t v = single && c0 != nullptr ? c0->v_samp : 1;
    const uint32_t top = d->imcu_row * mcu_px + (single ? mr * (mcu_px / v) : 0);
    for (uint32_t col = 0; col < d->mcus_per_row; ++col) {
      // Block pointers of this MCU in the workspace.
      if (single) {
        blocks[0] = workspace_block(d, c0, mr, col);
      } else {
        uint32_t b = 0;
        for (uint32_t p = 0; p < d->comps_in_scan; ++p) {
          const ComponentInfo* c = d->scan_components[p];
          for (uint32_t by = 0; by < c->mcu_height; ++by)
            for (uint32_t bx = 0; bx < c->mcu_width && b < 10; ++bx)
              blocks[b++] = workspace_block(d, c, by, col * c->mcu_width + bx);
        }
      }
      d->current_mcu_row = single ? d->imcu_row * v + mr : d->imcu_row;
      d->current_mcu_col = col;
      if (decode(d, blocks) != 0) continue;
      ++d->error_count;
      if (d->image_height > top && d->image_height - top > 15) return false;
      // Damage in the last rows of the picture leaves flat blocks.
      for (uint32_t b = 0; b < d->blocks_in_mcu; ++b) std::memset(blocks[b], 0, 128);
    }
  }
  return true;
}

// The transform of the decoder's scale, for every block.
VETAJ_IdctFn scale_kernel(const DecoderInfo* d) {
  switch (d->scale_shift) {
    case 0: return VETAJ_DoIdct_islow;
    case 1: return VETAJ_DoIdct_4x4;
    case 2: return VETAJ_DoIdct_2x2;
    default: return VETAJ_DoIdct_1x1;
  }
}

// Row decoder of the DC-only 1/8 path: the first scan's DC values.
int32_t dc_only_row(DecoderInfo* d, uint8_t*** rows) {
  return VETAJ_DecodeSingleiMcuResizeNto1(d, rows, VETAJ_ProgDecodeMcu,
                                          VETAJ_GetDctMethodIndexFirst, VETAJ_GetDctMethod8to1,
                                          1);
}

}  // namespace

int32_t VETAJ_ProgIDct(DecoderInfo* d, uint8_t*** rows) {
  const VETAJ_IdctFn kernel = scale_kernel(d);
  const uint32_t step = 8u >> (d->scale_shift > 3 ? 3 : d->scale_shift);
  for (uint32_t ci = 0; ci < d->num_components; ++ci) {
    const ComponentInfo* c = &d->components[ci];
    const uint8_t* centre = vj_range_limit_centre(ci == 0 ? d->range_limit : d->range_limit_chroma);
    const uint32_t first_row = d->imcu_row * c->v_samp;
    for (uint32_t by = 0; by < c->v_samp && first_row + by < c->height_blocks; ++by)
      for (uint32_t bx = 0; bx < c->width_blocks; ++bx)
        kernel(centre, c->multipliers, workspace_block(d, c, by, bx), rows[ci] + by * step,
               bx * step);
  }
  return vj::kStatusOk;
}

int32_t VETAJ_ProgDecodeSingleiMcu(DecoderInfo* d, uint8_t*** rows) {
  std::memset(d->prog_workspace, 0, d->prog_workspace_bytes);
  for (uint32_t s = 0; s < d->scan_count; ++s) {
    ScanInfo* info = d->scans[s];
    if (!VETAJ_LoadScanInfo(d, info)) continue;
    if (!decode_scan_rows(d)) return vj::kStatusCorrupt;
    VETAJ_SaveScanInfo(d, info);
  }
  VETAJ_ProgIDct(d, rows);
  ++d->imcu_row;
  if (d->imcu_row >= d->total_imcu_rows) return vj::kStatusEnd;
  return vj::kStatusNextRow;
}

int32_t VETAJ_ProgProcessData(DecoderInfo* d, uint8_t* output, uint32_t* row_ctr,
                              uint32_t rows_avail) {
  d->imcu.decode_row = VETAJ_ProgDecodeSingleiMcu;
  return VETAJ_ProcessData(d, output, row_ctr, rows_avail);
}

int32_t VETAJ_ProgProcessData_resize(DecoderInfo* d, uint8_t* output, uint32_t* row_ctr,
                                     uint32_t rows_avail) {
  d->imcu.decode_row = VETAJ_ProgDecodeSingleiMcu;
  return VETAJ_ProcessData_resize(d, output, row_ctr, rows_avail);
}

uint32_t VETAJ_GetSnapshotNumber(DecoderInfo* d, int32_t scan) {
  uint32_t n = 0;
  for (int32_t s = 0; s < scan && s < static_cast<int32_t>(d->scan_count); ++s) {
    const ScanInfo* info = d->scans[s];
    n += info->comps_in_scan >= 2 ? 1u : info->comps[0].v_samp;
  }
  return n;
}

uint32_t VETAJ_GetCurrentSnapshotNumber(DecoderInfo* d) {
  return VETAJ_GetSnapshotNumber(d, static_cast<int32_t>(d->scan_count));
}

bool vj_needs_scan_walk(const DecoderInfo* d) {
  if (d->marker->frame_kind == kFrameProgressive) return true;
  return d->num_components > 1 && d->comps_in_scan != d->num_components;
}

bool vj_prepare_dc_only(DecoderInfo* d) {
  if (d->marker->frame_kind != kFrameProgressive || d->Ss != 0 || d->Ah != 0 ||
      d->comps_in_scan != d->num_components)
    return false;
  d->imcu.decode_row = dc_only_row;
  return true;
}

int32_t vj_walk_scans(DecoderInfo* d) {
  if (!allocate_workspace(d)) {
    vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
    return vj::kStatusFail;
  }
  // At reduced sizes only the coefficients the reduced transform reads
  // matter: once every component has a scan reaching past them, later scans
  // are not needed.
  const uint32_t limit = d->scale_shift == 1 ? 18u : d->scale_shift == 2 ? 5u : d->scale_shift >= 3 ? 0u : 63u;
  bool covered[4] = {false, false, false, false};
  StreamWindow* w = d->window;
  for (;;) {
    if (!VETAJ_SetupScanInfo(d, &d->scans[d->scan_count])) {
      vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
      return vj::kStatusFail;
    }
    ++d->scan_count;
    if (d->scale_shift > 0 && d->Se > limit) {
      for (uint32_t p = 0; p < d->comps_in_scan; ++p)
        if (d->scan_components[p] != nullptr) covered[d->scan_components[p]->index & 3] = true;
      bool all = true;
      for (uint32_t ci = 0; ci < d->num_components; ++ci) all = all && covered[ci];
      if (all) break;
    }
    if (d->scan_count == kMaxScans) break;
    int32_t status = vj::kStatusOk;
    const uint8_t code = VETAJ_ParseNextMarker(d, &status);
    if (status != vj::kStatusOk || code != 0xDA) {
      // No further scan: drop what is left of the window.
      vj::window_empty(w);
      break;
    }
    if (VETAJ_InitUpsampler(d) != vj::kStatusOk || VETAJ_InitDecBeforeScan(d) != vj::kStatusOk) {
      vj::set_error(KOLVAVETA_ERR_SETUP);
      return vj::kStatusFail;
    }
    // The scan's entropy-coded data starts at the window's next byte.
    w->window += w->index;
    w->index = 0;
  }
  d->imcu_row = 0;
  d->imcu.decode_row = VETAJ_ProgDecodeSingleiMcu;
  return vj::kStatusOk;
}
