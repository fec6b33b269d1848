// Row converters: take batches of upsampled source rows, resize them to the
// visible output size and hand output rows to the pixel writers.
//
// Two resampling schemes, each written once for both directions:
// - centre sampling (the fast family): output index j takes source index
//   floor((floor(S / 2) + j * S) / D), across and down;
// - quarter-point averaging: output index j covers [j * S / D, (j + 1) * S / D)
//   and takes the source samples at its 1/4 and 3/4 points,
//   floor((floor(S / 4) + j * S) / D) and floor((floor(3S / 4) + j * S) / D);
//   the four samples (two columns by two rows) are averaged through packed
//   sums. A row or column that holds both points counts twice.
// When the sizes are equal every row goes straight to the 1:1 writer.
#include <cstring>

#include "recon/colour_routines.h"
#include "recon/colour_rows.h"

namespace vj::colour {
namespace {

enum class Scheme { kAverage, kCentre };

// Largest visible or source dimension the resampler accepts.
constexpr uint32_t kMaxDimension = 1u << 24;

// Source index of output index j: floor((offset + j * S) / D).
inline uint32_t source_index(uint32_t offset, uint32_t j, uint32_t s, uint32_t d) {
  return uint32_t((uint64_t(offset) + uint64_t(j) * s) / d);
}
inline uint32_t quarter_point(uint32_t j, uint32_t s, uint32_t d) {
  return source_index(s / 4, j, s, d);
}
inline uint32_t three_quarter_point(uint32_t j, uint32_t s, uint32_t d) {
  return source_index(uint32_t(uint64_t(s) * 3 / 4), j, s, d);
}
inline uint32_t centre_point(uint32_t j, uint32_t s, uint32_t d) {
  return source_index(s / 2, j, s, d);
}

// Packed sums of the two sample columns of every output column.
template <class Src>
void horizontal_sums(const DecoderInfo* d, Resampler* r, ComponentRows components) {
  const auto src = source_row<Src>(components, first_source_column(d));
  const uint8_t* range_limit = d->range_limit;
  const uint32_t* __restrict a = r->col_a;
  const uint32_t* __restrict b = r->col_b;
  uint32_t* __restrict sums = r->hsum;
  for (uint32_t k = 0; k < r->dst_width; ++k)
    sums[k] = pack(Src::at(src, a[k], range_limit)) + pack(Src::at(src, b[k], range_limit));
}

// Adds the row's sums into an accumulator row, doubled when the source row
// holds both quarter points of the output row.
inline void add_sums(uint32_t* __restrict acc, const uint32_t* __restrict sums, uint32_t n,
                     uint32_t shift) {
  for (uint32_t k = 0; k < n; ++k) acc[k] += sums[k] << shift;
}

// Quarter-point averaging: source row `index` of the window is added to the
// output rows whose quarter points it holds, and every output row whose 3/4
// point it reaches is written. The 3/4 point of an output row never lies
// below the 1/4 point of the next one, so one accumulator row suffices; one
// source row may complete several output rows when enlarging.
template <class Src>
void average_row(DecoderInfo* d, Resampler* r, ComponentRows components, uint32_t index) {
  const uint32_t sh = r->src_height, dh = r->dst_height, dw = r->dst_width;
  bool summed = false;
  while (r->out_row < dh) {
    const uint32_t q1 = quarter_point(r->out_row, sh, dh);
    if (q1 > index) break;
    const uint32_t q3 = three_quarter_point(r->out_row, sh, dh);
    const uint32_t weight = uint32_t(q1 == index) + uint32_t(q3 == index);
    if (weight != 0) {
      if (!summed) horizontal_sums<Src>(d, r, components);
      summed = true;
      add_sums(r->acc, r->hsum, dw, weight - 1);
    }
    if (q3 > index) break;
    write_packed<typename Src::Colour>(d, r->acc, dw);
    std::memset(r->acc, 0, size_t(dw) * sizeof(uint32_t));
    ++r->out_row;
  }
}

// Centre sampling: source row `index` is written once for every output row
// that samples it (never or once while reducing, possibly several times
// while enlarging).
template <class Src>
void sample_row(DecoderInfo* d, Resampler* r, ComponentRows components, uint32_t index) {
  while (r->out_row < r->dst_height &&
         centre_point(r->out_row, r->src_height, r->dst_height) <= index) {
    write_sampled<Src>(d, components, r->dst_width);
    ++r->out_row;
  }
}

// One converter body for every colour space and scheme. In region mode only
// source rows within [region_top, region_top + source height) reach the
// output; the others are consumed.
template <class Src, Scheme kScheme>
void convert(DecoderInfo* d, uint8_t* const* const* rows, uint32_t count) {
  Resampler* r = d->resampler;
  if (r == nullptr) return;
  r->more_output = 0;
  const uint32_t top = in_region_mode(d) ? d->owner->region_top : 0;
  const bool same_size = r->src_width == r->dst_width && r->src_height == r->dst_height;
  // A converter installed over another scheme's state finds no tables.
  if (!same_size && (r->col_a == nullptr || (kScheme == Scheme::kAverage && r->hsum == nullptr)))
    return;
  for (uint32_t i = 0; i < count; ++i) {
    const uint32_t row = r->src_row++;
    if (row < top || row - top >= r->src_height) continue;
    const uint8_t* components[4] = {};
    for (uint32_t c = 0; c < Src::kComponents; ++c) components[c] = rows[c][i];
    if (same_size) {
      write_one_to_one<Src>(d, components, r->dst_width);
    } else if constexpr (kScheme == Scheme::kCentre) {
      sample_row<Src>(d, r, components, row - top);
    } else {
      average_row<Src>(d, r, components, row - top);
    }
  }
}

// Column tables of the chosen scheme and the accumulator row.
bool build_tables(Resampler* r, Scheme scheme) {
  const uint32_t sw = r->src_width, dw = r->dst_width;
  r->col_a = vj::fake_alloc_zeroed<uint32_t>(dw);
  if (r->col_a == nullptr) return false;
  if (scheme == Scheme::kCentre) {
    for (uint32_t k = 0; k < dw; ++k) r->col_a[k] = centre_point(k, sw, dw);
    return true;
  }
  r->col_b = vj::fake_alloc_zeroed<uint32_t>(dw);
  r->acc = vj::fake_alloc_zeroed<uint32_t>(dw);
  r->hsum = vj::fake_alloc_zeroed<uint32_t>(dw);
  if (r->col_b == nullptr || r->acc == nullptr || r->hsum == nullptr)
    return false;
  for (uint32_t k = 0; k < dw; ++k) {
    r->col_a[k] = quarter_point(k, sw, dw);
    r->col_b[k] = three_quarter_point(k, sw, dw);
  }
  return true;
}

bool valid_span(int32_t offset, int32_t length, uint32_t full) {
  if (offset < 0 || length <= 0 || uint32_t(length) > kMaxDimension) return false;
  return full == 0 || uint64_t(offset) + uint64_t(length) <= full;
}

}  // namespace
}  // namespace vj::colour

