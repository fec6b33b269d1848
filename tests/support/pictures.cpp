#include "support/pictures.h"

#include <algorithm>

namespace vjtest {
namespace {

int clamp255(int64_t v) { return v < 0 ? 0 : v > 255 ? 255 : int(v); }

// Bytes per pixel by format code (planar: its luma byte).
constexpr int kPixelBytes[13] = {2, 3, 1, 3, 0, 4, 3, 4, 4, 2, 2, 3, 4};

// Memory order of the four-byte formats: 'R', 'G', 'B' or 'A' per byte.
const char* quad_order(int format) {
  switch (format) {
    case 5:
      return "ARGB";
    case 8:
      return "BGRA";
    default:
      return "RGBA";
  }
}

}  // namespace

Rgb rgb_of(const Colour& c) {
  if (!c.ycc) return {c.a, c.b, c.c};
  const int64_t cb = c.b - 128, cr = c.c - 128;
  return {clamp255(c.a + ((91881 * cr) >> 16)), clamp255(c.a + ((-22554 * cb - 46802 * cr) >> 16)),
          clamp255(c.a + ((116130 * cb) >> 16))};
}

Colour ycc_of(const Colour& c) {
  if (c.ycc) return c;
  const int r = c.a, g = c.b, b = c.c;
  return {true, (1225 * r + 2404 * g + 467 * b) >> 12,
          ((-691 * r - 1357 * g + 2048 * b) >> 12) + 128,
          ((2048 * r - 1715 * g - 333 * b) >> 12) + 128};
}

int pixel_bytes(int format) { return format >= 0 && format < 13 ? kPixelBytes[format] : 0; }

size_t buffer_bytes(int format, int width, int height) {
  const size_t w = size_t(width), h = size_t(height);
  if (format == 2) return w * h + 2 * ((w + 1) / 2) * ((h + 1) / 2);
  return w * h * size_t(pixel_bytes(format));
}

void store_pixel(int format, const Rgb& c, uint8_t* at) {
  switch (pixel_bytes(format)) {
    case 2: {
      const int v = ((c.r >> 3) << 11) | ((c.g >> 2) << 5) | (c.b >> 3);
      at[0] = uint8_t(v);
      at[1] = uint8_t(v >> 8);
      return;
    }
    case 3:
      at[0] = uint8_t(c.r);
      at[1] = uint8_t(c.g);
      at[2] = uint8_t(c.b);
      return;
    case 4: {
      const char* order = quad_order(format);
      for (int i = 0; i < 4; ++i)
        at[i] = uint8_t(order[i] == 'R'   ? c.r
                        : order[i] == 'G' ? c.g
                        : order[i] == 'B' ? c.b
                                          : 255);
      return;
    }
    default:
      return;
  }
}

Colour load_pixel(int format, const uint8_t* at) {
  switch (pixel_bytes(format)) {
    case 2: {
      const int v = at[0] | (at[1] << 8);
      return {false, (v >> 11) << 3, ((v >> 5) & 63) << 2, (v & 31) << 3};
    }
    case 3:
      return {false, at[0], at[1], at[2]};
    case 4: {
      const char* order = quad_order(format);
      int rgb[3] = {};
      for (int i = 0; i < 4; ++i) {
        if (order[i] == 'R') rgb[0] = at[i];
        if (order[i] == 'G') rgb[1] = at[i];
        if (order[i] == 'B') rgb[2] = at[i];
      }
      return {false, rgb[0], rgb[1], rgb[2]};
    }
    default:
      return {};
  }
}

Placement Placement::centred(int format, int buffer_width, int buffer_height, int output_width,
                             int output_height, uint32_t rotation) {
  const bool quarter = rotation == 4 || rotation == 12;
  const int box_w = quarter ? output_height : output_width;
  const int box_h = quarter ? output_width : output_height;
  Placement p;
  p.format = format;
  p.buffer_width = buffer_width;
  p.buffer_height = buffer_height;
  p.output_width = output_width;
  p.output_height = output_height;
  p.left = std::max(0, (buffer_width - box_w) / 2);
  p.top = std::max(0, (buffer_height - box_h) / 2);
  p.rotation = rotation;
  return p;
}

void Placement::locate(int x, int y, int* bx, int* by) const {
  switch (rotation) {
    case 4:  // 90 degrees clockwise
      *bx = left + output_height - 1 - y;
      *by = top + x;
      return;
    case 8:
      *bx = left + output_width - 1 - x;
      *by = top + output_height - 1 - y;
      return;
    case 12:  // 270 degrees clockwise
      *bx = left + y;
      *by = top + output_width - 1 - x;
      return;
    default:
      *bx = left + x;
      *by = top + y;
      return;
  }
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
      const Colour c = colour(x, y);
      const size_t at = size_t(by) * bw + size_t(bx);
      if (p.format != 2) {
        store_pixel(p.format, rgb_of(c), &out[at * size_t(bpp)]);
        continue;
      }
      const Colour yuv = ycc_of(c);
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

::testing::AssertionResult same_output(const std::vector<uint8_t>& actual,
                                       const std::vector<uint8_t>& expected, const Placement& p) {
  if (actual.size() != expected.size())
    return ::testing::AssertionFailure()
           << "buffer of " << actual.size() << " bytes, expected " << expected.size();
  size_t diffs = 0, first = 0;
  for (size_t i = 0; i < actual.size(); ++i)
    if (actual[i] != expected[i] && diffs++ == 0) first = i;
  if (diffs == 0) return ::testing::AssertionSuccess();
  // Name the plane and pixel of the first difference.
  const size_t bw = size_t(p.buffer_width), bh = size_t(p.buffer_height);
  std::string where;
  if (p.format == 2) {
    const size_t luma = bw * bh, cs = (bw + 1) / 2, plane = cs * ((bh + 1) / 2);
    const size_t in_plane = first < luma ? first : (first - luma) % plane;
    const size_t row_length = first < luma ? bw : cs;
    where = std::string(first < luma             ? "Y"
                        : (first - luma) < plane ? "U"
                                                 : "V") +
            " plane (" + std::to_string(in_plane % row_length) + "," +
            std::to_string(in_plane / row_length) + ")";
  } else {
    const size_t px = first / size_t(std::max(1, pixel_bytes(p.format)));
    where = "pixel (" + std::to_string(px % bw) + "," + std::to_string(px / bw) + ")";
  }
  return ::testing::AssertionFailure()
         << diffs << " bytes differ; first at " << where << ": " << int(actual[first])
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
        sum.ycc = c.ycc;
        sum.a += c.a;
        sum.b += c.b;
        sum.c += c.c;
      }
    }
    return Colour{sum.ycc, sum.a / 4, sum.b / 4, sum.c / 4};
  };
}

ColourAt colours_of(const std::vector<uint8_t>& buffer, int format, int row_length) {
  const int bpp = pixel_bytes(format);
  return [&buffer, format, row_length, bpp](int x, int y) {
    return load_pixel(format, &buffer[(size_t(y) * size_t(row_length) + size_t(x)) * size_t(bpp)]);
  };
}

}  // namespace vjtest
