// The whole-image decode.
#include "drivers/decode.h"

#include <cstring>

#include "drivers/progressive.h"
#include "drivers/scaled.h"
#include "entropy/mcu.h"
#include "meta/exif.h"
#include "recon/colour.h"
#include "recon/idct.h"
#include "recon/upsample.h"

namespace vj {
void set_wraparound_lists(DecoderInfo* d);
uint32_t set_bottom_lists(DecoderInfo* d, uint32_t which);
}  // namespace vj


namespace {

constexpr uint32_t kGroups = 8;  // row groups of one iMCU row

enum ContextState : uint32_t { kPrepare = 0, kProcess = 1, kPostponed = 2 };

// Rows of the decoded (reduced) picture handed to the converters so far.
uint32_t rows_consumed(const DecoderInfo* d) {
  return d->reduced_height - d->upsampler->rows_to_go;
}

}  // namespace

void vj_release_decoder(DecoderInfo*& d) {
  if (d == nullptr) return;
  VETAJ_DeleteDecoderInfo(d);
  KOLVAVETA_OsFree(d);
  d = nullptr;
}

int32_t VETAJ_ProcessData(DecoderInfo* d, uint8_t* output, uint32_t* row_ctr,
                          uint32_t rows_avail) {
  RowController& ctl = d->controller;
  int32_t status;
  if (!vj_refill_rows(d, ctl.which_set, true, &status)) return status;
  switch (ctl.context_state) {
    case kPostponed:
      VETAJ_SetupUpsample(d, output, row_ctr, rows_avail);
      if (ctl.group_counter < ctl.groups_available) return 0;
      ctl.context_state = kPrepare;
      if (*row_ctr >= rows_avail) return 0;
      [[fallthrough]];
    case kPrepare:
      ctl.group_counter = 0;
      ctl.groups_available = kGroups - 1;
      if (ctl.imcu_rows_done == d->total_imcu_rows)
        ctl.groups_available = vj::set_bottom_lists(d, ctl.which_set);
      ctl.context_state = kProcess;
      [[fallthrough]];
    case kProcess:
    default:
      VETAJ_SetupUpsample(d, output, row_ctr, rows_avail);
      if (ctl.group_counter < ctl.groups_available) return 0;
      if (ctl.imcu_rows_done == 1) vj::set_wraparound_lists(d);
      ctl.which_set ^= 1;
      ctl.buffer_full = 0;
      ctl.group_counter = kGroups + 1;
      ctl.groups_available = kGroups + 2;
      ctl.context_state = kPostponed;
      break;
  }
  return status;
}

namespace {

using RowStep = int32_t (*)(DecoderInfo*, uint8_t*, uint32_t*, uint32_t);

// Consumes the rows above the crop window: decoded, not stored.
int32_t skip_crop_rows(DecInfo* o, DecoderInfo* d, RowStep step) {
  const int32_t row_step = d->row_step;
  d->row_step = 0;
  d->skip_output = 1;
  int32_t status = 0;
  while (rows_consumed(d) < static_cast<uint32_t>(d->crop_y)) {
    if (o->cancel != 0) {
      status = vj::kStatusCancelled;
      break;
    }
    uint32_t rows = 0;
    status = step(d, nullptr, &rows, 1);
    if (status == vj::kStatusFail) break;
  }
  d->skip_output = 0;
  d->row_step = row_step;
  return status;
}

// Rows until the cropped picture is complete, or `limit` rows are out.
int32_t run_rows(DecInfo* o, DecoderInfo* d, RowStep step, uint32_t limit = UINT32_MAX) {
  const uint32_t end = static_cast<uint32_t>(d->crop_y + d->cropped_reduced_height);
  uint32_t counter = rows_consumed(d);
  int32_t status = 0;
  while (counter < end) {
    if (o->cancel != 0) return vj::kStatusCancelled;
    uint32_t rows = 0;
    status = step(d, nullptr, &rows, 1);
    counter += rows;
    if (status == vj::kStatusFail || status == vj::kStatusEnd || counter >= limit) break;
  }
  return status;
}

}  // namespace

int32_t VETAJ_Decode_Dualcore_1to1(DecInfo* o, OutputRequest* /*request*/, DecoderInfo* d,
                                   uint32_t image_height) {
  return run_rows(o, d, VETAJ_ProcessData, image_height);
}