using namespace vj::colour;

#define VETAJ_CONVERTER_ENTRY(name, source, scheme)                        \
  void name(DecoderInfo* d, uint8_t* const* const* rows, uint32_t count) { \
    convert<source, Scheme::scheme>(d, rows, count);                       \
  }
// The partial forms differ only in being chosen in region mode (the row
// window applies whenever the owner is in region mode), and the upscaling
// forms only in the direction, which the schemes handle both ways.
VETAJ_CONVERTER_ENTRY(VETAJ_DoYcbcrToRgb, YccSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoYcbcrToRgb_Partial, YccSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoYcbcrToUpscaleRgb, YccSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoFastYcbcrToRgb, YccSource, kCentre)
VETAJ_CONVERTER_ENTRY(VETAJ_DoFastYcbcrToRgb_Partial, YccSource, kCentre)
VETAJ_CONVERTER_ENTRY(VETAJ_DoFastYcbcrToUpscaleRgb, YccSource, kCentre)
VETAJ_CONVERTER_ENTRY(VETAJ_DoGrayConvert, GreySource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoGrayConvert_Partial, GreySource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoGrayUpscaleConvert, GreySource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoRgbConvert, RgbSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoRgbConvert_Partial, RgbSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoRgbUpscaleConvert, RgbSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoCMYKToRgb, CmykSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoCMYKToRgb_Partial, CmykSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoYCCKToRgb, YcckSource, kAverage)
VETAJ_CONVERTER_ENTRY(VETAJ_DoYCCKToRgb_Partial, YcckSource, kAverage)
#undef VETAJ_CONVERTER_ENTRY

