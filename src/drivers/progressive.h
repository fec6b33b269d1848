// Decoding of frames whose scans each cover part of the coefficients
// (progressive frames, and sequential frames split into several scans): one
// MCU row at a time, resuming every scan from its saved state.
#ifndef VETAJ_DRIVERS_PROGRESSIVE_H
#define VETAJ_DRIVERS_PROGRESSIVE_H

#include <cstdint>

#include "drivers/decoder.h"

// One MCU row across every recorded scan, then its inverse transform:
// 100, 101, or 102 for corrupt data.
int32_t VETAJ_ProgDecodeSingleiMcu(DecoderInfo* decoder, uint8_t*** rows);
// The row controllers with the scan-walking row decoder.
int32_t VETAJ_ProgProcessData(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                              uint32_t rows_avail);
int32_t VETAJ_ProgProcessData_resize(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                                     uint32_t rows_avail);
// Inverse transform of the workspace of one MCU row.
int32_t VETAJ_ProgIDct(DecoderInfo* decoder, uint8_t*** rows);
// Number of the first snapshot of scan `scan`, and of the scan after the
// last one read.
uint32_t VETAJ_GetSnapshotNumber(DecoderInfo* decoder, int32_t scan);
uint32_t VETAJ_GetCurrentSnapshotNumber(DecoderInfo* decoder);

// Whether a frame needs the scan walk (progressive, or sequential with a
// first scan that does not cover every component).
bool vj_needs_scan_walk(const DecoderInfo* decoder);
// Records the scans (at most 30; at reduced sizes only those that reach the
// coefficients the reduced transform reads) and prepares the row decoder.
// 200, or 201 (error 2 set when a scan cannot be set up).
int32_t vj_walk_scans(DecoderInfo* decoder);
// Prepares the DC-only decode of a progressive frame at 1/8 from its first
// scan; false when that scan does not carry every component's DC values.
bool vj_prepare_dc_only(DecoderInfo* decoder);

#endif  // VETAJ_DRIVERS_PROGRESSIVE_H
