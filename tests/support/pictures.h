// Expected output buffers for whole-image decodes: pixel colours, the
// layouts of the output formats, placement in the caller's buffer
// (centring, row length, rotation) and the resampling rules of the row
// converters, all written from their definitions.
#ifndef VETAJ_TESTS_SUPPORT_PICTURES_H
#define VETAJ_TESTS_SUPPORT_PICTURES_H

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace vjtest {

// Byte written into output buffers before a decode.
constexpr uint8_t kFill = 0xA5;

// One pixel colour: YCbCr samples (converted by the writers, kept as they
// are in planar output) or RGB values.
struct Colour {
  bool ycc = false;
  int a = 0, b = 0, c = 0;
};
struct Rgb {
  int r, g, b;
};
// YCbCr to RGB with 16-bit constants and arithmetic shifts.
Rgb rgb_of(const Colour& colour);
// RGB to YCbCr with 12-bit constants (the planar writers of RGB sources).
Colour ycc_of(const Colour& colour);

// Colour of output pixel (x, y) before rotation.
using ColourAt = std::function<Colour(int x, int y)>;

// Bytes per pixel of a packed format, 1 for the luma of planar format 2,
// 0 for format 4 (rows only counted).
int pixel_bytes(int format);
// Bytes of a buffer of width x height pixels (planar: Y plane and both
// chroma planes).
size_t buffer_bytes(int format, int width, int height);
// Stores one pixel of a packed format.
void store_pixel(int format, const Rgb& rgb, uint8_t* at);
// Reads one pixel of a packed format back (RGB565 as the 8-bit values whose
// top bits it keeps).
Colour load_pixel(int format, const uint8_t* at);

// Where a decode's output lands in the caller's buffer.
struct Placement {
  int format = 7;
  int buffer_width = 0, buffer_height = 0;  // row length and row count in pixels
  int output_width = 0, output_height = 0;  // visible size before rotation
  int left = 0, top = 0;                    // offset of the (rotated) visible box
  uint32_t rotation = 0;                    // 0, 4, 8, 12
  // The visible box centred in the buffer (fit modes 0x000, 0x300, 0x700).
  static Placement centred(int format, int buffer_width, int buffer_height, int output_width,
                           int output_height, uint32_t rotation = 0);
  // Buffer coordinates of output pixel (x, y).
  void locate(int x, int y, int* bx, int* by) const;
};

// The buffer a decode should leave: the visible pixels from `colour`, every
// other byte kFill. Planar output keeps luma for every pixel and chroma for
// the pixels at even output coordinates (unrotated) or at even buffer
// coordinates (rotated).
std::vector<uint8_t> expected_buffer(const Placement& where, const ColourAt& colour);

// Compares two buffers of a placement, naming the first differing pixel.
::testing::AssertionResult same_output(const std::vector<uint8_t>& actual,
                                       const std::vector<uint8_t>& expected,
                                       const Placement& where);

// Resampling rules of the row converters. Output index j of a destination of
// d samples over a source of s samples takes:
//   centre sampling:     floor((floor(s/2) + j*s) / d)
//   quarter-point pair:  floor((floor(s/4) + j*s) / d) and
//                        floor((floor(3s/4) + j*s) / d), averaged.
enum class Sampling { kCentre, kAverage };
// The colour of output pixel (x, y) when the source window of sw x sh
// pixels starting at (left, top) of `source` is resized to dw x dh. Averages
// are taken per channel with truncation, in the colour's own space.
ColourAt resampled(const ColourAt& source, Sampling sampling, int left, int top, int sw, int sh,
                   int dw, int dh);

// A colour function reading an unrotated decode in a packed format with
// the given row length. The buffer must outlive the function.
ColourAt colours_of(const std::vector<uint8_t>& buffer, int format, int row_length);

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_PICTURES_H
