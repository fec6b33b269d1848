// Upsampling by replication, the reconstruction set-up (transform slots,
// fused writer, sample buffers) and the row driver between the context
// controller and the colour converters.
#include "recon/upsample.h"

#include <cstring>

#include "drivers/init.h"
#include "recon/colour.h"
#include "recon/idct.h"

namespace {

constexpr uint32_t kGroupsPerImcu = 8;  // row groups of one iMCU row at full size

uint32_t round_up(uint32_t x, uint32_t a) { return (x + a - 1) / a * a; }

}  // namespace

void VETAJ_DoFullsizeUpsample(DecoderInfo*, ComponentInfo*, uint8_t** input_rows,
                              uint8_t*** output_slot) {
  *output_slot = input_rows;
}

void VETAJ_DoH2V1Upsample(DecoderInfo* d, ComponentInfo* c, uint8_t** input_rows,
                          uint8_t*** output_slot) {
  uint8_t** out = *output_slot;
  const uint32_t width = static_cast<uint32_t>(c->output_width);
  for (uint32_t r = 0; r < d->max_v_samp; ++r) {
    const uint8_t* __restrict in = input_rows[r];
    uint8_t* __restrict o = out[r];
    for (uint32_t i = 0; i < width; ++i) o[2 * i] = o[2 * i + 1] = in[i];
  }
}

void VETAJ_DoH2V2Upsample(DecoderInfo* d, ComponentInfo* c, uint8_t** input_rows,
                          uint8_t*** output_slot) {
  uint8_t** out = *output_slot;
  const uint32_t width = static_cast<uint32_t>(c->output_width);
  for (uint32_t i = 0; 2 * i < d->max_v_samp; ++i) {
    const uint8_t* __restrict in = input_rows[i];
    uint8_t* __restrict o = out[2 * i];
    for (uint32_t x = 0; x < width; ++x) o[2 * x] = o[2 * x + 1] = in[x];
    std::memcpy(out[2 * i + 1], o, 2 * width);
  }
}

void VETAJ_DoIntegralUpsample(DecoderInfo* d, ComponentInfo* c, uint8_t** input_rows,
                              uint8_t*** output_slot) {
  Upsampler* up = d->upsampler;
  uint8_t** out = *output_slot;
  const uint32_t h = up->h_expand[c->index];
  const uint32_t v = up->v_expand[c->index];
  const uint32_t full = static_cast<uint32_t>(c->output_width) * h;
  for (uint32_t row = 0, in = 0; row < d->max_v_samp; row += v, ++in) {
    const uint8_t* src = input_rows[in];
    uint8_t* o = out[row];
    for (uint32_t x = 0, i = 0; x < full; ++i)
      for (uint32_t k = 0; k < h; ++k) o[x++] = src[i];
    for (uint32_t k = 1; k < v && row + k < d->max_v_samp; ++k) std::memcpy(out[row + k], o, full);
  }
}

namespace {

// Builds the two row-pointer lists of a component's sample rows:
// list 0 holds the rows in order; list 1 swaps the row groups M-2, M-1 with
// M, M+1, so that decoding the next iMCU row through it leaves the last row
// groups of the previous one intact.
bool make_lists(DecoderInfo* d, uint32_t ci, uint32_t G, uint32_t row_bytes) {
  const uint32_t M = kGroupsPerImcu;
  const uint32_t rows = G * (M + 2);
  d->sample_rows[ci] = VETAJ_AllocSampleArry(d, row_bytes, rows, nullptr);
  if (d->sample_rows[ci] == nullptr) return false;
  const uint32_t entries = G * (M + 5);  // G in front, M + 4 groups
  uint8_t** lists = static_cast<uint8_t**>(VETA_FakeMalloc(nullptr, 2 * entries * sizeof(uint8_t*)));
  if (lists == nullptr) return false;
  d->sample_list_alloc[ci] = lists;
  uint8_t** l0 = lists + G;
  uint8_t** l1 = lists + entries + G;
  uint8_t** buf = d->sample_rows[ci];
  for (uint32_t i = 0; i < G * (M + 4); ++i) l0[i] = l1[i] = buf[i < rows ? i : rows - 1];
  for (uint32_t i = 0; i < 2 * G; ++i) {
    l1[G * (M - 2) + i] = buf[G * M + i];
    l1[G * M + i] = buf[G * (M - 2) + i];
  }
  for (uint32_t i = 0; i < G; ++i) {
    l0[static_cast<int32_t>(i) - static_cast<int32_t>(G)] = l0[0];
    l1[static_cast<int32_t>(i) - static_cast<int32_t>(G)] = l1[0];
  }
  d->sample_lists[ci][0] = l0;
  d->sample_lists[ci][1] = l1;
  return true;
}

}  // namespace

