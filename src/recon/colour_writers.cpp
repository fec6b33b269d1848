// Per-row pixel writers: a source row at the decoded size (1:1), a source
// row sampled through a column table (centre sampling), or a row of packed
// four-sample averages. One body per kind, over every source and format.
#include "recon/colour_pixels.h"
#include "recon/colour_routines.h"

namespace vj::colour {
namespace {

// Writes one row whose output pixel i comes from source column map(i).
template <class Src, class Map>
void write_mapped(DecoderInfo* d, ComponentRows components, uint32_t width, Map map) {
  const typename Src::Row src = Src::row(components, first_source_column(d));
  const uint8_t* range_limit = d->range_limit;
  with_format(d->output_format, [&](auto format) {
    write_rows<decltype(format)>(d, 1, width,
                                 [&](const auto* sinks, const uint32_t*, uint32_t, uint32_t n) {
                                   const auto sink = sinks[0];
                                   for (uint32_t i = 0; i < n; ++i)
                                     sink.put(i, Src::at(src, map(i), range_limit));
                                 });
  });
}

template <class Src>
void write_one_to_one(DecoderInfo* d, ComponentRows components, uint32_t width) {
  write_mapped<Src>(d, components, width, [](uint32_t i) { return i; });
}

template <class Src>
void write_sampled(DecoderInfo* d, ComponentRows components, uint32_t width) {
  const Resampler* r = d->resampler;
  if (r == nullptr || r->col_a == nullptr) return;
  const uint32_t* __restrict cols = r->col_a;
  write_mapped<Src>(d, components, width < r->dst_width ? width : r->dst_width,
                    [cols](uint32_t i) { return cols[i]; });
}

template <class Colour>
void write_packed(DecoderInfo* d, const uint32_t* packed, uint32_t width) {
  with_format(d->output_format, [&](auto format) {
    write_rows<decltype(format)>(d, 1, width,
                                 [&](const auto* sinks, const uint32_t*, uint32_t, uint32_t n) {
                                   const auto sink = sinks[0];
                                   for (uint32_t i = 0; i < n; ++i)
                                     sink.put(i, unpack_average<Colour>(packed[i]));
                                 });
  });
}

}  // namespace
}  // namespace vj::colour

using namespace vj::colour;

void VETAJ_YcbcrWriteOutput1to1(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_one_to_one<YccSource>(d, c, width);
}
void VETAJ_GrayWriteOutput1to1(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_one_to_one<GreySource>(d, c, width);
}
void VETAJ_RGBWriteOutput1to1(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_one_to_one<RgbSource>(d, c, width);
}
void VETAJ_CMYKWriteOutput1to1(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_one_to_one<CmykSource>(d, c, width);
}
void VETAJ_YCCKWriteOutput1to1(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_one_to_one<YcckSource>(d, c, width);
}

// Centre sampling is one table lookup per output pixel, so reducing and
// enlarging share the body.
void VETAJ_FastYcbcrWriteOutput(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_sampled<YccSource>(d, c, width);
}
void VETAJ_FastYcbcrUpscaleWriteOutput(DecoderInfo* d, const uint8_t* const* c, uint32_t width) {
  write_sampled<YccSource>(d, c, width);
}

void VETAJ_YcbcrWriteOutput(DecoderInfo* d, const uint32_t* packed, uint32_t width) {
  write_packed<Ycc>(d, packed, width);
}
// Grey sums carry the grey value in all three fields, so they read as RGB.
void VETAJ_GrayWriteOutput(DecoderInfo* d, const uint32_t* packed, uint32_t width) {
  write_packed<Rgb>(d, packed, width);
}
void VETAJ_RGBWriteOutput(DecoderInfo* d, const uint32_t* packed, uint32_t width) {
  write_packed<Rgb>(d, packed, width);
}

int32_t vj_bytes_per_pixel(int32_t output_format) {
  int32_t bytes = 0;
  with_format(output_format, [&](auto format) {
    if constexpr (decltype(format)::kKind == Kind::kPacked) bytes = decltype(format)::kBytes;
  });
  return bytes;
}
