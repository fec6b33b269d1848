// Scan set-up: the entropy state, MCU geometry, quantisation-table binding,
// derived Huffman tables and the per-block table layout of one scan.
#include "syntax/scan_setup.h"

#include "drivers/decoder.h"

namespace {

// Binds a component to its quantisation table. A missing table is taken from
// the lowest defined table above it (copies are made downwards); when table
// 0 exists but the named one does not, the scan fails.
bool bind_quant_table(DecoderInfo* d, ComponentInfo* c) {
  const uint32_t no = c->quant_no;
  if (no > 3) return false;
  if (d->quant_tables[no] == nullptr) {
    if (d->quant_tables[0] != nullptr) return false;
    uint32_t k = 1;
    while (k < 4 && d->quant_tables[k] == nullptr) ++k;
    if (k == 4) return false;
    for (uint32_t i = k; i-- > 0;) {
      if (d->quant_tables[i] != nullptr) continue;
      QuantTable* copy = vj::alloc_zeroed<QuantTable>();
      if (copy == nullptr) return false;
      *copy = *d->quant_tables[i + 1];
      d->quant_tables[i] = copy;
    }
  }
  c->quant = d->quant_tables[no];
  return true;
}

// Lays out the per-block tables of one component starting at block b.
void lay_out_blocks(DecoderInfo* d, EntropyState* e, AcSkipTable* const* skips,
                    const ComponentInfo* c, uint32_t owner, uint32_t count) {
  for (uint32_t i = 0; i < count; ++i) {
    const uint32_t b = d->blocks_in_mcu++;
    e->block_dc[b] = e->dc_tables[c->dc_no & 3];
    e->block_ac[b] = e->ac_tables[c->ac_no & 3];
    e->block_skip[b] = skips[c->ac_no & 3];
    d->mcu_membership[b] = owner;
  }
}

// Copies the tables of the retained decoder (region decoding borrows them).
bool borrow_tables(DecoderInfo* d, EntropyState* e) {
  const DecInfo* o = d->owner;
  if (o == nullptr || o->decoder == nullptr || o->decoder->entropy == nullptr) return false;
  const EntropyState* src = o->decoder->entropy;
  for (int i = 0; i < 4; ++i) {
    e->dc_tables[i] = src->dc_tables[i];
    e->ac_tables[i] = src->ac_tables[i];
    e->ac_skip[i] = nullptr;  // owned by the retained decoder: see ac_skip_copy
    e->ac_skip_copy[i] = src->ac_skip[i];
  }
  e->restarts_to_go = src->restarts_to_go;
  return true;
}

// Builds the derived tables a scan reads. A progressive scan reads only
// one kind: a first DC pass the DC table, an AC band the AC table, a DC
// refinement none (the other kind need not even be defined yet).
bool build_tables(DecoderInfo* d, EntropyState* e, const ComponentInfo* c, bool progressive) {
  if (c->dc_no > 3 || c->ac_no > 3) return false;
  auto prepare = progressive ? VETAJ_P_PrepareDerivedTbl : VETAJ_PrepareDerivedTbl;
  const bool need_dc = !progressive || (d->Ss == 0 && d->Ah == 0);
  const bool need_ac = !progressive || d->Ss != 0;
  return (!need_dc || prepare(d, 1, c->dc_no, &e->dc_tables[c->dc_no], e) == vj::kStatusOk) &&
         (!need_ac || prepare(d, 0, c->ac_no, &e->ac_tables[c->ac_no], e) == vj::kStatusOk);
}

}  // namespace