namespace vj {

// After the first iMCU row: the rows of the previous iMCU row serve as the
// context above, and the first rows wrap around below.
void set_wraparound_lists(DecoderInfo* d) {
  const uint32_t M = kGroupsPerImcu;
  for (uint32_t ci = 0; ci < d->num_components; ++ci) {
    const uint32_t G = static_cast<uint32_t>(d->upsampler->rowgroup_height[ci]);
    uint8_t** l0 = d->sample_lists[ci][0];
    uint8_t** l1 = d->sample_lists[ci][1];
    for (uint32_t i = 0; i < G; ++i) {
      const int32_t above = static_cast<int32_t>(i) - static_cast<int32_t>(G);
      l0[above] = l0[G * (M + 1) + i];
      l1[above] = l1[G * (M + 1) + i];
      l0[G * (M + 2) + i] = l0[i];
      l1[G * (M + 2) + i] = l1[i];
    }
  }
}

// For the last iMCU row: the row groups that hold real samples, with the
// last real row repeated below them. Returns the available row groups.
uint32_t set_bottom_lists(DecoderInfo* d, uint32_t which) {
  uint32_t avail = kGroupsPerImcu;
  for (uint32_t ci = 0; ci < d->num_components; ++ci) {
    const ComponentInfo* c = &d->components[ci];
    const uint32_t G = static_cast<uint32_t>(d->upsampler->rowgroup_height[ci]);
    const uint32_t per_imcu = G * kGroupsPerImcu;
    uint32_t left = c->height_samples % per_imcu;
    if (left == 0) left = per_imcu;
    if (ci == 0) avail = (left - 1) / G + 1;
    uint8_t** l = d->sample_lists[ci][which];
    for (uint32_t i = 0; i < 2 * G; ++i) l[left + i] = l[left - 1];
  }
  return avail;
}

}  // namespace vj

