// Saved state of one scan, so that decoding can leave a scan in the middle
// of its entropy-coded data and resume it later.
#ifndef VETAJ_DRIVERS_SCAN_INFO_H
#define VETAJ_DRIVERS_SCAN_INFO_H

#include <cstdint>

#include "drivers/decoder.h"

// Most scans recorded per decode; later scans are not decoded.
constexpr uint32_t kMaxScans = 30;

struct ScanInfo {
  uint32_t comps_in_scan;      // Ns
  uint32_t comp_index;         // frame index of the scan's (last) component
  uint32_t Ss, Se, Ah, Al;
  EntropyState entropy;        // bit reader, DC predictors, restart count, tables
  uint32_t position;           // input position of the next unread byte
  uint32_t eob_run;
  uint32_t unread_marker;
  ComponentInfo comps[4];      // the scan's components, copied whole
  uint32_t membership[10];     // component of each block of an MCU
  uint32_t blocks_in_mcu;
  uint32_t mcu_rows;
  uint32_t mcus_per_row;
  uint32_t restart_interval;   // the interval in force for this scan
  uint32_t next_restart;       // number of the next expected restart marker
};

// Makes a record of the current scan (at its first entropy byte) in *slot.
// False when memory runs out.
bool VETAJ_SetupScanInfo(DecoderInfo* decoder, ScanInfo** slot);
// Updates the record's changing parts from the decoder.
void VETAJ_SaveScanInfo(DecoderInfo* decoder, ScanInfo* info);
// Makes the record's scan current: parameters, entropy state, input
// position (with a fresh window), MCU layout and components. A refused seek
// leaves the window, layout and components as they were (false).
bool VETAJ_LoadScanInfo(DecoderInfo* decoder, ScanInfo* info);

#endif  // VETAJ_DRIVERS_SCAN_INFO_H