int32_t VETAJ_DecodeImage(DecInfo* o, StreamWindow* w, OutputRequest* req) {
  DecoderInfo* d = VETAJ_Initialize(o, w, req);
  if (d == nullptr) {
    vj::set_error(KOLVAVETA_ERR_SETUP);
    return vj::kStatusFail;
  }
  auto release = vj::on_exit([&] { vj_release_decoder(d); });
  if (d->output_width == 0 || d->output_height == 0) return vj::kStatusOk;
  if (d->comps_in_scan == 0) {
    vj::set_error(KOLVAVETA_ERR_SETUP);
    return vj::kStatusFail;
  }
  const bool walk = vj_needs_scan_walk(d);
  if (walk) {
    // At 1/8 a progressive frame needs only the DC values of its first scan;
    // otherwise every scan is recorded and resumed row by row.
    const bool dc_only = d->scale_shift == 3 && vj_prepare_dc_only(d);
    if (!dc_only && vj_walk_scans(d) != vj::kStatusOk) return vj::kStatusFail;
  }
  const RowStep step = d->scale_shift == 0 ? VETAJ_ProcessData : VETAJ_ProcessData_resize;
  int32_t status = skip_crop_rows(o, d, step);
  if (status == vj::kStatusFail || status == vj::kStatusCancelled) return status;
  status = !walk && d->scale_shift == 0 ? VETAJ_Decode_Dualcore_1to1(o, req, d, d->reduced_height)
                                        : run_rows(o, d, step);
  if (status == vj::kStatusCancelled) return status;
  return status == vj::kStatusFail ? vj::kStatusFail : vj::kStatusOk;
}

int32_t VETAJ_DecodeFrame(DecInfo* o, StreamWindow* w, void* buffer, int32_t width,
                          int32_t height) {
  OutputRequest req{0, 0, buffer, width, height};
  return VETAJ_DecodeImage(o, w, &req) == vj::kStatusOk ? 1 : 0;
}

namespace {

// Rotates `count` planes... one plane of w x h pixels of bpp bytes.
bool rotate_plane(uint8_t* data, uint32_t w, uint32_t h, uint32_t bpp, bool clockwise) {
  const uint32_t bytes = w * h * bpp;
  if (bytes == 0) return true;
  uint8_t* tmp = static_cast<uint8_t*>(KOLVAVETA_OsMalloc(bytes));
  if (tmp == nullptr) return false;
  std::memcpy(tmp, data, bytes);
  for (uint32_t y = 0; y < h; ++y) {
    for (uint32_t x = 0; x < w; ++x) {
      // Clockwise: (x, y) -> (h - 1 - y, x); counter-clockwise: (y, w - 1 - x).
      const uint32_t nx = clockwise ? h - 1 - y : y;
      const uint32_t ny = clockwise ? x : w - 1 - x;
      std::memcpy(data + (size_t(ny) * h + nx) * bpp, tmp + (size_t(y) * w + x) * bpp, bpp);
    }
  }
  KOLVAVETA_OsFree(tmp);
  return true;
}

int32_t rotate_image(void* buffer, int32_t width, int32_t height, int32_t format, bool cw) {
  if (buffer == nullptr || width <= 0 || height <= 0) return 0;
  uint8_t* p = static_cast<uint8_t*>(buffer);
  const uint32_t w = static_cast<uint32_t>(width), h = static_cast<uint32_t>(height);
  if (format == KOLVAVETA_FMT_YUV420) {
    // Each plane turns on its own; odd sizes keep their rounded-up chroma.
    const uint32_t cw2 = (w + 1) / 2, ch2 = (h + 1) / 2;
    uint8_t* u = p + size_t(w) * h;
    uint8_t* v = u + size_t(cw2) * ch2;
    return rotate_plane(p, w, h, 1, cw) && rotate_plane(u, cw2, ch2, 1, cw) &&
                   rotate_plane(v, cw2, ch2, 1, cw)
               ? 1
               : 0;
  }
  const int32_t bpp = vj_bytes_per_pixel(format);
  if (bpp <= 0) return format == KOLVAVETA_FMT_NONE ? 1 : 0;
  return rotate_plane(p, w, h, static_cast<uint32_t>(bpp), cw) ? 1 : 0;
}

// Moves the window to an absolute input position: inside the window when
// the bytes are there, otherwise by seeking. False when the seek is refused.
bool move_window(StreamWindow* w, uint32_t position) {
  const uint32_t start = w->consumed - (w->index + w->remaining);
  if (position >= start && position < w->consumed) {
    const uint32_t to = position - start;
    w->remaining = w->index + w->remaining - to;
    w->index = to;
    return true;
  }
  return vj::window_seek(w, position);
}

// Moves the window to where the JPEG data begins. A caller's stream that
// cannot seek back reports another position: that counts as refused.
bool seek_to_jpeg(StreamWindow* w, const DecInfo* o) {
  return vj::window_seek(w, o->jpeg_offset) && w->consumed == o->jpeg_offset;
}

// Rotation bits for an Exif orientation value.
uint32_t rotation_for_orientation(int32_t orientation) {
  switch (orientation) {
    case 6: return KOLVAVETA_OPT_ROTATE_90;
    case 8: return KOLVAVETA_OPT_ROTATE_270;
    case 3: return KOLVAVETA_OPT_ROTATE_180;
    default: return 0;
  }
}

}  // namespace

int32_t VETAJ_RotateImage90(void* buffer, int32_t width, int32_t height, int32_t format) {
  return rotate_image(buffer, width, height, format, true);
}

int32_t VETAJ_RotateImage270(void* buffer, int32_t width, int32_t height, int32_t format) {
  return rotate_image(buffer, width, height, format, false);
}

