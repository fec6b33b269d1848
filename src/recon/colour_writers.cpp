// The named per-row pixel writers: thin entries into the row bodies.
#include "recon/colour_routines.h"
#include "recon/colour_rows.h"

using namespace vj::colour;

#define VETAJ_ROW_ENTRY(name, body)                                             \
  void name(DecoderInfo* d, const uint8_t* const* components, uint32_t width) { \
    body(d, components, width);                                                 \
  }
VETAJ_ROW_ENTRY(VETAJ_YcbcrWriteOutput1to1, write_one_to_one<YccSource>)
VETAJ_ROW_ENTRY(VETAJ_GrayWriteOutput1to1, write_one_to_one<GreySource>)
VETAJ_ROW_ENTRY(VETAJ_RGBWriteOutput1to1, write_one_to_one<RgbSource>)
VETAJ_ROW_ENTRY(VETAJ_CMYKWriteOutput1to1, write_one_to_one<CmykSource>)
VETAJ_ROW_ENTRY(VETAJ_YCCKWriteOutput1to1, write_one_to_one<YcckSource>)
// Centre sampling is one table lookup per output pixel, so reducing and
// enlarging share the body.
VETAJ_ROW_ENTRY(VETAJ_FastYcbcrWriteOutput, write_sampled<YccSource>)
VETAJ_ROW_ENTRY(VETAJ_FastYcbcrUpscaleWriteOutput, write_sampled<YccSource>)
#undef VETAJ_ROW_ENTRY

#define VETAJ_PACKED_ENTRY(name, colour)                              \
  void name(DecoderInfo* d, const uint32_t* packed, uint32_t width) { \
    write_packed<colour>(d, packed, width);                           \
  }
VETAJ_PACKED_ENTRY(VETAJ_YcbcrWriteOutput, Ycc)
VETAJ_PACKED_ENTRY(VETAJ_GrayWriteOutput, Rgb)
VETAJ_PACKED_ENTRY(VETAJ_RGBWriteOutput, Rgb)
#undef VETAJ_PACKED_ENTRY

int32_t vj_bytes_per_pixel(int32_t output_format) {
  int32_t bytes = 0;
  with_format(output_format, [&](auto format) {
    if constexpr (decltype(format)::kKind == Kind::kPacked) bytes = decltype(format)::kBytes;
  });
  return bytes;
}
