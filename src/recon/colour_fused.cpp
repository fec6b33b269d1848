// Fused upsample-and-convert writers: YCbCr rows straight from the sample
// buffer (chroma at its stored resolution) to the output at the decoded
// size. One body for the four chroma layouts and every format.
#include "recon/colour_pixels.h"
#include "recon/colour_routines.h"

namespace vj::colour {
namespace {

// Writes `count` rows (1 or 2) of n pixels that share one chroma row; luma
// sample x uses chroma sample x / kH. The colour differences are computed
// once per chroma sample. An odd first column is converted alone, then the
// pixels go in chroma pairs.
template <uint32_t kH, uint32_t kCount, class Sink>
void fused_span(const Sink* sinks, const uint8_t* const* luma, const uint8_t* __restrict cb,
                const uint8_t* __restrict cr, uint32_t first, uint32_t n,
                const uint8_t* range_limit) {
  if constexpr (Sink::kPacked) {
    const uint8_t* __restrict rl = range_limit;
    uint32_t i = 0;
    uint32_t x = first;
    // The clamp table offset by each colour difference once per chroma
    // sample: a pixel is then three lookups indexed by its luma.
    struct Lanes {
      const uint8_t* r;
      const uint8_t* g;
      const uint8_t* b;
    };
    auto lanes = [rl](const ChromaDiff& c) { return Lanes{rl + c.rd, rl + c.gd, rl + c.bd}; };
    auto pixel = [](const Sink& s0, const Sink& s1, uint32_t k, uint32_t a, uint32_t b,
                    const Lanes& l) {
      s0.put_rgb(k, l.r[a], l.g[a], l.b[a]);
      if constexpr (kCount == 2) s1.put_rgb(k, l.r[b], l.g[b], l.b[b]);
    };
    if (kH == 2 && (x & 1) != 0 && n > 0) {
      const Lanes l = lanes(chroma_diff(cb[x / 2], cr[x / 2]));
      pixel(sinks[0], sinks[kCount - 1], 0, luma[0][x], luma[kCount - 1][x], l);
      i = 1;
      ++x;
    }
    // From here on pixel k of the span uses luma k and chroma k / kH.
    const Sink s0 = sinks[0].from(i);
    const Sink s1 = sinks[kCount - 1].from(i);
    const uint8_t* __restrict y0 = luma[0] + x;
    const uint8_t* __restrict y1 = luma[kCount - 1] + x;
    const uint8_t* __restrict pb = cb + x / kH;
    const uint8_t* __restrict pr = cr + x / kH;
    const uint32_t span = n - i;
    const uint32_t groups = span / kH;
    for (uint32_t m = 0; m < groups; ++m) {
      const Lanes l = lanes(chroma_diff(pb[m], pr[m]));
      const uint32_t k = m * kH;
      pixel(s0, s1, k, y0[k], kCount == 2 ? y1[k] : 0, l);
      if constexpr (kH == 2) pixel(s0, s1, k + 1, y0[k + 1], kCount == 2 ? y1[k + 1] : 0, l);
    }
    if (groups * kH < span) {
      const uint32_t k = groups * kH;
      pixel(s0, s1, k, y0[k], kCount == 2 ? y1[k] : 0, lanes(chroma_diff(pb[groups], pr[groups])));
    }
  } else {
    // Planar: luma copied, chroma as stored; the sink picks the pixels
    // that carry chroma.
    for (uint32_t r = 0; r < kCount; ++r) {
      for (uint32_t i = 0, x = first; i < n; ++i, ++x)
        sinks[r].put(i, Ycc{luma[r][x], cb[x / kH], cr[x / kH]});
    }
  }
}

// kH: luma samples per chroma sample across; kRows: luma rows per call.
template <uint32_t kH, uint32_t kRows, class Format>
void write_fused(DecoderInfo* d, const uint8_t* y0, const uint8_t* y1, const uint8_t* cb,
                 const uint8_t* cr, uint32_t width) {
  if (y0 == nullptr || cb == nullptr || cr == nullptr) return;
  uint32_t wanted = (kRows == 2 && y1 != nullptr) ? 3u : 1u;
  Resampler* r = d->resampler;
  if (r != nullptr) {
    // Window edges of a region: a call may straddle its top or bottom row.
    if (in_region_mode(d)) {
      const uint64_t top = d->owner->region_top;
      const uint64_t end = top + d->owner->region_height;
      for (uint32_t k = 0; k < 2; ++k) {
        const uint64_t row = uint64_t(r->src_row) + k;
        if (row < top || row >= end) wanted &= ~(1u << k);
      }
    }
    r->src_row += kRows;
  }
  const uint32_t first = first_source_column(d);
  const uint8_t* range_limit = d->range_limit;
  write_rows<Format>(d, wanted, width,
                     [&](const auto* sinks, const uint32_t* rows, uint32_t count, uint32_t n) {
                       const uint8_t* luma[2] = {y0, y1};
                       const uint8_t* picked[2] = {luma[rows[0]], luma[rows[count - 1]]};
                       if (count == 2) {
                         fused_span<kH, 2>(sinks, picked, cb, cr, first, n, range_limit);
                       } else {
                         fused_span<kH, 1>(sinks, picked, cb, cr, first, n, range_limit);
                       }
                     });
}

// The general member: any format, chosen once per call.
template <uint32_t kH, uint32_t kRows>
void write_fused_any(DecoderInfo* d, const uint8_t* y0, const uint8_t* y1, const uint8_t* cb,
                     const uint8_t* cr, uint32_t width) {
  with_format(d->output_format, [&](auto format) {
    write_fused<kH, kRows, decltype(format)>(d, y0, y1, cb, cr, width);
  });
}

// The four members of one chroma layout, by output format code.
template <uint32_t kH, uint32_t kRows>
struct FusedFamily {
  static constexpr FusedWriterFn kAny = write_fused_any<kH, kRows>;
  static constexpr FusedWriterFn kRgb565 = write_fused<kH, kRows, Rgb565>;
  static constexpr FusedWriterFn kRgba = write_fused<kH, kRows, Rgba>;
  static constexpr FusedWriterFn kBgra = write_fused<kH, kRows, Bgra>;
};
using Yuv420 = FusedFamily<2, 2>;
using Yuv422H2V1 = FusedFamily<2, 1>;
using Yuv422H1V2 = FusedFamily<1, 2>;
using Yuv444 = FusedFamily<1, 1>;

}  // namespace
}  // namespace vj::colour

