// Building blocks of the colour writers: colour values and their
// conversions, the colour sources (how one source pixel becomes a colour),
// the pixel formats (how one pixel is stored) and the output cursor (which
// rows and columns a writer may touch and how it moves on).
//
// Every writer body is a template over a source and a format; nothing here
// switches on the format or the colour space per pixel.
#ifndef VETAJ_RECON_COLOUR_PIXELS_H
#define VETAJ_RECON_COLOUR_PIXELS_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

#include "recon/colour.h"

namespace vj::colour {

// ---------------------------------------------------------------------------
// Colour values.

struct Rgb {
  int32_t r, g, b;
};
struct Ycc {
  int32_t y, cb, cr;
};

// YCbCr to RGB in 16-bit fixed point: 1.402, -0.34414, -0.71414, 1.772.
constexpr int32_t kCrToR = 91881;
constexpr int32_t kCbToG = -22554;
constexpr int32_t kCrToG = -46802;
constexpr int32_t kCbToB = 116130;

// Colour differences of one chroma sample pair, shared by every luma sample
// that uses the pair: rd = (91881 * cr) >> 16, gd = (-22554 * cb - 46802 *
// cr) >> 16, bd = (116130 * cb) >> 16 with cb, cr re-centred on 0 (arithmetic
// shifts, no rounding constant). The products come from tables built at
// compile time, so a pair costs four loads.
struct ChromaDiff {
  int32_t rd, gd, bd;
};
struct ChromaTables {
  int32_t rd[256];    // by Cr
  int32_t bd[256];    // by Cb
  int32_t g_cb[256];  // -22554 * cb, before the shift
  int32_t g_cr[256];  // -46802 * cr, before the shift
};
constexpr ChromaTables make_chroma_tables() {
  ChromaTables t{};
  for (int32_t v = 0; v < 256; ++v) {
    t.rd[v] = (kCrToR * (v - 128)) >> 16;
    t.bd[v] = (kCbToB * (v - 128)) >> 16;
    t.g_cb[v] = kCbToG * (v - 128);
    t.g_cr[v] = kCrToG * (v - 128);
  }
  return t;
}
inline constexpr ChromaTables kChroma = make_chroma_tables();

inline ChromaDiff chroma_diff(int32_t cb, int32_t cr) {
  return {kChroma.rd[cr], (kChroma.g_cb[cb] + kChroma.g_cr[cr]) >> 16, kChroma.bd[cb]};
}

// range_limit addresses the identity part of the clamping table.
inline Rgb to_rgb(Ycc c, const uint8_t* range_limit) {
  const ChromaDiff d = chroma_diff(c.cb, c.cr);
  return {range_limit[c.y + d.rd], range_limit[c.y + d.gd], range_limit[c.y + d.bd]};
}
inline Rgb to_rgb(Rgb c, const uint8_t*) { return c; }

// RGB back to YCbCr for planar output (Q12 constants; every result is
// within 0..255 without clamping).
inline Ycc to_ycc(Rgb c) {
  return {(1225 * c.r + 2404 * c.g + 467 * c.b) >> 12,
          ((-691 * c.r - 1357 * c.g + 2048 * c.b) >> 12) + 128,
          ((2048 * c.r - 1715 * c.g - 333 * c.b) >> 12) + 128};
}
inline Ycc to_ycc(Ycc c) { return c; }

// Packed accumulator value: three 10-bit fields at bits 20, 10 and 0. The
// sum of four samples holds their floor averages at bits 22, 12 and 2.
inline uint32_t pack(int32_t a, int32_t b, int32_t c) {
  return (uint32_t(a) << 20) | (uint32_t(b) << 10) | uint32_t(c);
}
inline uint32_t pack(Rgb c) { return pack(c.r, c.g, c.b); }
inline uint32_t pack(Ycc c) { return pack(c.y, c.cb, c.cr); }
template <class Colour>
inline Colour unpack_average(uint32_t v) {
  return Colour{int32_t(v >> 22), int32_t((v >> 12) & 255), int32_t((v >> 2) & 255)};
}

// Exact floor(x / 255) for 0 <= x <= 255 * 255, by a reciprocal multiply.
inline int32_t div255(uint32_t x) { return int32_t((x * 0x8081u) >> 23); }

// ---------------------------------------------------------------------------
// Colour sources. A SourceRow holds the component rows of one source row
// from its first source column; Source::at(row, x, range_limit) gives the
// colour of column x.

using ComponentRows = const uint8_t* const*;

template <uint32_t kN>
struct SourceRow {
  const uint8_t* __restrict c[kN];
};
template <class Src>
SourceRow<Src::kComponents> source_row(ComponentRows components, uint32_t first) {
  SourceRow<Src::kComponents> row;
  for (uint32_t i = 0; i < Src::kComponents; ++i) row.c[i] = components[i] + first;
  return row;
}

// YCbCr, and RGB as stored: three components taken as they are.
template <class C>
struct TripleSource {
  using Colour = C;
  static constexpr uint32_t kComponents = 3;
  static C at(const SourceRow<3>& s, uint32_t x, const uint8_t*) {
    return {s.c[0][x], s.c[1][x], s.c[2][x]};
  }
};
using YccSource = TripleSource<Ycc>;
using RgbSource = TripleSource<Rgb>;

struct GreySource {
  using Colour = Rgb;
  static constexpr uint32_t kComponents = 1;
  static Rgb at(const SourceRow<1>& s, uint32_t x, const uint8_t*) {
    const int32_t g = s.c[0][x];
    return {g, g, g};
  }
};

// Adobe CMYK, stored inverted: R = c * k / 255 and so on.
struct CmykSource {
  using Colour = Rgb;
  static constexpr uint32_t kComponents = 4;
  static Rgb at(const SourceRow<4>& s, uint32_t x, const uint8_t*) {
    const uint32_t k = s.c[3][x];
    return {div255(s.c[0][x] * k), div255(s.c[1][x] * k), div255(s.c[2][x] * k)};
  }
};

// Adobe YCCK: the YCbCr equations with the result inverted (the 128 offsets
// folded into 433, 120 and 481) and the black channel applied by k / 256.
struct YcckSource {
  using Colour = Rgb;
  static constexpr uint32_t kComponents = 4;
  static Rgb at(const SourceRow<4>& s, uint32_t x, const uint8_t* range_limit) {
    const int32_t y = s.c[0][x], cb = s.c[1][x], cr = s.c[2][x], k = s.c[3][x];
    return {(k * range_limit[433 - y - ((kCrToR * cr) >> 16)]) >> 8,
            (k * range_limit[120 - y - ((kCbToG * cb + kCrToG * cr) >> 16)]) >> 8,
            (k * range_limit[481 - y - ((kCbToB * cb) >> 16)]) >> 8};
  }
};

// ---------------------------------------------------------------------------
// Pixel formats.

enum class Kind { kPacked, kPlanar, kCount };

// Little-endian stores of 4 and 2 bytes.
inline void store_word(uint8_t* p, uint32_t v) {
  if constexpr (std::endian::native == std::endian::little) {
    std::memcpy(p, &v, 4);
  } else {
    p[0] = uint8_t(v);
    p[1] = uint8_t(v >> 8);
    p[2] = uint8_t(v >> 16);
    p[3] = uint8_t(v >> 24);
  }
}
inline void store_half(uint8_t* p, uint32_t v) {
  if constexpr (std::endian::native == std::endian::little) {
    const uint16_t h = uint16_t(v);
    std::memcpy(p, &h, 2);
  } else {
    p[0] = uint8_t(v);
    p[1] = uint8_t(v >> 8);
  }
}

// RGB565 little-endian word, truncated channels.
struct Rgb565 {
  static constexpr Kind kKind = Kind::kPacked;
  static constexpr int32_t kBytes = 2;
  static void store(uint8_t* p, int32_t r, int32_t g, int32_t b) {
    store_half(p, (uint32_t(r >> 3) << 11) | (uint32_t(g >> 2) << 5) | uint32_t(b >> 3));
  }
};

// Bytes R, G, B.
struct Rgb888 {
  static constexpr Kind kKind = Kind::kPacked;
  static constexpr int32_t kBytes = 3;
  static void store(uint8_t* p, int32_t r, int32_t g, int32_t b) {
    p[0] = uint8_t(r);
    p[1] = uint8_t(g);
    p[2] = uint8_t(b);
  }
};

// Four bytes with alpha 255; the template arguments are the byte positions
// of R, G, B and A in memory.
template <int kR, int kG, int kB, int kA>
struct Quad {
  static constexpr Kind kKind = Kind::kPacked;
  static constexpr int32_t kBytes = 4;
  static void store(uint8_t* p, int32_t r, int32_t g, int32_t b) {
    store_word(p, (uint32_t(r) << (8 * kR)) | (uint32_t(g) << (8 * kG)) |
                      (uint32_t(b) << (8 * kB)) | (255u << (8 * kA)));
  }
};
using Argb = Quad<1, 2, 3, 0>;
using Rgba = Quad<0, 1, 2, 3>;
using Bgra = Quad<2, 1, 0, 3>;

// Planar YUV 4:2:0: luma through the cursor, chroma into the planes.
struct Planar {
  static constexpr Kind kKind = Kind::kPlanar;
  static constexpr int32_t kBytes = 1;
};

// Rows are only counted.
struct CountOnly {
  static constexpr Kind kKind = Kind::kCount;
  static constexpr int32_t kBytes = 0;
};

// Calls f(Format{}) with the format policy of an output format code.
template <class F>
void with_format(int32_t format, F&& f) {
  // clang-format off
  switch (format) {
    case 0: case 9: case 10:         f(Rgb565{}); break;
    case 1: case 3: case 6: case 11: f(Rgb888{}); break;
    case 2:                          f(Planar{}); break;
    case 5:                          f(Argb{}); break;
    case 7: case 12:                 f(Rgba{}); break;
    case 8:                          f(Bgra{}); break;
    default:                         f(CountOnly{}); break;
  }
  // clang-format on
}

// ---------------------------------------------------------------------------
// Row sinks: one output row of one format. put(i, colour) stores output
// pixel i of the row.

// Packed pixels; kUnit when consecutive pixels are adjacent (pixel step 1).
template <class Format, bool kUnit>
struct PackedSink {
  static constexpr bool kPacked = true;
  using Fmt = Format;
  uint8_t* row;
  ptrdiff_t step;  // bytes between consecutive pixels
  const uint8_t* range_limit;

