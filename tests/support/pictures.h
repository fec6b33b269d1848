// Expected output buffers: pixel colours from the colour equations, the
// layouts of the output formats, placement in the caller's buffer (centring,
// row length, rotation) and the resampling rules of the row converters, all
// written from their definitions.
#ifndef VETAJ_TESTS_SUPPORT_PICTURES_H
#define VETAJ_TESTS_SUPPORT_PICTURES_H

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <functional>
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
// The colour of a pixel from its component samples under a colour space
// (1 grey, 2 RGB, 3 YCbCr, 4 CMYK not inverted, 5 YCCK). Writers convert
// YCbCr with 16-bit constants and arithmetic shifts, RGB to YCbCr (planar
// output of other spaces) with 12-bit constants; CMYK is each channel times
// K / 255, YCCK the inverted YCbCr equations times K / 256.
Colour colour_in(int space, const int* samples);

// Colour of output pixel (x, y) before rotation.
using ColourAt = std::function<Colour(int x, int y)>;

// Bytes per pixel of a packed format, 1 for the luma of planar format 2,
// 0 for format 4 (rows only counted).
int pixel_bytes(int format);
// Bytes of a buffer of width x height pixels (planar: Y plane and both
// chroma planes).
size_t buffer_bytes(int format, int width, int height);

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

// Every byte still holds kFill.
bool all_fill(const std::vector<uint8_t>& bytes);

// Compares two buffers, naming the first differing byte.
::testing::AssertionResult same_output(const std::vector<uint8_t>& actual,
                                       const std::vector<uint8_t>& expected);

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

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_PICTURES_H