int32_t VETAJ_SetupScan(DecoderInfo* d) {
  EntropyState* e = d->entropy;
  if (d->scan_counter != 0 && e != nullptr) {
    e->insufficient = 0;
    e->bit_buffer = 0;
    e->bits_left = 0;
    e->restarts_to_go = 0;
  } else {
    if (e == nullptr) {
      e = vj::alloc_zeroed<EntropyState>();
      if (e == nullptr) return vj::kStatusFail;
      d->entropy = e;
    }
  }
  // Every scan starts with its DC predictors at zero and expects RST0 first.
  for (int32_t& p : e->last_dc) p = 0;
  if (d->marker != nullptr) d->marker->next_restart = 0;
  d->eob_run = 0;
  d->blocks_in_mcu = 0;
  const bool progressive = d->marker != nullptr && d->marker->frame_kind == kFrameProgressive;
  const bool borrowing = d->index_use_state == 2;
  if (borrowing && !borrow_tables(d, e)) return vj::kStatusFail;
  // With borrowed tables the skip tables come from the retained decoder.
  AcSkipTable* const* skips = borrowing ? e->ac_skip_copy : e->ac_skip;

  if (d->comps_in_scan == 1) {
    ComponentInfo* c = d->scan_components[0];
    if (c == nullptr) return vj::kStatusFail;
    d->mcus_per_row = c->width_blocks;
    d->mcu_rows = c->height_blocks;
    c->mcu_width = c->mcu_height = c->mcu_blocks = 1;
    c->mcu_sample_width = 8;
    c->last_col_width = 1;
    const uint32_t rem = c->v_samp != 0 ? c->height_blocks % c->v_samp : 0;
    c->last_row_height = rem != 0 ? rem : c->v_samp;
    if (progressive) {
      if (c->quant == nullptr) {
        if (c->quant_no > 3 || d->quant_tables[c->quant_no] == nullptr) return vj::kStatusFail;
        c->quant = d->quant_tables[c->quant_no];
      }
    } else if (!bind_quant_table(d, c)) {
      return vj::kStatusFail;
    }
    if (!borrowing && !build_tables(d, e, c, progressive)) return vj::kStatusFail;
    if (c->dc_no > 3 || c->ac_no > 3) return vj::kStatusFail;
    lay_out_blocks(d, e, skips, c, progressive ? c->index : 0, 1);
    if (!borrowing) e->restarts_to_go = d->restart_interval;
    return vj::kStatusOk;
  }
  if (d->comps_in_scan > 4) return vj::kStatusFail;

  // Interleaved scan.
  const uint32_t mcu_w = 8u * d->max_h_samp;
  const uint32_t mcu_h = 8u * d->max_v_samp;
  if (mcu_w == 0 || mcu_h == 0) return vj::kStatusFail;
  d->mcus_per_row = (d->image_width + mcu_w - 1) / mcu_w;
  d->mcu_rows = (d->image_height + mcu_h - 1) / mcu_h;
  for (uint32_t p = 0; p < d->comps_in_scan; ++p) {
    ComponentInfo* c = d->scan_components[p];
    if (c == nullptr) return vj::kStatusFail;
    c->mcu_width = c->h_samp;
    c->mcu_height = c->v_samp;
    c->mcu_blocks = uint32_t(c->h_samp) * c->v_samp;
    c->mcu_sample_width = c->h_samp * (d->scaled_blocks ? c->block_size : 8u);
    const uint32_t col = c->h_samp != 0 ? c->width_blocks % c->h_samp : 0;
    c->last_col_width = col != 0 ? col : c->h_samp;
    const uint32_t row = c->v_samp != 0 ? c->height_blocks % c->v_samp : 0;
    c->last_row_height = row != 0 ? row : c->v_samp;
    if (!bind_quant_table(d, c)) return vj::kStatusFail;
    if (!borrowing && !build_tables(d, e, c, progressive)) return vj::kStatusFail;
    if (c->dc_no > 3 || c->ac_no > 3) return vj::kStatusFail;
    if (d->blocks_in_mcu + c->mcu_blocks > kMaxBlocksInMcu) return vj::kStatusFail;
    lay_out_blocks(d, e, skips, c, p, c->mcu_blocks);
  }
  if (!borrowing) e->restarts_to_go = d->restart_interval;
  return vj::kStatusOk;
}
