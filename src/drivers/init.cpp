// Decoder set-up for one decode: header, colour space, output geometry and
// placement, converter, component geometry, per-scan tables and buffers.
#include "drivers/init.h"

#include <cstring>

#include "recon/colour.h"
#include "recon/idct.h"
#include "recon/upsample.h"
#include "entropy/mcu.h"
#include "syntax/scan_setup.h"

namespace {

// Default quantisation tables for components whose table was never defined
// (natural order).
constexpr uint16_t kDefaultLuma[64] = {
    5,  3,  3,  5,  7,  12, 15, 18, 4,  4,  4,  6,  8,  17, 18, 17, 4,  4,  5,  7,  12, 17,
    21, 17, 4,  5,  7,  9,  15, 26, 24, 19, 5,  7,  11, 17, 20, 33, 31, 23, 7,  11, 17, 19,
    24, 31, 34, 28, 15, 19, 23, 26, 31, 36, 36, 30, 22, 28, 29, 29, 34, 30, 31, 30};
constexpr uint16_t kDefaultChroma[64] = {
    5,  5,  7,  14, 30, 30, 30, 30, 5,  6,  8,  20, 30, 30, 30, 30, 7,  8,  17, 30, 30, 30,
    30, 30, 14, 20, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30,
    30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30, 30};

// Chooses the colour space from the component count and the markers seen.
int32_t decide_colour_space(const DecoderInfo* d) {
  const MarkerState* m = d->marker;
  switch (d->num_components) {
    case 1:
      return kColourGrey;
    case 3: {
      if (m->seen_app0) return kColourYcc;
      if (m->seen_adobe) {
        if (m->adobe_transform == 0) return kColourRgb;
        if (m->adobe_transform == 1) return kColourYcc;
        return 0;
      }
      const uint8_t* id = m->component_ids;
      if ((id[0] == 0 && id[1] == 1 && id[2] == 2) || (id[0] == 1 && id[1] == 2 && id[2] == 3))
        return kColourYcc;
      if (id[0] == 'R' && id[1] == 'G' && id[2] == 'B') return kColourRgb;
      return 0;
    }
    case 4:
      if (m->seen_adobe) return m->adobe_transform != 0 ? kColourYcck : kColourCmyk;
      return 0;  // rejected when decompression starts
    default:
      return -1;
  }
}

int32_t bytes_per_pixel(int32_t format) {
  const int32_t b = vj_bytes_per_pixel(format);
  return b > 0 ? b : 1;
}

// Places the output pointer and steps in the caller's buffer.
void place_output(DecoderInfo* d, const DecInfo* o, uint8_t* buffer, int32_t buf_w,
                  int32_t buf_h, int32_t ox, int32_t oy) {
  const int32_t vw = d->visible_width;
  const int32_t vh = d->visible_height;
  const int32_t fmt = d->output_format;
  const int32_t bpp = bytes_per_pixel(fmt);
  int32_t stride = buf_w;  // row length in pixels
  if (o->region_mode != 0) {
    stride = static_cast<int32_t>(o->region_width);
    ox = oy = 0;
  }
  uint8_t* base = buffer;
  if (fmt == KOLVAVETA_FMT_YUV420) {
    // Planar output: the planes cover the buffer.
    const uint32_t cw = (static_cast<uint32_t>(stride) + 1) / 2;
    const uint32_t rows = o->region_mode != 0 ? o->region_height : static_cast<uint32_t>(buf_h);
    const uint32_t ch = (rows + 1) / 2;
    d->y_plane = buffer;
    d->u_plane = buffer + static_cast<size_t>(stride) * rows;
    d->v_plane = d->u_plane + static_cast<size_t>(cw) * ch;
    d->y_stride = static_cast<uint32_t>(stride);
    d->c_stride = cw;
    d->plane_height = rows;
    const int32_t y0 = o->region_mode != 0 ? static_cast<int32_t>(o->region_top) : oy;
    const bool region_map = (o->options & KOLVAVETA_OPT_REGION_MAP) != 0;
    const int32_t px = region_map ? 0 : ox;
    const int32_t py = region_map ? 0 : oy;
    base = buffer + static_cast<size_t>(py) * stride + px;
    d->u_ptr = d->u_plane + (region_map ? 0 : static_cast<size_t>(y0 / 2) * cw + px / 2);
    d->v_ptr = d->v_plane + (region_map ? 0 : static_cast<size_t>(y0 / 2) * cw + px / 2);
  } else {
    base = buffer + (static_cast<size_t>(oy) * stride + ox) * bpp;
  }
  int32_t row_bytes = stride * bpp;
  if (d->rotation == 0 && o->region_step_divisor != 0 && bpp == 4)
    row_bytes = (stride / static_cast<int32_t>(o->region_step_divisor)) * 4;
  switch (d->rotation) {
    case 4:  // 90 degrees clockwise: source rows become columns, right to left
      d->pixel_step = stride;
      d->row_step = -bpp;
      d->output_ptr = base + static_cast<ptrdiff_t>(vh - 1) * bpp;
      break;
    case 8:  // 180 degrees
      d->pixel_step = -1;
      d->row_step = -row_bytes;
      d->output_ptr = base + (static_cast<ptrdiff_t>(vh - 1) * stride + (vw - 1)) * bpp;
      break;
    case 12:  // 270 degrees: source rows become columns, left to right, bottom up
      d->pixel_step = -stride;
      d->row_step = bpp;
      d->output_ptr = base + static_cast<ptrdiff_t>(vw - 1) * stride * bpp;
      break;
    default:
      d->pixel_step = 1;
      d->row_step = row_bytes;
      d->output_ptr = base;
      break;
  }
}

// Reduction shift for an output size o of an image dimension D.
uint32_t reduction_for(uint32_t o, uint32_t D) {
  if (o <= (D >> 3)) return 3;
  if (o <= (D >> 2)) return 2;
  if (o <= (D >> 1)) return 1;
  return 0;
}

// Builds (once) a component's 64 dequantisation multipliers.
bool build_multipliers(DecoderInfo* d, ComponentInfo* c) {
  if (c->multipliers == nullptr) {
    c->multipliers = vj::fake_alloc_zeroed<uint32_t>(64);
    if (c->multipliers == nullptr) return false;
  }
  const QuantTable* q = c->quant;
  if (d->scale_num == 3) {
    // The 3/8 transform expects multipliers that carry the AAN factors.
    vj_build_aan_multipliers(q->values, c->multipliers);
    return true;
  }
  for (int i = 0; i < 64; ++i) c->multipliers[i] = q->values[i];
  if (d->decode_mode == 1 && d->scale_shift == 0 && d->fine_quant != 0 &&
      d->marker->frame_kind == kFrameBaseline) {
    // Ratios of the fine-quantisation mode (used by the requantising
    // decoder); the transform keeps the plain quantiser values.
    QuantTable* qt = c->quant;
    for (int k = 0; k < 64; ++k) {
      const int z = VETAJ_NATURAL_ORDER[k];
      const uint32_t qv = qt->values[z];
      const uint32_t dv = c->index == 0 ? kDefaultLuma[z] : kDefaultChroma[z];
      qt->ratios[z] = (k != 0 && qv < dv) ? (qv << 13) / dv : 0x2000u;
    }
  }
  return true;
}

}  // namespace