int32_t VETAJ_InitUpsampler(DecoderInfo* d) {
  Upsampler* up = d->upsampler;
  if (up == nullptr) {
    up = vj::alloc_zeroed<Upsampler>();
    if (up == nullptr) return vj::kStatusFail;
    d->upsampler = up;
  }
  const uint32_t nc = d->num_components;
  const uint32_t mh = d->max_h_samp, mv = d->max_v_samp;
  up->next_row_out = static_cast<int32_t>(mv);
  up->rows_to_go = d->reduced_height;
  const int32_t cs = d->colour_space;
  const bool ycc_like = cs == kColourYcc || cs == kColourCmyk || cs == kColourYcck;
  int32_t code = 0;
  bool mixed_chroma = false;
  for (uint32_t ci = 0; ci < nc; ++ci) {
    ComponentInfo* c = &d->components[ci];
    c->dct_scaled_w = c->dct_scaled_h = 8;
    up->rowgroup_height[ci] = c->v_samp;
    const uint32_t in_h = c->h_samp, in_v = c->v_samp;
    if (ci >= 2 && (c->h_samp != d->components[1].h_samp || c->v_samp != d->components[1].v_samp))
      mixed_chroma = true;
    if (in_h == mh && in_v == mv) {
      up->method[ci] = VETAJ_DoFullsizeUpsample;
      if (code == 0) {
        if (cs == kColourYcc || cs == kColourCmyk) code = 4;
        else if (cs == kColourYcck) code = mh != 1 ? 2 : 4;
      }
    } else if (2 * in_h == mh && in_v == mv) {
      up->method[ci] = VETAJ_DoH2V1Upsample;
      if (ycc_like) code = 2;
    } else if (2 * in_h == mh && 2 * in_v == mv) {
      if (c->width_samples < 2) {
        up->method[ci] = VETAJ_DoIntegralUpsample;
        up->h_expand[ci] = static_cast<uint8_t>(mh / in_h);
        up->v_expand[ci] = 2;
      } else {
        up->method[ci] = VETAJ_DoH2V2Upsample;
        if (ycc_like) code = 1;
      }
    } else if (mh % in_h == 0 && mv % in_v == 0) {
      up->method[ci] = VETAJ_DoIntegralUpsample;
      up->h_expand[ci] = static_cast<uint8_t>(mh / in_h);
      up->v_expand[ci] = static_cast<uint8_t>(mv / in_v);
      if (ycc_like) code = (up->h_expand[ci] > 2 || up->v_expand[ci] >= 3) ? 0 : 3;
    } else {
      return vj::kStatusFail;
    }
  }
  // The decode-path code selects the writers' region column mask.
  const bool cmyk_like = cs == kColourCmyk || cs == kColourYcck;
  const DecInfo* o = d->owner;
  if (o != nullptr && o->region_map != nullptr) {
    d->path_code = o->sample_size;
  } else if (code != 0) {
    d->path_code = (code <= 2 ? 16u : 17u) + (cmyk_like ? 2u : 0u);
  }
  // When the fused writers cannot serve the layout, the plain path does.
  const bool exact = d->visible_width == d->reduced_width &&
                     d->visible_height == d->reduced_height && d->crop_x == 0 &&
                     d->crop_y == 0 && d->visible_width != 1 && d->visible_height != 1;
  if (cmyk_like || mixed_chroma || d->scale_shift > 3 || (o != nullptr && o->scan_sample_size != 0) ||
      !exact || d->decode_mode != 0 || d->output_format == KOLVAVETA_FMT_NONE ||
      d->output_format == KOLVAVETA_FMT_RGBA8888_B || nc != 3 ||
      (o != nullptr && o->region_mode != 0 && o->region_map == nullptr))
    code = 0;
  d->converter->fused = code != 0 ? vj_select_fused_writer(code, d->output_format) : nullptr;
  d->fused_rows = (code == 1 || code == 3) ? 2u : (code != 0 ? 1u : 0u);
  if (d->converter->fused == nullptr) d->fused_rows = 0;

  // Transform slots.
  const bool baseline = d->marker->frame_kind == kFrameBaseline;
  const bool islow = o != nullptr && (o->options & KOLVAVETA_OPT_ISLOW_TABLE) != 0 && baseline;
  const VETAJ_IdctFn* tpl = vj_idct_template(static_cast<int32_t>(d->scale_shift > 3 ? 3 : d->scale_shift),
                                             static_cast<int32_t>(d->scale_num), islow);
  if (tpl == nullptr) return vj::kStatusFail;
  const int32_t slots = d->scale_shift == 0 ? kIdctSlots : kIdctResizeSlots;
  for (int32_t i = 0; i < 29; ++i) d->idct_slots[i] = tpl[i < slots ? i : slots - 1];

  // Sample buffers (built once per decoder) and colour buffers.
  const uint32_t block = d->scale_num == 3 ? 3u : (8u >> (d->scale_shift > 3 ? 3 : d->scale_shift));
  for (uint32_t ci = 0; ci < nc; ++ci) {
    ComponentInfo* c = &d->components[ci];
    if (d->sample_rows[ci] == nullptr) {
      const uint32_t blocks_across = round_up(c->width_blocks, c->h_samp) + c->h_samp;
      if (!make_lists(d, ci, c->v_samp, blocks_across * 8)) return vj::kStatusFail;
    }
    if (up->method[ci] != VETAJ_DoFullsizeUpsample && d->fused_rows == 0 &&
        up->color_alloc[ci] == nullptr) {
      const uint32_t width = round_up(d->reduced_width + 8 * block, mh) + 32;
      up->color_alloc[ci] = VETAJ_AllocSampleArry(d, width, mv, nullptr);
      if (up->color_alloc[ci] == nullptr) return vj::kStatusFail;
    }
    up->color_buf[ci] = up->color_alloc[ci];
  }
  return vj::kStatusOk;
}

namespace vj {

// Index of the scaled row group that the group counter points at.
inline uint32_t scaled_group(const DecoderInfo* d) {
  return (d->controller.group_counter * d->scale_num) >> d->scale_shift;
}

inline void advance_group(DecoderInfo* d) {
  d->controller.group_counter += d->scale_num == 3 ? 3u : (1u << d->scale_shift);
}

}  // namespace vj

