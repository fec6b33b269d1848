// Scaled decoding: iMCU-row drivers that run the reduced entropy decoders
// and the reduced transforms, the DC-only drivers beyond 1/8, and the row
// controller of reduced output.
#ifndef VETAJ_DRIVERS_SCALED_H
#define VETAJ_DRIVERS_SCALED_H

#include <cstdint>

#include "drivers/decoder.h"

// Selector of a transform routine for a block's last-coefficient index.
using IdctIndexFn = int32_t (*)(int32_t last_index);
using IdctMethodFn = VETAJ_IdctFn (*)(DecoderInfo* decoder, int32_t index);

// One iMCU row at the current reduced scale: 100, 101, 102, or 201 at full
// size (not handled here).
int32_t VETAJ_DecodeSingleiMcu_resize(DecoderInfo* decoder, uint8_t*** rows);
// Per-scale drivers (reduced entropy decoder + reduced transform).
int32_t VETAJ_DecodeSingleiMcuResize2to1(DecoderInfo* decoder, uint8_t*** rows);
int32_t VETAJ_DecodeSingleiMcuResize4to1(DecoderInfo* decoder, uint8_t*** rows);
int32_t VETAJ_DecodeSingleiMcuResize8to1(DecoderInfo* decoder, uint8_t*** rows);
// The fast reduced path of multi-component baseline frames.
int32_t VETAJ_DecompressOnepass(DecoderInfo* decoder, uint8_t*** rows);
// The generic driver: `decode` for wanted MCUs (MCUs above a region are
// skipped),
// transform = method(decoder, index(last)); blocks `block_step` samples
// apart, the MCU's first column at mcu width x column x h_num >> shift.
int32_t VETAJ_DecodeSingleiMcuResizeNto1(DecoderInfo* decoder, uint8_t*** rows,
                                         McuDecodeFn decode,
                                         IdctIndexFn index, IdctMethodFn method,
                                         uint32_t block_step);
// DC-only drivers beyond 1/8.
int32_t VETAJ_DecodeSingleiMcuResizeMore16(DecoderInfo* decoder, uint8_t*** rows);
int32_t VETAJ_DecodeSingleiMcuResize16_YUV420(DecoderInfo* decoder, uint8_t*** rows);
int32_t VETAJ_DecodeSingleiMcuResize16_YUV422H2V1(DecoderInfo* decoder, uint8_t*** rows);
int32_t VETAJ_DecodeSingleiMcuResize16_YUV444(DecoderInfo* decoder, uint8_t*** rows);

// Row controller of reduced output: at most one row group per call.
// 0 (call again), 100/101 (an iMCU row was decoded), 201 (abort, corrupt).
int32_t VETAJ_ProcessData_resize(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                                 uint32_t rows_avail);
// The same, consuming rows without converting them.
int32_t VETAJ_ProcessDataSkipRow(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                                 uint32_t rows_avail);

// Decodes the next iMCU row into sample list set `which` (after the check
// callback when `check`): the decode status, or 201 when the callback
// aborts or the data is corrupt. Marks the controller's buffer full.
int32_t vj_fill_imcu_buffer(DecoderInfo* decoder, uint32_t which, bool check);
// Fills the buffer as above when its rows are used up. False when there is
// nothing to deliver, with *status 101 (the picture was finished) or 201;
// otherwise *status is the fill's status, 0 for a fill that reached the end
// (its rows are still to be delivered) or when no fill was needed.
bool vj_refill_rows(DecoderInfo* decoder, uint32_t which, bool check, int32_t* status);

// Helpers.
uint32_t GCD(uint32_t a, uint32_t b);
uint32_t LCM(uint32_t a, uint32_t b);
uint32_t round_up_pow2(uint32_t x, uint32_t a);
uint32_t VETAJ_GetMcuSampleWidth(DecoderInfo* decoder);

// Installs the row functions of the decoder's scale (called by the per-scan
// set-up).
void vj_install_row_functions(DecoderInfo* decoder);

#endif  // VETAJ_DRIVERS_SCALED_H