int32_t VETAJ_GetGCD(int32_t a, int32_t b) {
  uint32_t x = static_cast<uint32_t>(a < 0 ? -static_cast<int64_t>(a) : a);
  uint32_t y = static_cast<uint32_t>(b < 0 ? -static_cast<int64_t>(b) : b);
  while (y != 0) {
    const uint32_t t = x % y;
    x = y;
    y = t;
  }
  return static_cast<int32_t>(x);
}

uint8_t** VETAJ_AllocSampleArry(DecoderInfo* /*decoder*/, uint32_t row_bytes, uint32_t rows,
                                uint32_t* misalignment) {
  if (rows == 0) return nullptr;
  const uint32_t width = (row_bytes + 31u) & ~31u;
  uint8_t** table = static_cast<uint8_t**>(VETA_FakeMalloc(nullptr, rows * sizeof(uint8_t*)));
  if (table == nullptr) return nullptr;
  // The rows follow in one aligned block, kept behind the table's last entry.
  uint8_t* block = static_cast<uint8_t*>(VETA_FakeMalloc(nullptr, width * rows));
  if (block == nullptr) {
    VETA_FakeFree(table);
    return nullptr;
  }
  std::memset(block, 0, static_cast<size_t>(width) * rows);
  for (uint32_t i = 0; i < rows; ++i) table[i] = block + static_cast<size_t>(i) * width;
  if (misalignment != nullptr) *misalignment = 0;
  return table;
}