using namespace vj::colour;

// The sixteen named members, each a thin entry into the family template.
#define VETAJ_FUSED_MEMBER(name, family, member)                                     \
  void name(DecoderInfo* d, const uint8_t* y0, const uint8_t* y1, const uint8_t* cb, \
            const uint8_t* cr, uint32_t width) {                                     \
    family::member(d, y0, y1, cb, cr, width);                                        \
  }
#define VETAJ_FUSED_FAMILY(prefix, family)               \
  VETAJ_FUSED_MEMBER(prefix, family, kAny)               \
  VETAJ_FUSED_MEMBER(prefix##_toRGB565, family, kRgb565) \
  VETAJ_FUSED_MEMBER(prefix##_toRGBA8888, family, kRgba) \
  VETAJ_FUSED_MEMBER(prefix##_toBGRA8888, family, kBgra)

VETAJ_FUSED_FAMILY(VETAJ_YcbcrWriteOutput1to1_YUV420, Yuv420)
VETAJ_FUSED_FAMILY(VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1, Yuv422H2V1)
VETAJ_FUSED_FAMILY(VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2, Yuv422H1V2)
VETAJ_FUSED_FAMILY(VETAJ_YcbcrWriteOutput1to1_YUV444, Yuv444)

#undef VETAJ_FUSED_FAMILY
#undef VETAJ_FUSED_MEMBER

FusedWriterFn vj_select_fused_writer(int32_t fused_code, int32_t output_format) {
  // Each layout's named members, in the order RGB565, RGBA8888, BGRA8888,
  // any other format.
  static constexpr FusedWriterFn kWriters[4][4] = {
      {VETAJ_YcbcrWriteOutput1to1_YUV420_toRGB565, VETAJ_YcbcrWriteOutput1to1_YUV420_toRGBA8888,
       VETAJ_YcbcrWriteOutput1to1_YUV420_toBGRA8888, VETAJ_YcbcrWriteOutput1to1_YUV420},
      {VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toRGB565,
       VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toRGBA8888,
       VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toBGRA8888, VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1},
      {VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2_toRGB565,
       VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2_toRGBA8888,
       VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2_toBGRA8888, VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2},
      {VETAJ_YcbcrWriteOutput1to1_YUV444_toRGB565, VETAJ_YcbcrWriteOutput1to1_YUV444_toRGBA8888,
       VETAJ_YcbcrWriteOutput1to1_YUV444_toBGRA8888, VETAJ_YcbcrWriteOutput1to1_YUV444},
  };
  if (fused_code < 1 || fused_code > 4) return nullptr;
  const int32_t column = output_format == 0   ? 0
                         : output_format == 7 ? 1
                         : output_format == 8 ? 2
                                              : 3;
  return kWriters[fused_code - 1][column];
}
