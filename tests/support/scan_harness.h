// Test harness that parses a JPEG up to its first scan and exposes the
// decoder state, so entropy decoding can be driven MCU by MCU.
#ifndef VETAJ_TESTS_SUPPORT_SCAN_HARNESS_H
#define VETAJ_TESTS_SUPPORT_SCAN_HARNESS_H

#include <cstdint>
#include <vector>

#include "drivers/decoder.h"

namespace vjtest {

class ScanHarness {
 public:
  ScanHarness() = default;
  ~ScanHarness();
  ScanHarness(const ScanHarness&) = delete;
  ScanHarness& operator=(const ScanHarness&) = delete;

  // Parses `jpeg` (kept by reference: it must outlive the harness) up to
  // its first scan and sets the scan up. `options` goes into the object.
  bool open(const std::vector<uint8_t>& jpeg, uint32_t options = 0);
  DecoderInfo* d() { return d_; }
  // Block pointers of one MCU, contiguous (zeroed by clear_mcu).
  int16_t** blocks() { return ptrs_; }
  void clear_mcu();
  uint32_t total_mcus() const { return d_->mcus_per_row * d_->mcu_rows; }
  // Clears the blocks and sets the current MCU position (as the row drivers do).
  void at(uint32_t index) {
    clear_mcu();
    d_->current_mcu_row = index / d_->mcus_per_row;
    d_->current_mcu_col = index % d_->mcus_per_row;
  }
  // Block (row, column) of component c covered by block b of MCU `index`.
  void block_position(uint32_t index, uint32_t b, int* comp, int* row, int* col) const;

 private:
  DecInfo* obj_ = nullptr;
  DecoderInfo* d_ = nullptr;
  StreamWindow window_{};
  int16_t area_[10 * 64] = {};
  int16_t* ptrs_[10] = {};
};

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_SCAN_HARNESS_H