extern "C" VETAJ_API int32_t KOLVAVETA_DecodeJPEG(DecInfo* o, void* buffer, int32_t width,
                                                  int32_t height) {
  vj::set_error(KOLVAVETA_ERR_NONE);
  if (o == nullptr || o->stream == nullptr) return 0;
  if ((o->options & KOLVAVETA_OPT_REGION_MAP) != 0) return 0;  // needs a region map
  if (width <= 0 || height <= 0 || buffer == nullptr) return 0;
  StreamWindow window;
  if (!vj::window_open(&window, o->stream)) return 0;
  auto close = vj::on_exit([&] { vj::window_close(&window); });
  if (!seek_to_jpeg(&window, o)) return 0;

  if ((o->options & KOLVAVETA_OPT_EXIF_ORIENT) != 0) {
    if (ExifInfo* exif = VETAJ_CreatExifInfo(o)) {
      o->options |= rotation_for_orientation(static_cast<int32_t>(exif->orientation));
      VETAJ_DestroyExifInfo(exif);
    }
    if (!seek_to_jpeg(&window, o)) return 0;
  }

  const uint32_t policy = o->options & KOLVAVETA_OPT_THUMB_MASK;
  FileHeaderInfo header{};
  int32_t head_w = 0, head_h = 0;
  bool use_thumb = false;
  int32_t target_w = 0, target_h = 0;
  if (policy != KOLVAVETA_OPT_THUMB_NEVER) {
    if (VETAJ_ParseFileHeader(&window, 8, &header) != vj::kStatusOk) return 0;
    const ThumbnailInfo& t = header.thumbnail;
    const bool located = t.present != 0 && t.offset != 0 &&
                         uint64_t(t.offset) + t.length < window.size;
    // A sample size divides the main picture, whose size the header has just
    // given: the object's image size may be missing (no summary) or hold the
    // target of an earlier thumbnail decode.
    const uint32_t s = o->sample_size;
    const int32_t sampled_w = s != 0 ? static_cast<int32_t>(uint32_t(header.width) / s) : 0;
    const int32_t sampled_h = s != 0 ? static_cast<int32_t>(uint32_t(header.height) / s) : 0;
    if (policy == KOLVAVETA_OPT_THUMB_ALWAYS) {
      if (located && (t.format == kThumbJpeg || t.format == kThumbJpegResource)) {
        use_thumb = true;
        target_w = t.width;
        target_h = t.height;
        if (s != 0) {
          target_w = sampled_w;
          target_h = sampled_h;
          o->sample_size = 1;
        }
      }
    } else {
      head_w = header.width;
      head_h = header.height;
      if (located && t.format == kThumbJpeg) {
        FileHeaderInfo thumb{};
        if (move_window(&window, t.offset) &&
            VETAJ_ParseFileHeader(&window, 8, &thumb) == vj::kStatusOk && thumb.width > 0 &&
            thumb.height > 0) {
          if (s == 0) {
            if (thumb.width >= width && thumb.height >= height) {
              use_thumb = true;
              target_w = thumb.width;
              target_h = thumb.height;
            }
          } else if (thumb.width >= sampled_w && thumb.height >= sampled_h) {
            use_thumb = true;
            target_w = sampled_w;
            target_h = sampled_h;
            o->sample_size = 1;
          }
        }
      } else if (located && t.format == kThumbJpegResource) {
        if (t.width > width && t.height > height) {
          use_thumb = true;
          target_w = t.width;
          target_h = t.height;
        }
      }
    }
  }
  if (o->region_mode != 0) use_thumb = false;

  if (use_thumb) {
    const ThumbnailInfo& t = header.thumbnail;
    vj::window_empty(&window);
    if (!vj::window_seek(&window, t.offset)) return 0;
    o->decode_mode = KOLVAVETA_MODE_THUMBNAIL;
    o->image_width = target_w;
    o->image_height = target_h;
    if (policy == KOLVAVETA_OPT_THUMB_ORIENTED) {
      const bool main_portrait = header.width < header.height;
      const bool transpose = main_portrait ? target_h < target_w : target_w < target_h;
      if (transpose) {
        const int32_t ok = VETAJ_DecodeFrame(o, &window, buffer, height, width);
        o->decode_mode = 0;
        return ok != 0 ? VETAJ_RotateImage90(buffer, height, width, o->output_format) : 0;
      }
      const int32_t ok = VETAJ_DecodeFrame(o, &window, buffer, width, height);
      o->decode_mode = 0;
      return ok;
    }
    const int32_t ok = VETAJ_DecodeFrame(o, &window, buffer, width, height);
    o->decode_mode = 0;
    if (ok != 0) return ok;
    // The thumbnail failed: decode the main picture instead. The error word
    // describes the outcome of this call, not of the abandoned attempt.
    vj::set_error(KOLVAVETA_ERR_NONE);
    head_w = header.width;
    head_h = header.height;
  }
  if (!seek_to_jpeg(&window, o)) return 0;
  o->image_width = head_w;
  o->image_height = head_h;
  if (head_w < 1024 || head_h < 1024) o->decode_mode = 0;
  return VETAJ_DecodeFrame(o, &window, buffer, width, height);
}