namespace vj {
// Frees a table from VETAJ_AllocSampleArry.
void free_sample_array(uint8_t**& table) {
  if (table == nullptr) return;
  VETA_FakeFree(table[0]);
  VETA_FakeFree(table);
  table = nullptr;
}
}  // namespace vj

int32_t VETAJ_ParseHeader(DecoderInfo* d, int32_t /*flags*/) {
  d->marker = vj::fake_alloc_zeroed<MarkerState>();
  if (d->marker == nullptr || d->window == nullptr) return vj::kStatusFail;
  d->marker->adobe_transform = 1;
  StreamWindow* w = d->window;
  if (d->stream != nullptr && d->stream->kind != vj::kIoMemoryOwned) {
    // Find the start of image; running out of input is left to the marker
    // reader to report.
    int32_t prev = -1;
    for (;;) {
      const int32_t c = vj::window_byte(w);
      if (c < 0) break;
      if (prev == 0xFF && c == 0xD8) {
        if (d->owner != nullptr) d->owner->image_type = KOLVAVETA_IMAGE_JPEG;
        break;
      }
      prev = c;
    }
  }
  int32_t status = vj::kStatusOk;
  for (;;) {
    const uint8_t code = VETAJ_ParseNextMarker(d, &status);
    if (status != vj::kStatusOk) return vj::kStatusFail;
    if (code == 0xDA) break;
  }
  d->colour_space = decide_colour_space(d);
  if (d->colour_space < 0) return vj::kStatusFail;
  const MarkerState* m = d->marker;
  if (m->frame_kind == 0 || m->seen_sos == 0 || m->seen_dht == 0 || m->seen_dqt == 0)
    return vj::kStatusFail;
  return vj::kStatusOk;
}

DecoderInfo* VETAJ_PreInitialize(DecInfo* o, StreamWindow* w) {
  DecoderInfo* d = vj::alloc_zeroed<DecoderInfo>();
  if (d == nullptr) {
    vj::set_error(KOLVAVETA_ERR_NO_MEMORY);
    return nullptr;
  }
  d->check_callback = o->check_callback;
  d->output_format = o->output_format;
  d->decode_mode = o->decode_mode;
  d->region_map_flag = o->options & KOLVAVETA_OPT_REGION_MAP;
  d->window = w;
  d->stream = w->stream;
  d->window_buffer = w->buffer;
  d->input_buffer = w->buffer;
  d->owner = o;
  d->scale_num = 1;
  if (VETAJ_ParseHeader(d, 0) != vj::kStatusOk) {
    VETAJ_DeleteDecoderInfo(d);
    KOLVAVETA_OsFree(d);
    return nullptr;
  }
  o->cancel = 0;
  return d;
}

