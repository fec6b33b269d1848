// Scan state records.
#include "drivers/scan_info.h"

#include "drivers/init.h"

namespace {

// What a record keeps of the decoder, as (decoder field, record field)
// pairs: one list serves saving and loading. The scan's parameters and MCU
// layout are fixed for the scan; the moving parts change as it is decoded.
template <class F>
void scan_fields(DecoderInfo* d, ScanInfo* s, F&& f) {
  f(d->comps_in_scan, s->comps_in_scan);
  f(d->scan_comp_index, s->comp_index);
  f(d->Ss, s->Ss);
  f(d->Se, s->Se);
  f(d->Ah, s->Ah);
  f(d->Al, s->Al);
  f(d->blocks_in_mcu, s->blocks_in_mcu);
  f(d->mcu_rows, s->mcu_rows);
  f(d->mcus_per_row, s->mcus_per_row);
  f(d->restart_interval, s->restart_interval);
}
template <class F>
void moving_fields(DecoderInfo* d, ScanInfo* s, F&& f) {
  f(d->unread_marker, s->unread_marker);
  f(d->marker->next_restart, s->next_restart);
  f(d->eob_run, s->eob_run);
  f(*d->entropy, s->entropy);
}

template <class To, class From>
void assign(To& to, const From& from) {
  to = static_cast<To>(from);
}
constexpr auto kToRecord = [](const auto& dv, auto& sv) { assign(sv, dv); };
constexpr auto kToDecoder = [](auto& dv, const auto& sv) { assign(dv, sv); };

void save_moving_parts(DecoderInfo* d, ScanInfo* s) {
  moving_fields(d, s, kToRecord);
  s->position = vj::window_tell(d->window);
}

}  // namespace

bool VETAJ_SetupScanInfo(DecoderInfo* d, ScanInfo** slot) {
  if (d->entropy == nullptr) return false;
  ScanInfo* s = vj::alloc_zeroed<ScanInfo>();
  if (s == nullptr) return false;
  scan_fields(d, s, kToRecord);
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
  scan_fields(d, s, kToDecoder);
  moving_fields(d, s, kToDecoder);
  d->marker->next_restart &= 7;
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
