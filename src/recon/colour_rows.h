// Row writer bodies: a source row at the decoded size (1:1), a source row
// sampled through the resampler's column table (centre sampling), or a row
// of packed four-sample averages. One body per kind, over every source and
// format; the named pixel writers and the converters use them.
#ifndef VETAJ_RECON_COLOUR_ROWS_H
#define VETAJ_RECON_COLOUR_ROWS_H

#include "recon/colour_pixels.h"

namespace vj::colour {

// Writes one row whose output pixel i comes from source column map(i).
template <class Src, class Map>
void write_mapped(DecoderInfo* d, ComponentRows components, uint32_t width, Map map) {
  const auto src = source_row<Src>(components, first_source_column(d));
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

// Packed sums of four samples, read back as averages of the source's colour
// (YCbCr, or RGB for the other spaces: grey carries its value in all three).
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

}  // namespace vj::colour

#endif  // VETAJ_RECON_COLOUR_ROWS_H
