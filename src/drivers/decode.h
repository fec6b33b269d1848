// The whole-image decode: thumbnail choice, frame driver, context-row
// controller and the full-size iMCU-row decoder.
#ifndef VETAJ_DRIVERS_DECODE_H
#define VETAJ_DRIVERS_DECODE_H

#include <cstdint>

#include "drivers/init.h"

// Decodes one frame from the window's position into the buffer: 1 or 0.
int32_t VETAJ_DecodeFrame(DecInfo* object, StreamWindow* window, void* buffer, int32_t width,
                          int32_t height);
// 200, 201, 6 (cancelled or refused) or 101.
int32_t VETAJ_DecodeImage(DecInfo* object, StreamWindow* window, OutputRequest* request);
// Context-row controller: at most one row group per call. 0 (call again),
// 100/101 (an iMCU row was decoded), 201 (abort or corrupt data).
int32_t VETAJ_ProcessData(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                          uint32_t rows_avail);
// One iMCU row at full size: 100, 101 or 102.
int32_t VETAJ_DecodeSingleiMcu(DecoderInfo* decoder, uint8_t*** row_buffers);
// The full-size row loop after the crop rows.
int32_t VETAJ_Decode_Dualcore_1to1(DecInfo* object, OutputRequest* request,
                                   DecoderInfo* decoder, uint32_t image_height);
// Rotates a finished picture of width x height pixels in place; the result
// has height x width pixels. 1 on success, 0 when memory runs out or the
// format has no pixel layout.
int32_t VETAJ_RotateImage90(void* buffer, int32_t width, int32_t height, int32_t format);
int32_t VETAJ_RotateImage270(void* buffer, int32_t width, int32_t height, int32_t format);

// Releases a decoder made for one decode.
void vj_release_decoder(DecoderInfo*& decoder);

#endif  // VETAJ_DRIVERS_DECODE_H
