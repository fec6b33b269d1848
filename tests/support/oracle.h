// Reference decoding with libjpeg, used as the oracle of the decoding tests.
//
// Every function starts at the first SOI (FF D8 FF) in the buffer, so files
// with leading bytes and JPEG streams embedded in TIFF containers decode
// too. A stream that libjpeg refuses makes the function return false; no
// message is printed and the process is not ended.
#ifndef VETAJ_TESTS_SUPPORT_ORACLE_H
#define VETAJ_TESTS_SUPPORT_ORACLE_H

#if VETAJ_HAVE_LIBJPEG

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace vjtest {

struct OracleHeader {
  int width = 0, height = 0, num_components = 0;
  int progressive = 0;       // 1 for SOF2
  int restart_interval = 0;  // in MCUs
  int max_h = 0, max_v = 0;  // largest sampling factors
  int jpeg_color_space = 0;  // libjpeg's J_COLOR_SPACE as int
};
// Frame and marker summary up to the first scan.
bool oracle_header(const std::vector<uint8_t>& jpeg, OracleHeader* out);

struct OracleComponent {
  int width_in_blocks = 0, height_in_blocks = 0;  // ceil(comp size / 8) as libjpeg computes
  int stride_blocks = 0, rows_blocks = 0;          // dimensions of `blocks` (padded to whole MCUs)
  uint16_t quant[64] = {};                         // quantisation values, natural order
  std::vector<int16_t> blocks;                     // quantised coefficients, natural order
  const int16_t* block(int row, int col) const { return blocks.data() + (size_t(row) * stride_blocks + col) * 64; }
};
// Exact quantised coefficients (jpeg_read_coefficients). The padding blocks
// beyond width_in_blocks/height_in_blocks hold what interleaved scans coded
// for the MCU padding, and zero where nothing was coded.
bool oracle_coefficients(const std::vector<uint8_t>& jpeg, std::vector<OracleComponent>* out);

struct OraclePlanes {
  int width = 0, height = 0, components = 0;
  std::vector<uint8_t> data;  // interleaved samples, row-major, width*height*components
  uint8_t at(int x, int y, int c) const { return data[(size_t(y) * width + x) * components + c]; }
};
// Full decode with the accurate integer transform (JDCT_ISLOW), box upsampling
// (do_fancy_upsampling = FALSE), no colour conversion, at scale 1/scale_denom
// (scale_num = 1). Block smoothing of progressive files is off. At reduced
// scales libjpeg widens the transform of subsampled components instead of
// replicating their samples (at 1/8, a 4:2:0 chroma block becomes 2x2 samples).
bool oracle_planes(const std::vector<uint8_t>& jpeg, int scale_denom, OraclePlanes* out);
// Decodes the stream after zeroing every coefficient past zig-zag index
// `keep` (the coefficients are rewritten losslessly as a sequential stream
// first), as oracle_planes does.
bool oracle_truncated_planes(const std::vector<uint8_t>& jpeg, int keep, int scale_denom,
                             OraclePlanes* out);
// Rewrites the stream losslessly as a sequential frame with one scan per
// component.
bool oracle_sequential_scans(const std::vector<uint8_t>& jpeg, std::vector<uint8_t>* out);

// The JPEG fixtures (not bad_*) whose name and header pass `keep`.
std::vector<std::string> fixtures_where(
    const std::function<bool(const std::string& name, const OracleHeader& header)>& keep);

// The first width x height bytes of `buffer` (the luma plane of a planar
// output) equal component 0 of `ref`.
::testing::AssertionResult same_luma(const std::vector<uint8_t>& buffer, int width, int height,
                                     const OraclePlanes& ref);

}  // namespace vjtest

#endif  // VETAJ_HAVE_LIBJPEG

#endif  // VETAJ_TESTS_SUPPORT_ORACLE_H
