// Decoder set-up: header, colour space, output geometry, converter choice,
// per-scan tables and buffers.
#ifndef VETAJ_DRIVERS_INIT_H
#define VETAJ_DRIVERS_INIT_H

#include <cstdint>

#include "drivers/decoder.h"

// The output request handed from the whole-image driver to the set-up.
struct OutputRequest {
  int32_t image_width;   // out: picture width
  int32_t image_height;  // out: picture height
  void* buffer;          // the caller's buffer
  int32_t width;         // requested width (the buffer's row length in pixels)
  int32_t height;        // requested height (the buffer's row count)
};

// Runs the whole set-up for one decode; null on failure.
DecoderInfo* VETAJ_Initialize(DecInfo* object, StreamWindow* window, OutputRequest* request);
// Allocates the decoder and parses the header; null on failure (error 4 when
// the decoder itself cannot be allocated).
DecoderInfo* VETAJ_PreInitialize(DecInfo* object, StreamWindow* window);
// Parses every marker up to the first scan and decides the colour space.
int32_t VETAJ_ParseHeader(DecoderInfo* decoder, int32_t flags);
// Output geometry, reduction, converter and buffers; the decoder or null.
DecoderInfo* VETAJ_PostInitialize(DecInfo* object, OutputRequest* request, DecoderInfo* decoder);
// Converter choice, component geometry, upsampler and first-scan set-up.
int32_t VETAJ_StartDecompression(DecoderInfo* decoder);
// Per-scan set-up: tables, multipliers, range-limit tables, row functions.
int32_t VETAJ_InitDecBeforeScan(DecoderInfo* decoder);
// Row-pointer table of `rows` rows of row_bytes (rounded up to 32) in one
// 16-byte-aligned block; null on failure or for 0 rows.
uint8_t** VETAJ_AllocSampleArry(DecoderInfo* decoder, uint32_t row_bytes, uint32_t rows,
                                uint32_t* misalignment);
// Resets the MCU-row cursor for the current iMCU row.
void VETAJ_SetupiMcu(DecoderInfo* decoder);

// Greatest common divisor of |a| and |b|.
int32_t VETAJ_GetGCD(int32_t a, int32_t b);

namespace vj {
// Frees a table from VETAJ_AllocSampleArry and clears it.
void free_sample_array(uint8_t**& table);
}  // namespace vj

#endif  // VETAJ_DRIVERS_INIT_H