DecoderInfo* VETAJ_PostInitialize(DecInfo* o, OutputRequest* req, DecoderInfo* d) {
  const uint32_t W = d->image_width;
  const uint32_t H = d->image_height;
  if (W == 0 || H == 0 || req->width <= 0 || req->height <= 0) return nullptr;
  const bool progressive = d->marker->frame_kind == kFrameProgressive;
  const uint32_t fit = o->options & KOLVAVETA_OPT_FIT_MASK;
  int32_t buf_w = req->width;
  int32_t buf_h = req->height;
  const uint32_t s = o->sample_size;

  // 1. Target size.
  uint32_t tw = static_cast<uint32_t>(buf_w);
  uint32_t th = static_cast<uint32_t>(buf_h);
  if (s != 0) {
    uint32_t sw = W / s, sh = H / s;
    if (o->decode_mode == KOLVAVETA_MODE_THUMBNAIL) {
      sw = static_cast<uint32_t>(o->image_width);
      sh = static_cast<uint32_t>(o->image_height);
    }
    tw = sw;
    th = sh;
    if (tw > static_cast<uint32_t>(buf_w) || th > static_cast<uint32_t>(buf_h)) {
      tw = static_cast<uint32_t>(buf_w);
      th = static_cast<uint32_t>(buf_h);
    }
  }
  // 2. Rotation.
  d->rotation = o->options & KOLVAVETA_OPT_ROTATE_MASK;
  const bool quarter_turn = d->rotation == 4 || d->rotation == 12;
  if (quarter_turn) {
    const bool fits_as_is =
        s != 0 && static_cast<uint32_t>(buf_w) > H / s && static_cast<uint32_t>(buf_h) > W / s;
    if (!fits_as_is) {
      tw = static_cast<uint32_t>(buf_h);
      th = static_cast<uint32_t>(buf_w);
    }
  }
  if (tw == 0) tw = 1;
  if (th == 0) th = 1;

  // 3. Fit.
  uint32_t ow, oh;
  uint32_t r = 0;
  uint32_t n = 1;
  bool small = false;
  if (W <= tw && H <= th) {
    small = true;
    if (fit == KOLVAVETA_OPT_FIT_STRETCH) {
      ow = tw;
      oh = th;
    } else {
      ow = W;
      oh = H;
    }
  } else if ((uint64_t(tw) * H / W == th || uint64_t(W) * th / H == tw) && W >= tw && H >= th) {
    ow = tw;
    oh = th;
  } else if (fit == KOLVAVETA_OPT_FIT_STRETCH) {
    ow = tw;
    oh = th;
  } else if (fit == KOLVAVETA_OPT_FIT_FILL) {
    ow = W;
    oh = H;
    if (W > tw) {
      ow = tw;
      oh = static_cast<uint32_t>((uint64_t(tw) * H + W / 2) / W);
    }
    if (oh < th) {
      oh = th;
      ow = static_cast<uint32_t>((uint64_t(W) * th + H / 2) / H);
    }
    if (ow > W || oh > H) {
      ow = W;
      oh = H;
    }
  } else {
    ow = W;
    oh = H;
    bool done = false;
    if (W > tw) {
      ow = tw;
      oh = static_cast<uint32_t>((uint64_t(tw) * H + W / 2) / W);
      done = oh <= th;
    } else {
      done = oh <= th;
    }
    if (!done) {
      oh = th;
      ow = static_cast<uint32_t>((uint64_t(W) * th + H / 2) / H);
    }
  }
  if (ow == 0) ow = 1;
  if (oh == 0) oh = 1;

  // 4. Reduction, on the dimension whose output-to-image ratio is larger.
  if (!small) {
    if (uint64_t(W) * oh > uint64_t(H) * ow)
      r = reduction_for(oh, H);
    else
      r = reduction_for(ow, W);
  }
  // 5. Decode mode.
  switch (d->decode_mode) {
    case KOLVAVETA_MODE_FASTEST:
      r = 3;
      n = 1;
      break;
    case KOLVAVETA_MODE_FASTER: {
      static const uint32_t kNext[4] = {1, 3, 3, 4};
      if (r == 1) n = 3;
      r = r < 4 ? kNext[r] : r;
      break;
    }
    case KOLVAVETA_MODE_FASTER2:
      if (r == 0) {
        r = 3;
        n = 3;
      } else if (r < 4) {
        r = r + 1;
      }
      break;
    default:
      break;
  }
  if (progressive && n == 3) {
    r = 1;
    n = 1;
  }
  if (r > 6) r = 6;
  if (progressive && r > 3) r = 3;
  // A reduction that would leave nothing of the picture is stepped back.
  while (r > 0 && (((n * W) >> r) == 0 || ((n * H) >> r) == 0)) {
    if (n == 3) {
      n = 1;
      r = 1;
    } else {
      --r;
    }
  }
  d->scale_shift = r;
  d->scale_num = n;
  d->scale_factor = n == 3 ? 3 : (1u << r);
  // 6. Reduced size.
  d->reduced_width = static_cast<uint16_t>((n * W) >> r);
  d->reduced_height = static_cast<uint16_t>((n * H) >> r);
  d->fast_reduced = (d->num_components > 1 && !progressive && r != 0 && n != 3) ? 1 : 0;
  d->output_width = static_cast<int32_t>(ow);
  d->output_height = static_cast<int32_t>(oh);
  // 7. Block output sizes of the fast reduced paths.
  for (uint32_t& b : d->block_out_size) b = 8;
  d->no_resize = (ow == d->reduced_width && oh == d->reduced_height) ? 1 : 0;
  if (d->no_resize) {
    if (d->decode_mode == 0 && ow >= 8) {
      uint32_t size = 8 / (W / ow != 0 ? W / ow : 1);
      if (size == 0) size = 1;
      d->block_out_size[0] = d->block_out_size[1] = size;
      if (d->fast_reduced) d->block_out_size[0] = size * 2;
    }
  } else if (d->decode_mode == 0 && d->fast_reduced) {
    static const uint32_t kSizes[4][2] = {{16, 8}, {8, 4}, {4, 2}, {2, 1}};
    if (r <= 3) {
      d->block_out_size[0] = kSizes[r][0];
      d->block_out_size[1] = kSizes[r][1];
    }
  }
  // 8. Fill mode crops the overhang equally on both sides.
  d->visible_width = static_cast<int32_t>(ow);
  d->visible_height = static_cast<int32_t>(oh);
  d->cropped_reduced_width = d->reduced_width;
  d->cropped_reduced_height = d->reduced_height;
  d->crop_x = d->crop_y = 0;
  if (fit == KOLVAVETA_OPT_FIT_FILL) {
    if (ow > tw) {
      d->visible_width = static_cast<int32_t>(tw);
      d->cropped_reduced_width =
          static_cast<int32_t>((ow - 1 + uint64_t(tw) * d->reduced_width) / ow);
      d->crop_x = (d->reduced_width - d->cropped_reduced_width) / 2;
    }
    if (oh > th) {
      d->visible_height = static_cast<int32_t>(th);
      d->cropped_reduced_height =
          static_cast<int32_t>((oh - 1 + uint64_t(th) * d->reduced_height) / oh);
      d->crop_y = (d->reduced_height - d->cropped_reduced_height) / 2;
    }
  }
  // The converters map the cropped source onto the visible area.
  d->no_resize = (d->visible_width == d->cropped_reduced_width &&
                  d->visible_height == d->cropped_reduced_height)
                     ? 1
                     : 0;
  d->requested_width = buf_w;
  d->requested_height = buf_h;

  // 9. Decompression set-up.
  if (VETAJ_StartDecompression(d) != vj::kStatusOk) return nullptr;
  if (r != 0 && d->entropy != nullptr && d->entropy->block_skip[0] == nullptr &&
      (d->Se != 0 || !progressive))
    return nullptr;
  // 10. Sizes reported back.
  req->image_width = static_cast<int32_t>(W);
  req->image_height = static_cast<int32_t>(H);
  o->output_width = static_cast<int32_t>(ow);
  o->output_height = static_cast<int32_t>(oh);
  // 11. Placement in the buffer.
  const int32_t vis_w = quarter_turn ? d->visible_height : d->visible_width;
  const int32_t vis_h = quarter_turn ? d->visible_width : d->visible_height;
  int32_t ox = (buf_w - vis_w) / 2;
  int32_t oy = (buf_h - vis_h) / 2;
  if (fit == KOLVAVETA_OPT_FIT_ROWLEN) {
    ox = oy = 0;
    buf_w = vis_w;
    buf_h = vis_h;
  } else if (fit == KOLVAVETA_OPT_FIT_TOPLEFT) {
    ox = oy = 0;
  }
  if (ox < 0) ox = 0;
  if (oy < 0) oy = 0;
  // 12. Output pointer and steps.
  place_output(d, o, static_cast<uint8_t*>(req->buffer), buf_w, buf_h, ox, oy);
  // 14. Picture size and progress checkpoints.
  o->image_width = static_cast<int32_t>(W);
  o->image_height = static_cast<int32_t>(H);
  d->progress_points[0] = oh + 1;
  d->progress_points[1] = 0;
  d->progress_points[2] = H / 4;
  d->progress_points[3] = H * 3 / 4;
  return d;
}

