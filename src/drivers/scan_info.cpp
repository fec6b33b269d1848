// Scan state records.
#include "drivers/scan_info.h"

#include "drivers/init.h"

namespace {

uint32_t next_byte_position(const DecoderInfo* d) { return vj::window_tell(d->window); }

void save_moving_parts(const DecoderInfo* d, ScanInfo* s) {
  s->unread_marker = d->unread_marker;
  s->next_restart = d->marker->next_restart;
  s->eob_run = d->eob_run;
  s->entropy = *d->entropy;
  s->position = next_byte_position(d);
}

}  // namespace

bool VETAJ_SetupScanInfo(DecoderInfo* d, ScanInfo** slot) {
  if (d->entropy == nullptr) return false;
  ScanInfo* s = vj::alloc_zeroed<ScanInfo>();
  if (s == nullptr) return false;
  s->comps_in_scan = d->comps_in_scan;
  s->comp_index = d->scan_comp_index;
  s->Ss = d->Ss;
  s->Se = d->Se;
  s->Ah = d->Ah;
  s->Al = d->Al;
  s->blocks_in_mcu = d->blocks_in_mcu;
  s->mcu_rows = d->mcu_rows;
  s->mcus_per_row = d->mcus_per_row;
  s->restart_interval = d->restart_interval;
  save_moving_parts(d, s);
  s->unread_marker = 0;
  for (uint32_t i = 0; i < d->comps_in_scan && i < 4; ++i)
    if (d->scan_components[i] != nullptr) s->comps[i] = *d->scan_components[i];
  for (uint32_t b = 0; b < 10; ++b) s->membership[b] = d->mcu_membership[b];
  *slot = s;
  return true;
}

void VETAJ_SaveScanInfo(DecoderInfo* d, ScanInfo* s) { save_moving_parts(d, s); }

bool VETAJ_LoadScanInfo(DecoderInfo* d, ScanInfo* s) {
  d->comps_in_scan = static_cast<uint8_t>(s->comps_in_scan);
  d->scan_comp_index = s->comp_index;
  d->Ss = s->Ss;
  d->Se = s->Se;
  d->Ah = s->Ah;
  d->Al = s->Al;
  d->unread_marker = s->unread_marker;
  d->marker->next_restart = static_cast<uint8_t>(s->next_restart & 7);
  d->blocks_in_mcu = static_cast<uint8_t>(s->blocks_in_mcu);
  d->mcu_rows = s->mcu_rows;
  d->mcus_per_row = s->mcus_per_row;
  d->restart_interval = s->restart_interval;
  d->eob_run = s->eob_run;
  *d->entropy = s->entropy;
  if (!vj::window_seek(d->window, s->position)) return false;
  (void)VETAJ_CheckBuffer(d->window, 1);
  for (uint32_t b = 0; b < 10; ++b) d->mcu_membership[b] = s->membership[b];
  for (uint32_t i = 0; i < s->comps_in_scan && i < 4; ++i) {
    ComponentInfo* c = &s->comps[i];
    // Multipliers and quantisation tables belong to the frame's component
    // record (they may be built after the copy was made).
    if (d->components != nullptr && c->index < d->num_components) {
      const ComponentInfo& f = d->components[c->index];
      c->multipliers = f.multipliers;
      c->quant = f.quant;
    }
    d->scan_components[i] = c;
  }
  VETAJ_SetupiMcu(d);
  return true;
}
