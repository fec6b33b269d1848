// Light scanners: header summary and end-of-data search.
#include "syntax/scanners.h"

#include "syntax/marker_io.h"

namespace {

using vj::Step;

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
  bool have_frame = false;
  return vj::walk_markers(w, mode, [&](uint32_t code) {
    switch (code) {
      case vj::kMarkerSof0:
      case vj::kMarkerSof1: {
        vj::FrameSize f;
        f.width = result[kSummaryWidth];
        f.height = result[kSummaryHeight];
        const bool ok = vj::read_frame_size(w, true, &f);
        result[kSummaryWidth] = f.width;
        result[kSummaryHeight] = f.height;
        if (!ok) return Step::kFail;
        result[kSummaryMaxH] = f.max_h;
        result[kSummaryMaxV] = f.max_v;
        have_frame = true;
        return Step::kNext;
      }
      case vj::kMarkerSof2:
        result[kSummaryProgressive] = 1;
        have_frame = true;
        return vj::read_frame_size_into(w, &result[kSummaryWidth], &result[kSummaryHeight])
                   ? Step::kNext
                   : Step::kFail;
      case vj::kMarkerDri: {
        uint32_t length = 0, interval = 0;
        if (!vj::read_be16(w, &length) || length != 4 || !vj::read_be16(w, &interval))
          return Step::kFail;
        result[kSummaryRestart] = interval;
        return Step::kNext;
      }
      case vj::kMarkerSos:
        // A scan without a frame header we can read (none, or another frame
        // type) has no summary to give.
        return have_frame ? Step::kDone : Step::kFail;
      default:
        return Step::kPass;
    }
  });
}

int32_t VETAJ_EOIParser(StreamWindow* w, int32_t mode, uint32_t result[3],
                        uint32_t* end_offset) {
  return vj::walk_markers(w, mode, [&](uint32_t code) {
    switch (code) {
      case vj::kMarkerSof2:
        result[kSummaryProgressive] = 1;
        [[fallthrough]];
      case vj::kMarkerSof0:
        return vj::read_frame_size_into(w, &result[kSummaryWidth], &result[kSummaryHeight])
                   ? Step::kNext
                   : Step::kFail;
      case vj::kMarkerEoi:
        *end_offset = vj::window_tell(w);
        return Step::kDone;
      default:
        // SOS, RSTn and stuffed bytes inside the entropy-coded data carry no
        // segment: the byte scan goes on through the data.
        return Step::kPass;
    }
  });
}

int32_t VETAJ_GetHInfo(IoStream* stream, JpegInfo* info) {
  if (stream == nullptr || info == nullptr) return 0;
  StreamWindow w;
  if (!open_at(&w, stream, info->jpeg_offset)) return 0;
  uint32_t result[kSummaryWords] = {};
  const int32_t status = VETAJ_SimpleParser(&w, 8, result);
  vj::window_close(&w);
  if (status != vj::kStatusOk) return 0;
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
  if (status != vj::kStatusOk) return 0;
  info->width = static_cast<int32_t>(result[kSummaryWidth]);
  info->height = static_cast<int32_t>(result[kSummaryHeight]);
  info->progressive = static_cast<int32_t>(result[kSummaryProgressive]);
  info->reserved8 = 0;
  return end;
}