void VETAJ_SetupUpsample(DecoderInfo* d, uint8_t* /*output*/, uint32_t* row_ctr,
                         uint32_t rows_avail) {
  Upsampler* up = d->upsampler;
  const uint32_t mv = d->max_v_samp;
  const uint32_t which = d->controller.which_set;
  const uint32_t g = vj::scaled_group(d);
  if (d->fused_rows != 0) {
    // Fused upsample-and-convert straight from the component rows.
    if (up->next_row_out >= static_cast<int32_t>(mv)) up->next_row_out = 0;
    const uint32_t rows = d->fused_rows;
    uint32_t emit = rows < up->rows_to_go ? rows : up->rows_to_go;
    if (emit == 0) return;
    const uint32_t gy = static_cast<uint32_t>(up->rowgroup_height[0]);
    const uint32_t gc = static_cast<uint32_t>(up->rowgroup_height[1]);
    const uint32_t nro = static_cast<uint32_t>(up->next_row_out);
    uint8_t** ly = d->sample_lists[0][which] + gy * g + nro;
    const uint8_t* y0 = ly[0];
    const uint8_t* y1 = (rows == 2 && emit == 2) ? ly[1] : nullptr;
    // Chroma rows advance with the output rows, or at half their pace when
    // chroma is subsampled vertically.
    const uint32_t crow = gc * g + nro * gc / mv;
    const uint8_t* cb = d->sample_lists[1][which][crow];
    const uint8_t* cr = d->sample_lists[2][which][crow];
    if (d->skip_output == 0) {
      d->converter->fused(d, y0, y1, cb, cr, static_cast<uint32_t>(d->visible_width));
    } else {
      d->output_ptr += static_cast<ptrdiff_t>(d->row_step) * emit;
      d->output_rows += emit;
    }
    *row_ctr += emit;
    up->rows_to_go -= emit;
    up->next_row_out += static_cast<int32_t>(rows);
    if (up->next_row_out >= static_cast<int32_t>(mv)) vj::advance_group(d);
    return;
  }
  if (up->next_row_out >= static_cast<int32_t>(mv)) {
    for (uint32_t ci = d->num_components; ci-- > 0;) {
      const uint32_t G = static_cast<uint32_t>(up->rowgroup_height[ci]);
      up->method[ci](d, &d->components[ci], d->sample_lists[ci][which] + G * g,
                     &up->color_buf[ci]);
    }
    up->next_row_out = 0;
  }
  uint32_t n = mv - static_cast<uint32_t>(up->next_row_out);
  if (n > up->rows_to_go) n = up->rows_to_go;
  if (rows_avail > *row_ctr && n > rows_avail - *row_ctr) n = rows_avail - *row_ctr;
  if (rows_avail <= *row_ctr) n = 0;
  if (n > 0) {
    uint8_t* const* rows[4];
    for (uint32_t ci = 0; ci < d->num_components; ++ci)
      rows[ci] = up->color_buf[ci] + up->next_row_out;
    if (d->skip_output == 0) {
      d->converter->convert(d, rows, n);
    }
  }
  *row_ctr += n;
  up->rows_to_go -= n;
  up->next_row_out += static_cast<int32_t>(n);
  if (up->next_row_out >= static_cast<int32_t>(mv)) vj::advance_group(d);
}

void VETAJ_SkipRowUpsample(DecoderInfo* d, uint8_t* /*output*/, uint32_t* row_ctr,
                           uint32_t rows_avail) {
  Upsampler* up = d->upsampler;
  const uint32_t mv = d->max_v_samp;
  if (up->next_row_out >= static_cast<int32_t>(mv)) up->next_row_out = 0;
  uint32_t n = mv - static_cast<uint32_t>(up->next_row_out);
  if (n > up->rows_to_go) n = up->rows_to_go;
  if (rows_avail <= *row_ctr) n = 0;
  else if (n > rows_avail - *row_ctr) n = rows_avail - *row_ctr;
  *row_ctr += n;
  up->rows_to_go -= n;
  up->next_row_out += static_cast<int32_t>(n);
  if (up->next_row_out >= static_cast<int32_t>(mv)) vj::advance_group(d);
}

void vj_release_upsampler(DecoderInfo* d) {
  Upsampler* up = d->upsampler;
  if (up == nullptr) return;
  for (auto*& buf : up->color_alloc) vj::free_sample_array(buf);
  vj::os_free(d->upsampler);
}
