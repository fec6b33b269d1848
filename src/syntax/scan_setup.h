// Scan set-up: MCU geometry, table binding and the per-block table layout of
// the scan whose header was just read.
#ifndef VETAJ_SYNTAX_SCAN_SETUP_H
#define VETAJ_SYNTAX_SCAN_SETUP_H

#include <cstdint>

struct DecoderInfo;

// Most blocks one MCU may hold.
constexpr uint32_t kMaxBlocksInMcu = 10;

// Returns 200, or 201 when the scan cannot be decoded.
int32_t VETAJ_SetupScan(DecoderInfo* decoder);

#endif  // VETAJ_SYNTAX_SCAN_SETUP_H