  static PackedSink make(const DecoderInfo* d, uint8_t* row, bool) {
    return {row, ptrdiff_t(d->pixel_step) * Format::kBytes, d->range_limit};
  }
  uint8_t* at(uint32_t i) const {
    if constexpr (kUnit) return row + size_t(i) * Format::kBytes;
    return row + ptrdiff_t(i) * step;
  }
  // The same row from pixel i on.
  PackedSink from(uint32_t i) const { return {at(i), step, range_limit}; }
  void put_rgb(uint32_t i, int32_t r, int32_t g, int32_t b) const { Format::store(at(i), r, g, b); }
  template <class Colour>
  void put(uint32_t i, Colour c) const {
    const Rgb v = to_rgb(c, range_limit);
    Format::store(at(i), v.r, v.g, v.b);
  }
};

// Chroma of a rotated planar pixel, placed by its coordinates in the luma
// plane: written when both are even.
inline void put_chroma_by_position(const DecoderInfo* d, const uint8_t* luma, int32_t cb,
                                   int32_t cr) {
  if (d->y_plane == nullptr || d->u_plane == nullptr || d->v_plane == nullptr || d->y_stride == 0 ||
      luma < d->y_plane)
    return;
  const size_t offset = size_t(luma - d->y_plane);
  const size_t x = offset % d->y_stride;
  const size_t y = offset / d->y_stride;
  if (((x | y) & 1) != 0 || (x >> 1) >= d->c_stride) return;
  if (d->plane_height != 0 && y >= d->plane_height) return;
  const size_t at = (y >> 1) * d->c_stride + (x >> 1);
  d->u_plane[at] = uint8_t(cb);
  d->v_plane[at] = uint8_t(cr);
}

// Planar pixels. kUnit (unrotated): chroma goes to the chroma row of the
// current output row (u/v, null on odd rows) from the first pixel of each
// pair; otherwise every pixel places its chroma by position.
template <bool kUnit>
struct PlanarSink {
  static constexpr bool kPacked = false;
  uint8_t* row;
  ptrdiff_t step;
  uint8_t* u;
  uint8_t* v;
  const DecoderInfo* d;