int32_t VETAJ_StartDecompression(DecoderInfo* d) {
  // Entropy decoding reads from the next unread byte onwards.
  StreamWindow* w = d->window;
  w->window += w->index;
  w->index = 0;
  if (d->converter == nullptr) {
    d->converter = vj::alloc_zeroed<ColourConverter>();
    if (d->converter == nullptr) return vj::kStatusFail;
  }
  if (d->colour_space < kColourGrey || d->colour_space > kColourYcck) return vj::kStatusFail;
  if (vj_select_converter(d) != vj::kStatusOk) return vj::kStatusFail;
  if (d->index_use_state < 2) vj_setup_component_geometry(d);
  d->total_imcu_rows = d->mcu_rows;
  if (VETAJ_InitUpsampler(d) != vj::kStatusOk) return vj::kStatusFail;
  if (VETAJ_InitDecBeforeScan(d) != vj::kStatusOk) return vj::kStatusFail;
  return vj::kStatusOk;
}

void VETAJ_SetupiMcu(DecoderInfo* d) {
  d->imcu.first_col = 0;
  d->imcu.mcu_row = 0;
  if (d->comps_in_scan != 1) {
    d->imcu.mcu_rows = 1;
    return;
  }
  const ComponentInfo* c = d->scan_components[0];
  const bool last = d->imcu_row + 1 >= d->total_imcu_rows;
  d->imcu.mcu_rows = last ? c->last_row_height : c->v_samp;
}

