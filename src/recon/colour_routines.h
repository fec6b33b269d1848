// The named colour routines: fused writers, row converters and per-row pixel
// writers. vj_select_converter and vj_select_fused_writer (colour.h) choose
// among them; they are declared here for the tests and the statistics.
#ifndef VETAJ_RECON_COLOUR_ROUTINES_H
#define VETAJ_RECON_COLOUR_ROUTINES_H

#include <cstdint>

#include "recon/colour.h"

// Fused upsample-and-convert writers (FusedWriterFn). The 4:2:0 and H1V2
// members write two rows per call, the others one. The members without a
// format suffix write any format; the others RGB565, RGBA8888, BGRA8888.
#define VETAJ_FUSED_WRITER(name)                                                           \
  void name(DecoderInfo* decoder, const uint8_t* y0, const uint8_t* y1, const uint8_t* cb, \
            const uint8_t* cr, uint32_t width)
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV420);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV420_toRGB565);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV420_toRGBA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV420_toBGRA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toRGB565);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toRGBA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toBGRA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2_toRGB565);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2_toRGBA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2_toBGRA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV444);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV444_toRGB565);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV444_toRGBA8888);
VETAJ_FUSED_WRITER(VETAJ_YcbcrWriteOutput1to1_YUV444_toBGRA8888);
#undef VETAJ_FUSED_WRITER

// Row converters (ConvertFn): rows[c][i] is row i of the batch of component
// c on the full sample grid.
#define VETAJ_CONVERTER(name) \
  void name(DecoderInfo* decoder, uint8_t* const* const* rows, uint32_t count)
VETAJ_CONVERTER(VETAJ_DoYcbcrToRgb);
VETAJ_CONVERTER(VETAJ_DoYcbcrToRgb_Partial);
VETAJ_CONVERTER(VETAJ_DoYcbcrToUpscaleRgb);
VETAJ_CONVERTER(VETAJ_DoFastYcbcrToRgb);
VETAJ_CONVERTER(VETAJ_DoFastYcbcrToRgb_Partial);
VETAJ_CONVERTER(VETAJ_DoFastYcbcrToUpscaleRgb);
VETAJ_CONVERTER(VETAJ_DoGrayConvert);
VETAJ_CONVERTER(VETAJ_DoGrayConvert_Partial);
VETAJ_CONVERTER(VETAJ_DoGrayUpscaleConvert);
VETAJ_CONVERTER(VETAJ_DoRgbConvert);
VETAJ_CONVERTER(VETAJ_DoRgbConvert_Partial);
VETAJ_CONVERTER(VETAJ_DoRgbUpscaleConvert);
VETAJ_CONVERTER(VETAJ_DoCMYKToRgb);
VETAJ_CONVERTER(VETAJ_DoCMYKToRgb_Partial);
VETAJ_CONVERTER(VETAJ_DoYCCKToRgb);
VETAJ_CONVERTER(VETAJ_DoYCCKToRgb_Partial);
#undef VETAJ_CONVERTER

// Pixel writers: one output row at the cursor, then the cursor moves on.
// `components` are the source rows of one row (from column 0); the writers
// start at the first source column (crop and region rule).
#define VETAJ_ROW_WRITER(name) \
  void name(DecoderInfo* decoder, const uint8_t* const* components, uint32_t width)
VETAJ_ROW_WRITER(VETAJ_YcbcrWriteOutput1to1);
VETAJ_ROW_WRITER(VETAJ_GrayWriteOutput1to1);
VETAJ_ROW_WRITER(VETAJ_RGBWriteOutput1to1);
VETAJ_ROW_WRITER(VETAJ_CMYKWriteOutput1to1);
VETAJ_ROW_WRITER(VETAJ_YCCKWriteOutput1to1);
// Centre sampling across the row through the resampler's column table.
VETAJ_ROW_WRITER(VETAJ_FastYcbcrWriteOutput);
VETAJ_ROW_WRITER(VETAJ_FastYcbcrUpscaleWriteOutput);
#undef VETAJ_ROW_WRITER

// Packed-average writers: one output row from accumulated four-sample sums.
void VETAJ_YcbcrWriteOutput(DecoderInfo* decoder, const uint32_t* packed, uint32_t width);
void VETAJ_GrayWriteOutput(DecoderInfo* decoder, const uint32_t* packed, uint32_t width);
void VETAJ_RGBWriteOutput(DecoderInfo* decoder, const uint32_t* packed, uint32_t width);

#endif  // VETAJ_RECON_COLOUR_ROUTINES_H