  static PlanarSink make(const DecoderInfo* dec, uint8_t* row, bool even_row) {
    const bool chroma = kUnit && even_row && dec->u_ptr != nullptr && dec->v_ptr != nullptr;
    return {row, ptrdiff_t(dec->pixel_step), chroma ? dec->u_ptr : nullptr,
            chroma ? dec->v_ptr : nullptr, dec};
  }
  template <class Colour>
  void put(uint32_t i, Colour c) const {
    const Ycc v_ = to_ycc(c);
    if constexpr (kUnit) {
      row[i] = uint8_t(v_.y);
      if (u != nullptr && (i & 1) == 0) {
        u[i >> 1] = uint8_t(v_.cb);
        v[i >> 1] = uint8_t(v_.cr);
      }
    } else {
      uint8_t* p = row + ptrdiff_t(i) * step;
      *p = uint8_t(v_.y);
      put_chroma_by_position(d, p, v_.cb, v_.cr);
    }
  }
};

// ---------------------------------------------------------------------------
// Output cursor.

// Column masks of the region rule, by decode-path code.
inline uint32_t region_column_mask(uint32_t path_code) {
  static constexpr uint8_t kMask[23] = {0, 14, 6, 0, 2,  0,  0,  0,  0, 0, 0, 0,
                                        0, 0,  0, 0, 62, 30, 63, 31, 6, 3, 1};
  return path_code < 23 ? kMask[path_code] : 0;
}

inline bool in_region_mode(const DecoderInfo* d) {
  return d->owner != nullptr && d->owner->region_mode != 0;
}

// First source column of a row: the crop offset plus, in region mode, the
// region's left column masked by the decode-path code.
inline uint32_t first_source_column(const DecoderInfo* d) {
  uint32_t first = d->crop_x > 0 ? uint32_t(d->crop_x) : 0;
  if (in_region_mode(d)) first += d->owner->region_left & region_column_mask(d->path_code);
  return first;
}

// Output rows the cursor may still take, and pixels per row.
inline uint32_t row_limit(const DecoderInfo* d) {
  uint32_t limit = d->visible_height > 0 ? uint32_t(d->visible_height) : 0;
  if (in_region_mode(d) && d->owner->region_height < limit) limit = d->owner->region_height;
  return limit;
}
inline uint32_t width_limit(const DecoderInfo* d, uint32_t width) {
  uint32_t limit = d->visible_width > 0 ? uint32_t(d->visible_width) : 0;
  if (in_region_mode(d) && d->owner->region_width < limit) limit = d->owner->region_width;
  return width < limit ? width : limit;
}

// Moves the cursor on by one written row.
template <class Format>
void advance_row(DecoderInfo* d) {
  if constexpr (Format::kKind == Kind::kPlanar) {
    if (d->pixel_step == 1 && (d->output_rows & 1) == 0 && d->u_ptr != nullptr &&
        d->v_ptr != nullptr) {
      d->u_ptr += d->c_stride;
      d->v_ptr += d->c_stride;
    }
  }
  if constexpr (Format::kKind != Kind::kCount) {
    if (d->output_ptr != nullptr) d->output_ptr += d->row_step;
  }
  ++d->output_rows;
}

template <class T>
struct TypeTag {
  using type = T;
};

// Writes the rows of one writer call. Bit k of `wanted` asks for row k of
// the call (k = 0, 1); rows past the cursor's limit are dropped. body(sinks,
// rows, count, n) fills `count` output rows, sink j for row rows[j] of the
// call, n pixels each. The cursor advances by the rows written.
template <class Format, class Body>
void write_rows(DecoderInfo* d, uint32_t wanted, uint32_t width, Body&& body) {
  const uint32_t limit = row_limit(d);
  uint32_t rows[2];
  uint32_t count = 0;
  for (uint32_t k = 0; k < 2; ++k) {
    if (((wanted >> k) & 1) != 0 && d->output_rows + count < limit) rows[count++] = k;
  }
  if (count == 0) return;
  if constexpr (Format::kKind != Kind::kCount) {
    if (d->output_ptr != nullptr) {
      const uint32_t n = width_limit(d, width);
      auto run = [&](auto tag) {
        using Sink = typename decltype(tag)::type;
        Sink sinks[2] = {Sink::make(d, d->output_ptr, (d->output_rows & 1) == 0),
                         Sink::make(d, count > 1 ? d->output_ptr + d->row_step : d->output_ptr,
                                    (d->output_rows & 1) != 0)};
        body(static_cast<const Sink*>(sinks), static_cast<const uint32_t*>(rows), count, n);
      };
      const bool unit = d->pixel_step == 1;
      if constexpr (Format::kKind == Kind::kPlanar) {
        if (unit)
          run(TypeTag<PlanarSink<true>>{});
        else
          run(TypeTag<PlanarSink<false>>{});
      } else {
        if (unit)
          run(TypeTag<PackedSink<Format, true>>{});
        else
          run(TypeTag<PackedSink<Format, false>>{});
      }
    }
  }
  for (uint32_t j = 0; j < count; ++j) advance_row<Format>(d);
}

}  // namespace vj::colour

#endif  // VETAJ_RECON_COLOUR_PIXELS_H
