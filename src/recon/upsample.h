// Upsampling: brings every component of a row group to the full sample grid
// and hands the rows to the colour converter or a fused writer.
#ifndef VETAJ_RECON_UPSAMPLE_H
#define VETAJ_RECON_UPSAMPLE_H

#include <cstdint>

#include "drivers/decoder.h"

using UpsampleFn = void (*)(DecoderInfo* decoder, ComponentInfo* component,
                            uint8_t** input_rows, uint8_t*** output_slot);

struct Upsampler {
  uint8_t h_expand[4];        // integral method: output samples per input sample
  uint8_t v_expand[4];        // integral method: output rows per input row
  int32_t next_row_out;       // next colour-buffer row to convert; max_v means empty
  uint32_t rows_to_go;        // image rows still to emit
  int32_t rowgroup_height[4]; // input rows per row group
  uint8_t** color_buf[4];     // upsampled rows of each component
  UpsampleFn method[4];
  uint8_t** color_alloc[4];   // colour buffers this record owns
};

// Chooses the upsampling methods, installs the transform slots, chooses the
// fused writer and builds the sample buffers. 200 or 201.
int32_t VETAJ_InitUpsampler(DecoderInfo* decoder);
// Row driver: upsamples the current row group when needed and converts at
// most rows_avail - *row_ctr rows, advancing *row_ctr.
void VETAJ_SetupUpsample(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                         uint32_t rows_avail);
// As VETAJ_SetupUpsample, consuming rows without converting them.
void VETAJ_SkipRowUpsample(DecoderInfo* decoder, uint8_t* output, uint32_t* row_ctr,
                           uint32_t rows_avail);
// Frees the upsampler record and its colour buffers.
void vj_release_upsampler(DecoderInfo* decoder);

#endif  // VETAJ_RECON_UPSAMPLE_H
