#include "support/scan_harness.h"

#include <cstring>

#include "syntax/scan_setup.h"

namespace vjtest {

ScanHarness::~ScanHarness() {
  if (d_ != nullptr) {
    VETAJ_DeleteDecoderInfo(d_);
    KOLVAVETA_OsFree(d_);
  }
  vj::window_close(&window_);
  if (obj_ != nullptr) KOLVAVETA_DestroyDecInfo(obj_);
}

bool ScanHarness::open(const std::vector<uint8_t>& jpeg, uint32_t options) {
  obj_ = KOLVAVETA_CreateDecInfo(1, const_cast<uint8_t*>(jpeg.data()),
                                 static_cast<uint32_t>(jpeg.size()), 7, options);
  if (obj_ == nullptr || !vj::window_open(&window_, obj_->stream)) return false;
  d_ = vj::alloc_zeroed<DecoderInfo>();
  d_->marker = vj::fake_alloc_zeroed<MarkerState>();
  d_->marker->adobe_transform = 1;
  d_->window = &window_;
  d_->stream = obj_->stream;
  d_->window_buffer = window_.buffer;
  d_->owner = obj_;
  d_->scale_num = 1;
  d_->region_map_flag = options & KOLVAVETA_OPT_REGION_MAP;
  int32_t status = vj::kStatusOk;
  while (VETAJ_ParseNextMarker(d_, &status) != 0xDA)
    if (status != vj::kStatusOk) return false;
  if (status != vj::kStatusOk) return false;
  vj_setup_component_geometry(d_);
  if (VETAJ_SetupScan(d_) != vj::kStatusOk) return false;
  // Entropy decoding reads from window + index.
  window_.window += window_.index;
  window_.index = 0;
  for (int i = 0; i < 10; ++i) ptrs_[i] = area_ + i * 64;
  return true;
}

void ScanHarness::clear_mcu() { std::memset(area_, 0, sizeof area_); }

void ScanHarness::block_position(uint32_t index, uint32_t b, int* comp, int* row,
                                 int* col) const {
  const uint32_t mrow = index / d_->mcus_per_row, mcol = index % d_->mcus_per_row;
  for (uint32_t p = 0, first = 0; p < d_->comps_in_scan; ++p) {
    const ComponentInfo* c = d_->scan_components[p];
    // A scan of one component has one block per MCU.
    const uint32_t w = d_->comps_in_scan == 1 ? 1 : c->mcu_width;
    const uint32_t h = d_->comps_in_scan == 1 ? 1 : c->mcu_height;
    if (b < first + w * h) {
      *comp = c->index;
      *row = static_cast<int>(mrow * h + (b - first) / w);
      *col = static_cast<int>(mcol * w + (b - first) % w);
      return;
    }
    first += w * h;
  }
}

}  // namespace vjtest
