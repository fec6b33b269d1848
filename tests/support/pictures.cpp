#include "support/pictures.h"

#include <algorithm>
#include <cstring>

namespace vjtest {
namespace {

int clamp255(int64_t v) { return v < 0 ? 0 : v > 255 ? 255 : int(v); }

// Stores one pixel of a packed format.
void store_pixel(int format, const Colour& rgb, uint8_t* at) {
  const int bytes = pixel_bytes(format);
  if (bytes == 2) {
    const int v = ((rgb.a >> 3) << 11) | ((rgb.b >> 2) << 5) | (rgb.c >> 3);
    at[0] = uint8_t(v);
    at[1] = uint8_t(v >> 8);
    return;
  }
  const char* order = bytes == 3 ? "RGB" : format == 5 ? "ARGB" : format == 8 ? "BGRA" : "RGBA";
  static constexpr char kLetters[] = "RGBA";
  const int value[4] = {rgb.a, rgb.b, rgb.c, 255};
  for (int i = 0; i < bytes; ++i)
    at[i] = uint8_t(value[std::strchr(kLetters, order[i]) - kLetters]);
}

Colour rgb_of(const Colour& c) {
  if (!c.ycc) return c;
  const int64_t cb = c.b - 128, cr = c.c - 128;
  return {false, clamp255(c.a + ((91881 * cr) >> 16)),
          clamp255(c.a + ((-22554 * cb - 46802 * cr) >> 16)),
          clamp255(c.a + ((116130 * cb) >> 16))};
}

Colour ycc_of(const Colour& c) {
  if (c.ycc) return c;
  const int r = c.a, g = c.b, b = c.c;
  return {true, (1225 * r + 2404 * g + 467 * b) >> 12,
          ((-691 * r - 1357 * g + 2048 * b) >> 12) + 128,
          ((2048 * r - 1715 * g - 333 * b) >> 12) + 128};
}

Colour cmyk_colour(int c, int m, int y, int k) {
  return {false, c * k / 255, m * k / 255, y * k / 255};
}

Colour ycck_colour(int y, int cb, int cr, int k) {
  // The 128 offsets of the chroma are folded into the constants.
  const int64_t Y = y, K = k;
  return {false, int(K * clamp255(433 - Y - ((91881 * int64_t(cr)) >> 16)) >> 8),
          int(K * clamp255(120 - Y - ((-22554 * int64_t(cb) - 46802 * int64_t(cr)) >> 16)) >> 8),
          int(K * clamp255(481 - Y - ((116130 * int64_t(cb)) >> 16)) >> 8)};
}

}  // namespace

Colour colour_in(int space, const int* v) {
  if (space == 1) return {false, v[0], v[0], v[0]};
  if (space <= 3) return {space == 3, v[0], v[1], v[2]};
  return (space == 4 ? cmyk_colour : ycck_colour)(v[0], v[1], v[2], v[3]);
}

int pixel_bytes(int format) {
  constexpr int kBytes[13] = {2, 3, 1, 3, 0, 4, 3, 4, 4, 2, 2, 3, 4};
  return format >= 0 && format < 13 ? kBytes[format] : 0;
}

size_t buffer_bytes(int format, int width, int height) {
  const size_t w = size_t(width), h = size_t(height);
  if (format == 2) return w * h + 2 * ((w + 1) / 2) * ((h + 1) / 2);
  return w * h * size_t(pixel_bytes(format));
}

Placement Placement::centred(int format, int buffer_width, int buffer_height, int output_width,
                             int output_height, uint32_t rotation) {
  const bool quarter = rotation == 4 || rotation == 12;
  const int box_w = quarter ? output_height : output_width;
  const int box_h = quarter ? output_width : output_height;
  Placement p{format, buffer_width, buffer_height, output_width, output_height, 0, 0, rotation};
  p.left = std::max(0, (buffer_width - box_w) / 2);
  p.top = std::max(0, (buffer_height - box_h) / 2);
  return p;
}

void Placement::locate(int x, int y, int* bx, int* by) const {
  const int w = output_width, h = output_height;
  const int turned[4][2] = {{x, y}, {h - 1 - y, x}, {w - 1 - x, h - 1 - y}, {y, w - 1 - x}};
  *bx = left + turned[rotation / 4 % 4][0];
  *by = top + turned[rotation / 4 % 4][1];
}

std::vector<uint8_t> expected_buffer(const Placement& p, const ColourAt& colour) {
  std::vector<uint8_t> out(buffer_bytes(p.format, p.buffer_width, p.buffer_height), kFill);
  const int bpp = pixel_bytes(p.format);
  if (bpp == 0) return out;
  const size_t bw = size_t(p.buffer_width);
  const size_t cs = (bw + 1) / 2, crows = (size_t(p.buffer_height) + 1) / 2;
  uint8_t* u = out.data() + bw * size_t(p.buffer_height);
  uint8_t* v = u + cs * crows;
  for (int y = 0; y < p.output_height; ++y) {
    for (int x = 0; x < p.output_width; ++x) {
      int bx = 0, by = 0;
      p.locate(x, y, &bx, &by);
      const size_t at = size_t(by) * bw + size_t(bx);
      if (p.format != 2) {
        store_pixel(p.format, rgb_of(colour(x, y)), &out[at * size_t(bpp)]);
        continue;
      }
      const Colour yuv = ycc_of(colour(x, y));
      out[at] = uint8_t(yuv.a);
      size_t chroma = SIZE_MAX;
      if (p.rotation == 0 && x % 2 == 0 && y % 2 == 0)
        chroma = (size_t(p.top / 2) + size_t(y / 2)) * cs + size_t(p.left / 2) + size_t(x / 2);
      if (p.rotation != 0 && bx % 2 == 0 && by % 2 == 0)
        chroma = size_t(by / 2) * cs + size_t(bx / 2);
      if (chroma != SIZE_MAX) {
        u[chroma] = uint8_t(yuv.b);
        v[chroma] = uint8_t(yuv.c);
      }
    }
  }
  return out;
}

bool all_fill(const std::vector<uint8_t>& bytes) {
  return std::all_of(bytes.begin(), bytes.end(), [](uint8_t b) { return b == kFill; });
}

::testing::AssertionResult same_output(const std::vector<uint8_t>& actual,
                                       const std::vector<uint8_t>& expected) {
  if (actual.size() != expected.size())
    return ::testing::AssertionFailure()
           << "buffer of " << actual.size() << " bytes, expected " << expected.size();
  const auto [differs, _] = std::mismatch(actual.begin(), actual.end(), expected.begin());
  if (differs == actual.end()) return ::testing::AssertionSuccess();
  const size_t first = size_t(differs - actual.begin());
  size_t diffs = 0;
  for (size_t i = first; i < actual.size(); ++i) diffs += actual[i] != expected[i];
  return ::testing::AssertionFailure()
         << diffs << " bytes differ; first at byte " << first << ": " << int(actual[first])
         << " instead of " << int(expected[first]);
}

ColourAt resampled(const ColourAt& source, Sampling sampling, int left, int top, int sw, int sh,
                   int dw, int dh) {
  // floor((offset + j * s) / d)
  auto pick = [](int j, int offset, int s, int d) {
    return int((int64_t(offset) + int64_t(j) * s) / d);
  };
  if (sampling == Sampling::kCentre) {
    return [=](int x, int y) {
      return source(left + pick(x, sw / 2, sw, dw), top + pick(y, sh / 2, sh, dh));
    };
  }
  return [=](int x, int y) {
    const int xs[2] = {pick(x, sw / 4, sw, dw), pick(x, int(int64_t(sw) * 3 / 4), sw, dw)};
    const int ys[2] = {pick(y, sh / 4, sh, dh), pick(y, int(int64_t(sh) * 3 / 4), sh, dh)};
    Colour sum;
    for (const int yy : ys) {
      for (const int xx : xs) {
        const Colour c = source(left + xx, top + yy);
        sum = {c.ycc, sum.a + c.a, sum.b + c.b, sum.c + c.c};
      }
    }
    return Colour{sum.ycc, sum.a / 4, sum.b / 4, sum.c / 4};
  };
}

}  // namespace vjtest