int32_t VETAJ_InitDecBeforeScan(DecoderInfo* d) {
  if (VETAJ_SetupScan(d) != vj::kStatusOk) return vj::kStatusFail;
  ComponentInfo* comps = d->components;
  if (comps == nullptr) return vj::kStatusFail;
  if (d->decode_mode == 1 && d->fine_quant == 0) {
    const QuantTable* q = comps[0].quant != nullptr ? comps[0].quant
                                                    : d->quant_tables[comps[0].quant_no & 3];
    if (q != nullptr) {
      for (int i = 0; i < 64; ++i)
        if (2u * q->values[i] < kDefaultLuma[i]) d->fine_quant = 1;
    }
  }
  for (uint32_t i = d->num_components; i-- > 0;) {
    ComponentInfo* c = &comps[i];
    if (c->quant == nullptr) {
      const uint32_t no = c->quant_no & 3;
      if (d->quant_tables[no] == nullptr) {
        QuantTable* q = vj::alloc_zeroed<QuantTable>();
        if (q == nullptr) return vj::kStatusFail;
        std::memcpy(q->values, i == 0 ? kDefaultLuma : kDefaultChroma, sizeof q->values);
        d->quant_tables[no] = q;
      }
      c->quant = d->quant_tables[no];
    }
    if (!build_multipliers(d, c)) return vj::kStatusFail;
  }
  if (d->fine_quant != 0 && d->entropy != nullptr) {
    for (uint32_t b = 0; b < d->blocks_in_mcu; ++b) {
      const ComponentInfo* c = d->scan_components[d->mcu_membership[b] & 3];
      if (c == nullptr) continue;
      d->entropy->block_multipliers[b] = c->multipliers;
      d->entropy->block_ratios[b] = c->quant->ratios;
    }
  }
  if (d->scan_counter == 0) {
    if (d->index_use_state == 2 && d->owner != nullptr && d->owner->decoder != nullptr) {
      d->range_limit = d->owner->decoder->range_limit;
      d->range_limit_chroma = d->owner->decoder->range_limit_chroma;
    } else {
      d->range_limit_alloc = static_cast<uint8_t*>(VETA_FakeMalloc(nullptr, kRangeLimitBytes));
      if (d->range_limit_alloc == nullptr) return vj::kStatusFail;
      d->range_limit = vj_fill_range_limit(d->range_limit_alloc);
      d->range_limit_chroma = d->range_limit;
      if (d->owner != nullptr && (d->owner->options & KOLVAVETA_OPT_CHROMA_RANGE) != 0) {
        d->range_limit_chroma_alloc =
            static_cast<uint8_t*>(VETA_FakeMalloc(nullptr, kRangeLimitBytes));
        if (d->range_limit_chroma_alloc == nullptr) return vj::kStatusFail;
        d->range_limit_chroma = vj_fill_range_limit_chroma(d->range_limit_chroma_alloc);
      }
    }
    if (d->coef_area == nullptr) {
      d->coef_area = vj::fake_alloc_zeroed<int16_t>(10 * 64);
      if (d->coef_area == nullptr) return vj::kStatusFail;
    }
    for (int b = 0; b < 10; ++b) d->imcu.blocks[b] = d->coef_area + b * 64;
  }
  ++d->scan_counter;
  // Row functions: the full-size baseline path (reduced and progressive
  // paths install theirs in their own drivers).
  d->decode_mcu = VETAJ_DecodeMcu;
  d->imcu.decode_row = nullptr;
  d->progress_row = 0;
  VETAJ_SetupiMcu(d);
  return vj::kStatusOk;
}

DecoderInfo* VETAJ_Initialize(DecInfo* o, StreamWindow* w, OutputRequest* req) {
  o->output_width = req->width;
  DecoderInfo* d = VETAJ_PreInitialize(o, w);
  if (d == nullptr) return nullptr;
  if (VETAJ_PostInitialize(o, req, d) == nullptr) {
    VETAJ_DeleteDecoderInfo(d);
    KOLVAVETA_OsFree(d);
    return nullptr;
  }
  const uint32_t ri = d->restart_interval;
  if (ri == 0 || ri == d->mcus_per_row)
    d->mcu_group_size = 16;
  else if (ri > 16)
    d->mcu_group_size = static_cast<uint32_t>(VETAJ_GetGCD(static_cast<int32_t>(ri), 16));
  else
    d->mcu_group_size = ri;
  return d;
}
