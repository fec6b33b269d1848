// Light scanners: header summary and end-of-data search.
#include "syntax/scanners.h"

#include "syntax/marker_io.h"

namespace {

using vj::kStatusFail;
using vj::kStatusOk;

// Reads a frame header into the width/height words of `result`.
bool read_frame_words(StreamWindow* w, bool sampling, uint32_t* result, vj::FrameSize* f) {
  f->width = result[kSummaryWidth];
  f->height = result[kSummaryHeight];
  const bool ok = vj::read_frame_size(w, sampling, f);
  result[kSummaryWidth] = f->width;
  result[kSummaryHeight] = f->height;
  return ok;
}

// A window on `stream` positioned at the JPEG data. False when there is no
// buffer or the stream refuses the seek.
bool open_at(StreamWindow* w, IoStream* stream, uint32_t offset) {
  if (!vj::window_open(w, stream)) return false;
  if (vj::window_seek(w, offset)) return true;
  vj::window_close(w);
  return false;
}

}  // namespace

int32_t VETAJ_SimpleParser(StreamWindow* w, int32_t mode, uint32_t result[kSummaryWords]) {
  if (!vj::scan_to_soi(w, mode)) return kStatusFail;
  bool have_frame = false;
  for (;;) {
    const int32_t code = vj::next_marker(w);
    if (code < 0) return kStatusFail;
    switch (static_cast<uint32_t>(code)) {
      case vj::kMarkerSof0:
      case vj::kMarkerSof1: {
        vj::FrameSize f;
        if (!read_frame_words(w, true, result, &f)) return kStatusFail;
        result[kSummaryMaxH] = f.max_h;
        result[kSummaryMaxV] = f.max_v;
        have_frame = true;
        break;
      }
      case vj::kMarkerSof2: {
        result[kSummaryProgressive] = 1;
        vj::FrameSize f;
        if (!read_frame_words(w, false, result, &f)) return kStatusFail;
        have_frame = true;
        break;
      }
      case vj::kMarkerDri: {
        uint32_t length = 0, interval = 0;
        if (!vj::read_be16(w, &length) || length != 4) return kStatusFail;
        if (!vj::read_be16(w, &interval)) return kStatusFail;
        result[kSummaryRestart] = interval;
        break;
      }
      case vj::kMarkerSos:
        // A scan without a frame header we can read (none, or another frame
        // type) has no summary to give.
        return have_frame ? kStatusOk : kStatusFail;
      case vj::kMarkerDht:
      case vj::kMarkerDqt:
        if (!vj::skip_segment(w)) return kStatusFail;
        break;
      default:
        if (vj::is_skippable_segment(static_cast<uint32_t>(code)) && !vj::skip_segment(w))
          return kStatusFail;
        break;
    }
  }
}

int32_t VETAJ_EOIParser(StreamWindow* w, int32_t mode, uint32_t result[3],
                        uint32_t* end_offset) {
  if (!vj::scan_to_soi(w, mode)) return kStatusFail;
  for (;;) {
    const int32_t code = vj::next_marker(w);
    if (code < 0) return kStatusFail;
    switch (static_cast<uint32_t>(code)) {
      case vj::kMarkerSof2:
        result[kSummaryProgressive] = 1;
        [[fallthrough]];
      case vj::kMarkerSof0: {
        vj::FrameSize f;
        if (!read_frame_words(w, false, result, &f)) return kStatusFail;
        break;
      }
      case vj::kMarkerDht:
      case vj::kMarkerDqt:
      case vj::kMarkerDri:
        if (!vj::skip_segment(w)) return kStatusFail;
        break;
      case vj::kMarkerEoi:
        *end_offset = vj::window_tell(w);
        return kStatusOk;
      default:
        // SOS, RSTn and stuffed bytes inside the entropy-coded data are
        // passed over by the byte scan.
        if (vj::is_skippable_segment(static_cast<uint32_t>(code)) && !vj::skip_segment(w))
          return kStatusFail;
        break;
    }
  }
}

int32_t VETAJ_GetHInfo(IoStream* stream, JpegInfo* info) {
  if (stream == nullptr || info == nullptr) return 0;
  StreamWindow w;
  if (!open_at(&w, stream, info->jpeg_offset)) return 0;
  uint32_t result[kSummaryWords] = {};
  const int32_t status = VETAJ_SimpleParser(&w, 8, result);
  vj::window_close(&w);
  if (status == kStatusFail) return 0;
  info->width = static_cast<int32_t>(result[kSummaryWidth]);
  info->height = static_cast<int32_t>(result[kSummaryHeight]);
  info->progressive = static_cast<int32_t>(result[kSummaryProgressive]);
  info->restart_interval = static_cast<int32_t>(result[kSummaryRestart]);
  info->max_h_samp = static_cast<int32_t>(result[kSummaryMaxH]);
  info->max_v_samp = static_cast<int32_t>(result[kSummaryMaxV]);
  info->reserved8 = 0;
  return 1;
}

uint32_t VETAJ_GetEOIOffset(IoStream* stream, JpegInfo* info) {
  if (stream == nullptr || info == nullptr) return 0;
  StreamWindow w;
  if (!open_at(&w, stream, info->jpeg_offset)) return 0;
  uint32_t result[3] = {};
  uint32_t end = 0;
  const int32_t status = VETAJ_EOIParser(&w, 8, result, &end);
  vj::window_close(&w);
  if (status == kStatusFail) return 0;
  info->width = static_cast<int32_t>(result[kSummaryWidth]);
  info->height = static_cast<int32_t>(result[kSummaryHeight]);
  info->progressive = static_cast<int32_t>(result[kSummaryProgressive]);
  info->reserved8 = 0;
  return end;
}