int32_t vj_select_converter(DecoderInfo* d) {
  if (d == nullptr || d->converter == nullptr) return vj::kStatusFail;
  vj_release_converter(d);
  if (!valid_span(d->crop_x, d->cropped_reduced_width, d->reduced_width) ||
      !valid_span(d->crop_y, d->cropped_reduced_height, d->reduced_height) ||
      !valid_span(0, d->visible_width, 0) || !valid_span(0, d->visible_height, 0))
    return vj::kStatusFail;
  const uint32_t sw = uint32_t(d->cropped_reduced_width), sh = uint32_t(d->cropped_reduced_height);
  const uint32_t dw = uint32_t(d->visible_width), dh = uint32_t(d->visible_height);
  const bool region = in_region_mode(d);
  const bool enlarge = dw > sw || dh > sh;

  ConvertFn convert = nullptr;
  Scheme scheme = Scheme::kAverage;
  switch (d->colour_space) {
    case kColourYcc: {
      const int32_t mode = d->decode_mode;
      const bool fast = (dw <= 99 && dh <= 99) || mode >= 2 ||
                        (mode == 1 && 7ull * sw <= 12ull * dw && 7ull * sh <= 12ull * dh);
      if (fast && !enlarge) {
        convert = region ? VETAJ_DoFastYcbcrToRgb_Partial : VETAJ_DoFastYcbcrToRgb;
        scheme = Scheme::kCentre;
      } else if (fast && mode >= 2) {
        convert = VETAJ_DoFastYcbcrToUpscaleRgb;
        scheme = Scheme::kCentre;
      } else if (enlarge) {
        convert = VETAJ_DoYcbcrToUpscaleRgb;
      } else {
        convert = region ? VETAJ_DoYcbcrToRgb_Partial : VETAJ_DoYcbcrToRgb;
      }
      break;
    }
    case kColourGrey:
      convert = enlarge  ? VETAJ_DoGrayUpscaleConvert
                : region ? VETAJ_DoGrayConvert_Partial
                         : VETAJ_DoGrayConvert;
      break;
    case kColourRgb:
      convert = enlarge  ? VETAJ_DoRgbUpscaleConvert
                : region ? VETAJ_DoRgbConvert_Partial
                         : VETAJ_DoRgbConvert;
      break;
    // No upscaling forms: the plain converters enlarge through the same
    // averaging body.
    case kColourCmyk:
      convert = region ? VETAJ_DoCMYKToRgb_Partial : VETAJ_DoCMYKToRgb;
      break;
    case kColourYcck:
      convert = region ? VETAJ_DoYCCKToRgb_Partial : VETAJ_DoYCCKToRgb;
      break;
    default:
      return vj::kStatusFail;
  }

  Resampler* r = vj::alloc_zeroed<Resampler>();
  if (r == nullptr) return vj::kStatusFail;
  d->resampler = r;
  r->src_width = sw;
  r->src_height = sh;
  r->dst_width = dw;
  r->dst_height = dh;
  const bool same_size = sw == dw && sh == dh;
  if (!same_size && !build_tables(r, scheme)) {
    vj_release_converter(d);
    return vj::kStatusFail;
  }
  d->converter->convert = convert;
  return vj::kStatusOk;
}

void vj_converter_set_row(DecoderInfo* d, uint32_t row) {
  if (d != nullptr && d->resampler != nullptr) d->resampler->src_row = row;
}

void vj_release_converter(DecoderInfo* d) {
  if (d == nullptr || d->resampler == nullptr) return;
  Resampler* r = d->resampler;
  vj::fake_free(r->col_a);
  vj::fake_free(r->col_b);
  vj::fake_free(r->acc);
  vj::fake_free(r->hsum);
  vj::os_free(d->resampler);
}
