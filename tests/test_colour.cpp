// Colour conversion and pixel output, checked against references written
// here from the colour equations, the pixel layouts and the sampling rules.
#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <cstring>
#include <functional>
#include <memory>
#include <random>
#include <tuple>
#include <utility>
#include <vector>

#include "recon/colour.h"
#include "recon/colour_routines.h"

namespace {

// ---------------------------------------------------------------------------
// References.

int clamp255(int v) { return v < 0 ? 0 : v > 255 ? 255 : v; }
int floor_div(long long a, long long b) { return int(std::floor(double(a) / double(b))); }

// A colour as YCbCr (converted by the writer) or as RGB.
struct Px {
  bool ycc;
  int a, b, c;
};

std::array<int, 3> ref_rgb(const Px& p) {
  if (!p.ycc) return {p.a, p.b, p.c};
  const long long cb = p.b - 128, cr = p.c - 128;
  return {clamp255(p.a + floor_div(91881 * cr, 65536)),
          clamp255(p.a + floor_div(-22554 * cb - 46802 * cr, 65536)),
          clamp255(p.a + floor_div(116130 * cb, 65536))};
}
std::array<int, 3> ref_yuv(const Px& p) {
  if (p.ycc) return {p.a, p.b, p.c};
  const int r = p.a, g = p.b, b = p.c;
  return {floor_div(1225 * r + 2404 * g + 467 * b, 4096),
          floor_div(-691 * r - 1357 * g + 2048 * b, 4096) + 128,
          floor_div(2048 * r - 1715 * g - 333 * b, 4096) + 128};
}
Px ref_cmyk(int c, int m, int y, int k) { return {false, c * k / 255, m * k / 255, y * k / 255}; }
Px ref_ycck(int y, int cb, int cr, int k) {
  return {false, k * clamp255(433 - y - floor_div(91881LL * cr, 65536)) / 256,
          k * clamp255(120 - y - floor_div(-22554LL * cb - 46802LL * cr, 65536)) / 256,
          k * clamp255(481 - y - floor_div(116130LL * cb, 65536)) / 256};
}

// Bytes per pixel by format code (planar counts its luma byte).
int bytes_of(int format) {
  static const int kBytes[13] = {2, 3, 1, 3, 0, 4, 3, 4, 4, 2, 2, 3, 4};
  return format >= 0 && format < 13 ? kBytes[format] : 0;
}
void encode(int format, const std::array<int, 3>& c, uint8_t* p) {
  const int r = c[0], g = c[1], b = c[2];
  if (bytes_of(format) == 2) {
    const int v = ((r >> 3) << 11) | ((g >> 2) << 5) | (b >> 3);
    p[0] = uint8_t(v & 255);
    p[1] = uint8_t(v >> 8);
    return;
  }
  const char* order = format == 5                   ? "ARGB"
                      : format == 8                 ? "BGRA"
                      : format == 7 || format == 12 ? "RGBA"
                                                    : "RGB";
  for (size_t i = 0; i < std::strlen(order); ++i) {
    const char k = order[i];
    p[i] = uint8_t(k == 'R' ? r : k == 'G' ? g : k == 'B' ? b : 255);
  }
}

// ---------------------------------------------------------------------------
// Output buffer with a sentinel border, laid out for a rotation.

constexpr uint8_t kSentinel = 0xA5;

struct Canvas {
  int format, rotation, vw, vh, bw, bh, ox, oy, bpp;
  size_t cs, crows, luma;
  std::vector<uint8_t> buf;

  Canvas(int format_, int rotation_, int vw_, int vh_, int margin_x = 3, int margin_y = 1)
      : format(format_), rotation(rotation_), vw(vw_), vh(vh_) {
    const bool swap = rotation == 4 || rotation == 12;
    ox = margin_x;
    oy = margin_y;
    bw = (swap ? vh : vw) + 2 * margin_x + 1;
    bh = (swap ? vw : vh) + 2 * margin_y + 1;
    bpp = std::max(bytes_of(format), 1);
    cs = size_t(bw + 1) / 2;
    crows = size_t(bh + 1) / 2;
    luma = size_t(bw) * bh * bpp;
    buf.assign(luma + (format == 2 ? 2 * cs * crows : 0), kSentinel);
  }
  // Buffer coordinates of output pixel x of output row y.
  std::pair<int, int> place(int x, int y) const {
    switch (rotation) {
      case 4:
        return {ox + vh - 1 - y, oy + x};
      case 8:
        return {ox + vw - 1 - x, oy + vh - 1 - y};
      case 12:
        return {ox + y, oy + vw - 1 - x};
      default:
        return {ox + x, oy + y};
    }
  }
  size_t offset(int x, int y) const { return (size_t(y) * bw + x) * bpp; }
  void attach(DecoderInfo& d) {
    d.output_format = format;
    d.rotation = uint32_t(rotation);
    d.output_rows = 0;
    const auto [x0, y0] = place(0, 0);
    d.output_ptr = buf.data() + offset(x0, y0);
    const int row = bw * bpp;
    const int steps[4][2] = {{1, row}, {bw, -bpp}, {-1, -row}, {-bw, bpp}};
    d.pixel_step = steps[rotation / 4][0];
    d.row_step = steps[rotation / 4][1];
    if (format == 2) {
      d.y_plane = buf.data();
      d.u_plane = buf.data() + luma;
      d.v_plane = d.u_plane + cs * crows;
      d.y_stride = uint32_t(bw);
      d.c_stride = uint32_t(cs);
      d.plane_height = uint32_t(bh);
      d.u_ptr = d.u_plane + size_t(oy / 2) * cs + ox / 2;
      d.v_ptr = d.v_plane + size_t(oy / 2) * cs + ox / 2;
    }
  }
  std::vector<uint8_t> expect(const std::function<Px(int, int)>& colour) const {
    std::vector<uint8_t> e(buf.size(), kSentinel);
    if (bytes_of(format) == 0) return e;
    for (int y = 0; y < vh; ++y) {
      for (int x = 0; x < vw; ++x) {
        const auto [bx, by] = place(x, y);
        const Px p = colour(x, y);
        if (format != 2) {
          encode(format, ref_rgb(p), &e[offset(bx, by)]);
          continue;
        }
        const auto yuv = ref_yuv(p);
        e[offset(bx, by)] = uint8_t(yuv[0]);
        size_t at = SIZE_MAX;
        if (rotation == 0 && x % 2 == 0 && y % 2 == 0)
          at = (size_t(oy / 2) + y / 2) * cs + ox / 2 + x / 2;
        if (rotation != 0 && bx % 2 == 0 && by % 2 == 0) at = size_t(by / 2) * cs + bx / 2;
        if (at != SIZE_MAX) {
          e[luma + at] = uint8_t(yuv[1]);
          e[luma + cs * crows + at] = uint8_t(yuv[2]);
        }
      }
    }
    return e;
  }
};

// Compares two buffers, naming the first differing byte.
::testing::AssertionResult same_bytes(const std::vector<uint8_t>& actual,
                                      const std::vector<uint8_t>& expected) {
  if (actual.size() != expected.size()) return ::testing::AssertionFailure() << "sizes differ";
  size_t diffs = 0, first = 0;
  for (size_t i = 0; i < actual.size(); ++i) {
    if (actual[i] != expected[i] && diffs++ == 0) first = i;
  }
  if (diffs == 0) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure()
         << diffs << " bytes differ, first at " << first << ": " << int(actual[first])
         << " instead of " << int(expected[first]);
}

// ---------------------------------------------------------------------------
// Decoder fixture: geometry, clamping table, converter record, owner.

struct Fixture {
  std::unique_ptr<DecoderInfo> d = std::make_unique<DecoderInfo>();
  DecInfo owner{};
  ColourConverter converter{};
  std::vector<uint8_t> table;

  explicit Fixture(int space = kColourYcc) {
    table.resize(1024);
    for (int i = 0; i < 1024; ++i) table[i] = uint8_t(clamp255(i - 256));
    d->range_limit = table.data() + 256;
    d->owner = &owner;
    d->converter = &converter;
    d->colour_space = space;
  }
  ~Fixture() { vj_release_converter(d.get()); }
  int32_t select(int sw, int sh, int dw, int dh, int mode = 0) {
    d->reduced_width = uint16_t(sw);
    d->reduced_height = uint16_t(sh);
    d->cropped_reduced_width = sw;
    d->cropped_reduced_height = sh;
    d->visible_width = dw;
    d->visible_height = dh;
    d->decode_mode = mode;
    return vj_select_converter(d.get());
  }
  // A sentinel-filled canvas of the visible size, attached to the cursor.
  Canvas attach(int format, int rotation = 0, int margin_x = 3, int margin_y = 1) {
    Canvas canvas(format, rotation, d->visible_width, d->visible_height, margin_x, margin_y);
    canvas.attach(*d);
    return canvas;
  }
  void region(uint32_t left, uint32_t top, uint32_t width, uint32_t height, uint32_t path) {
    owner.region_mode = 1;
    owner.region_left = left;
    owner.region_top = top;
    owner.region_width = width;
    owner.region_height = height;
    d->path_code = path;
  }
};

// Component planes of random samples.
struct Planes {
  int w, h;
  std::vector<std::vector<uint8_t>> p;
  Planes(int n, int w_, int h_, uint32_t seed) : w(w_), h(h_), p(size_t(n)) {
    std::mt19937 rng(seed);
    for (auto& plane : p) {
      plane.resize(size_t(w) * h);
      for (auto& v : plane) v = uint8_t(rng());
    }
  }
  int at(int c, int x, int y) const { return p[size_t(c)][size_t(y) * w + x]; }
  uint8_t* row(int c, int y) { return p[size_t(c)].data() + size_t(y) * w; }
};

int components_of(int space) { return space == kColourGrey ? 1 : space >= kColourCmyk ? 4 : 3; }

Px source_colour(int space, const Planes& s, int x, int y) {
  auto v = [&](int c) { return s.at(c, x, y); };
  switch (space) {
    case kColourGrey:
      return {false, v(0), v(0), v(0)};
    case kColourRgb:
      return {false, v(0), v(1), v(2)};
    case kColourCmyk:
      return ref_cmyk(v(0), v(1), v(2), v(3));
    case kColourYcck:
      return ref_ycck(v(0), v(1), v(2), v(3));
    default:
      return {true, v(0), v(1), v(2)};
  }
}

// The canvas holds the source picture from column dx and row dy, 1:1.
::testing::AssertionResult holds_picture(const Canvas& canvas, int space, const Planes& s,
                                         int dx = 0, int dy = 0) {
  return same_bytes(canvas.buf, canvas.expect([&](int x, int y) {
    return source_colour(space, s, x + dx, y + dy);
  }));
}

// Hands every row of the planes to the converter, in batches of 1, 2, 3, ...
void feed(Fixture& f, Planes& s) {
  for (int y = 0, turn = 0; y < s.h; ++turn) {
    const int n = std::min(turn % 3 + 1, s.h - y);
    std::vector<uint8_t*> rows[4];
    uint8_t* const* sets[4] = {};
    for (size_t c = 0; c < s.p.size(); ++c) {
      for (int i = 0; i < n; ++i) rows[c].push_back(s.row(int(c), y + i));
      sets[c] = rows[c].data();
    }
    f.d->converter->convert(f.d.get(), sets, uint32_t(n));
    y += n;
  }
}

// Quarter-point averaging of four samples; YCbCr averages before the
// conversion, the other spaces after it.
Px average_of(int space, const Planes& s, int x0, int x1, int y0, int y1) {
  const Px q[4] = {source_colour(space, s, x0, y0), source_colour(space, s, x1, y0),
                   source_colour(space, s, x0, y1), source_colour(space, s, x1, y1)};
  return {q[0].ycc, (q[0].a + q[1].a + q[2].a + q[3].a) / 4,
          (q[0].b + q[1].b + q[2].b + q[3].b) / 4, (q[0].c + q[1].c + q[2].c + q[3].c) / 4};
}

// Source row of output row j under centre sampling: while reducing, the
// rows that pass the phase test (floor(H/2) - (r*h mod H)) mod H < h, in
// order; while enlarging, floor((floor(H/2) + j*H) / h).
std::vector<int> centre_rows(int sh, int dh) {
  std::vector<int> rows;
  if (dh <= sh) {
    for (int r = 0; r < sh; ++r) {
      const int phase = ((sh / 2 - (r * dh) % sh) % sh + sh) % sh;
      if (phase < dh) rows.push_back(r);
    }
  } else {
    for (int j = 0; j < dh; ++j) rows.push_back((sh / 2 + j * sh) / dh);
  }
  return rows;
}

std::function<Px(int, int)> resized_reference(int space, const Planes& s, int dw, int dh,
                                              bool centre) {
  const int sw = s.w, sh = s.h;
  if (centre) {
    const auto rows = centre_rows(sh, dh);
    return [=, &s](int x, int y) {
      return source_colour(space, s, (sw / 2 + x * sw) / dw, rows[size_t(y)]);
    };
  }
  return [=, &s](int x, int y) {
    return average_of(space, s, (sw / 4 + x * sw) / dw, (3 * sw / 4 + x * sw) / dw,
                      (sh / 4 + y * sh) / dh, (3 * sh / 4 + y * sh) / dh);
  };
}

bool is_centre(ConvertFn fn) {
  return fn == VETAJ_DoFastYcbcrToRgb || fn == VETAJ_DoFastYcbcrToRgb_Partial ||
         fn == VETAJ_DoFastYcbcrToUpscaleRgb;
}

// ---------------------------------------------------------------------------
// Colour equations.

// Fills a 256 x 256 picture with sample(row, column, component), writes it
// through the 1:1 path into RGBA and compares every pixel with the reference.
void check_grid(int space, const std::function<int(int row, int col, int comp)>& sample) {
  Fixture f(space);
  ASSERT_EQ(f.select(256, 256, 256, 256), 200);
  Canvas canvas = f.attach(7, 0, 0, 0);
  Planes s(components_of(space), 256, 256, 1);
  for (int c = 0; c < components_of(space); ++c) {
    for (int y = 0; y < 256; ++y) {
      for (int x = 0; x < 256; ++x) s.row(c, y)[x] = uint8_t(sample(y, x, c));
    }
  }
  feed(f, s);
  EXPECT_TRUE(holds_picture(canvas, space, s));
}

// YCbCr over every chroma pair at several luma values; CMYK over every
// product of a channel and black (the exact division); YCCK over a grid.
TEST(ColourEquations, GridsMatchFixedPointReferences) {
  for (const int luma : {0, 1, 64, 100, 128, 200, 254, 255}) {
    check_grid(kColourYcc, [luma](int row, int col, int c) {
      return c == 0 ? luma : c == 1 ? col : row;
    });
  }
  check_grid(kColourCmyk, [](int row, int col, int c) {
    const int v[4] = {col, 255 - col, col ^ 0x5A, row};
    return v[c];
  });
  check_grid(kColourYcck, [](int row, int col, int c) {
    const int v[4] = {col, row, col * 7 + row, 255 - row};
    return v[c];
  });
}

// One pixel through a 1:1 writer into a format; returns the bytes.
std::vector<uint8_t> one_pixel(int space, int format, std::vector<uint8_t> samples) {
  Fixture f(space);
  f.select(1, 1, 1, 1);
  Canvas canvas = f.attach(format, 0, 0, 0);
  const uint8_t* c[4] = {};
  for (size_t k = 0; k < samples.size(); ++k) c[k] = &samples[k];
  const auto writer = space == kColourYcc    ? VETAJ_YcbcrWriteOutput1to1
                      : space == kColourGrey ? VETAJ_GrayWriteOutput1to1
                      : space == kColourRgb  ? VETAJ_RGBWriteOutput1to1
                      : space == kColourCmyk ? VETAJ_CMYKWriteOutput1to1
                                             : VETAJ_YCCKWriteOutput1to1;
  writer(f.d.get(), c, 1);
  return {canvas.buf.begin(), canvas.buf.begin() + bytes_of(format)};
}

using Bytes = std::vector<uint8_t>;

TEST(ColourEquations, KnownValues) {
  EXPECT_EQ(one_pixel(kColourYcc, 0, {128, 128, 128}), (Bytes{0x10, 0x84}));
  EXPECT_EQ(one_pixel(kColourYcc, 7, {255, 128, 255})[0], 255);
  EXPECT_EQ(one_pixel(kColourYcc, 7, {0, 0, 128})[2], 0);
  EXPECT_EQ(one_pixel(kColourYcc, 7, {100, 0, 128}), (Bytes{100, 144, 0, 255}));
  EXPECT_EQ(one_pixel(kColourCmyk, 7, {255, 255, 255, 255}), (Bytes{255, 255, 255, 255}));
  EXPECT_EQ(one_pixel(kColourCmyk, 7, {200, 100, 50, 0}), (Bytes{0, 0, 0, 255}));
  EXPECT_EQ(one_pixel(kColourCmyk, 7, {128, 64, 0, 255}), (Bytes{128, 64, 0, 255}));
  EXPECT_EQ(one_pixel(kColourYcck, 7, {255, 128, 128, 255}), (Bytes{0, 0, 0, 255}));
  EXPECT_EQ(one_pixel(kColourGrey, 7, {77}), (Bytes{77, 77, 77, 255}));
  const int g = 201, v = ((g >> 3) << 11) | ((g >> 2) << 5) | (g >> 3);
  EXPECT_EQ(one_pixel(kColourGrey, 0, {uint8_t(g)}), (Bytes{uint8_t(v & 255), uint8_t(v >> 8)}));
  EXPECT_EQ(one_pixel(kColourRgb, 8, {1, 2, 3}), (Bytes{3, 2, 1, 255}));
  EXPECT_EQ(one_pixel(kColourGrey, 2, {90}), (Bytes{90}));
}

// ---------------------------------------------------------------------------
// Every format, every rotation, every path.

class Layout : public ::testing::TestWithParam<std::tuple<int, int>> {};

// Runs a colour space through its converter at 1:1 and resized.
TEST_P(Layout, ConvertersWriteEveryFormatAndRotation) {
  const auto [format, rotation] = GetParam();
  const std::tuple<int, int, int, int, int> cases[] = {
      // space, source size, output size
      {kColourGrey, 7, 5, 7, 5},  {kColourRgb, 7, 5, 7, 5},  {kColourCmyk, 7, 5, 7, 5},
      {kColourYcck, 7, 5, 7, 5},  {kColourYcc, 7, 5, 7, 5},  {kColourYcc, 11, 9, 5, 4},
      {kColourCmyk, 11, 9, 5, 4}, {kColourGrey, 4, 3, 9, 7}, {kColourRgb, 130, 8, 101, 5}};
  for (const auto& [space, sw, sh, dw, dh] : cases) {
    SCOPED_TRACE(testing::Message()
                 << "space " << space << " " << sw << "x" << sh << " -> " << dw << "x" << dh);
    Fixture f(space);
    ASSERT_EQ(f.select(sw, sh, dw, dh), 200);
    Canvas canvas = f.attach(format, rotation);
    Planes s(components_of(space), sw, sh, uint32_t(space * 31 + sw));
    feed(f, s);
    const bool same = sw == dw && sh == dh;
    const auto ref = same ? std::function<Px(int, int)>(
                                [&](int x, int y) { return source_colour(space, s, x, y); })
                          : resized_reference(space, s, dw, dh, is_centre(f.converter.convert));
    EXPECT_TRUE(same_bytes(canvas.buf, canvas.expect(ref)));
    EXPECT_EQ(f.d->output_rows, uint32_t(dh));
  }
}

// The fused writers: every chroma layout, odd and even widths, an odd
// height (the last two-row call writes one row).
TEST_P(Layout, FusedWritersWriteEveryFormatAndRotation) {
  const auto [format, rotation] = GetParam();
  struct Family {
    int code, h, v;
  };
  for (const Family fam : {Family{1, 2, 2}, Family{2, 2, 1}, Family{3, 1, 2}, Family{4, 1, 1}}) {
    for (const int w : {1, 2, 7, 16}) {
      SCOPED_TRACE(testing::Message() << "fused code " << fam.code << " width " << w);
      const int h = 5, padded_h = 6;
      Fixture f(kColourYcc);
      ASSERT_EQ(f.select(w, h, w, h), 200);
      Canvas canvas = f.attach(format, rotation);
      const int cw = (w + fam.h - 1) / fam.h, ch = padded_h / fam.v;
      Planes luma(1, w, padded_h, uint32_t(w + 7 * fam.code));
      Planes chroma(2, cw, ch, uint32_t(w * 3 + fam.code));
      const FusedWriterFn writer = vj_select_fused_writer(fam.code, format);
      ASSERT_NE(writer, nullptr);
      for (int y = 0; y < h; y += fam.v) {
        writer(f.d.get(), luma.row(0, y), fam.v == 2 ? luma.row(0, y + 1) : nullptr,
               chroma.row(0, y / fam.v), chroma.row(1, y / fam.v), uint32_t(w));
      }
      EXPECT_TRUE(same_bytes(canvas.buf, canvas.expect([&](int x, int y) {
        return Px{true, luma.at(0, x, y), chroma.at(0, x / fam.h, y / fam.v),
                  chroma.at(1, x / fam.h, y / fam.v)};
      })));
      EXPECT_EQ(f.d->output_rows, uint32_t(h));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(AllFormats, Layout,
                         ::testing::Combine(::testing::Range(0, 13),
                                            ::testing::Values(0, 4, 8, 12)));

TEST(FusedSelection, NamedMembersByLayoutAndFormat) {
  EXPECT_EQ(vj_select_fused_writer(1, 0), &VETAJ_YcbcrWriteOutput1to1_YUV420_toRGB565);
  EXPECT_EQ(vj_select_fused_writer(1, 7), &VETAJ_YcbcrWriteOutput1to1_YUV420_toRGBA8888);
  EXPECT_EQ(vj_select_fused_writer(2, 8), &VETAJ_YcbcrWriteOutput1to1_YUV422_H2V1_toBGRA8888);
  EXPECT_EQ(vj_select_fused_writer(3, 2), &VETAJ_YcbcrWriteOutput1to1_YUV422_H1V2);
  EXPECT_EQ(vj_select_fused_writer(4, 5), &VETAJ_YcbcrWriteOutput1to1_YUV444);
  EXPECT_EQ(vj_select_fused_writer(0, 7), nullptr);
  EXPECT_EQ(vj_select_fused_writer(5, 7), nullptr);
  EXPECT_EQ(vj_bytes_per_pixel(0), 2);
  EXPECT_EQ(vj_bytes_per_pixel(11), 3);
  EXPECT_EQ(vj_bytes_per_pixel(12), 4);
  EXPECT_EQ(vj_bytes_per_pixel(2), 0);
  EXPECT_EQ(vj_bytes_per_pixel(4), 0);
}

// ---------------------------------------------------------------------------
// Resampling over many size pairs, both directions.

class Resampling : public ::testing::TestWithParam<std::tuple<int, int>> {};

TEST_P(Resampling, MatchesSamplingReference) {
  const auto [space, mode] = GetParam();
  const int sizes[][4] = {{8, 8, 4, 4},         {9, 7, 4, 3},         {16, 16, 3, 5},
                          {13, 11, 5, 6},       {5, 4, 13, 9},        {3, 2, 7, 7},
                          {1, 1, 4, 3},         {4, 3, 1, 1},         {100, 60, 37, 23},
                          {250, 130, 120, 101}, {120, 110, 240, 200}, {300, 7, 110, 3},
                          {61, 200, 29, 110}};
  for (const auto& z : sizes) {
    SCOPED_TRACE(testing::Message() << z[0] << "x" << z[1] << " -> " << z[2] << "x" << z[3]);
    Fixture f(space);
    ASSERT_EQ(f.select(z[0], z[1], z[2], z[3], mode), 200);
    Canvas canvas = f.attach(7);
    Planes s(components_of(space), z[0], z[1], uint32_t(z[0] * 1000 + z[1]));
    feed(f, s);
    EXPECT_TRUE(same_bytes(canvas.buf, canvas.expect(resized_reference(
                                           space, s, z[2], z[3], is_centre(f.converter.convert)))));
    EXPECT_EQ(f.d->output_rows, uint32_t(z[3]));
  }
}

INSTANTIATE_TEST_SUITE_P(
    SpacesAndModes, Resampling,
    ::testing::Values(std::make_tuple(kColourYcc, 0), std::make_tuple(kColourYcc, 1),
                      std::make_tuple(kColourYcc, 2), std::make_tuple(kColourGrey, 0),
                      std::make_tuple(kColourRgb, 0), std::make_tuple(kColourCmyk, 0),
                      std::make_tuple(kColourYcck, 4)));

TEST(ConverterChoice, FollowsSizeModeAndRegion) {
  struct Case {
    int space, sw, sh, dw, dh, mode;
    bool region;
    ConvertFn expected;
  };
  const Case cases[] = {
      {kColourYcc, 400, 300, 200, 150, 0, false, VETAJ_DoYcbcrToRgb},
      {kColourYcc, 400, 300, 200, 150, 0, true, VETAJ_DoYcbcrToRgb_Partial},
      {kColourYcc, 400, 300, 99, 99, 0, false, VETAJ_DoFastYcbcrToRgb},
      {kColourYcc, 400, 300, 99, 99, 0, true, VETAJ_DoFastYcbcrToRgb_Partial},
      {kColourYcc, 400, 300, 200, 150, 2, false, VETAJ_DoFastYcbcrToRgb},
      {kColourYcc, 240, 240, 140, 140, 1, false, VETAJ_DoFastYcbcrToRgb},  // 7*240 <= 12*140
      {kColourYcc, 241, 240, 140, 140, 1, false, VETAJ_DoYcbcrToRgb},
      {kColourYcc, 50, 50, 300, 300, 0, false, VETAJ_DoYcbcrToUpscaleRgb},
      {kColourYcc, 50, 50, 60, 60, 1, false, VETAJ_DoYcbcrToUpscaleRgb},
      {kColourYcc, 50, 50, 300, 300, 2, true, VETAJ_DoFastYcbcrToUpscaleRgb},
      {kColourYcc, 200, 50, 100, 60, 0, false, VETAJ_DoYcbcrToUpscaleRgb},
      {kColourGrey, 200, 200, 100, 100, 0, false, VETAJ_DoGrayConvert},
      {kColourGrey, 200, 200, 100, 100, 3, true, VETAJ_DoGrayConvert_Partial},
      {kColourGrey, 20, 20, 100, 10, 0, false, VETAJ_DoGrayUpscaleConvert},
      {kColourRgb, 200, 200, 100, 100, 0, false, VETAJ_DoRgbConvert},
      {kColourRgb, 200, 200, 100, 100, 0, true, VETAJ_DoRgbConvert_Partial},
      {kColourRgb, 20, 20, 21, 20, 0, false, VETAJ_DoRgbUpscaleConvert},
      {kColourCmyk, 20, 20, 80, 80, 0, false, VETAJ_DoCMYKToRgb},
      {kColourCmyk, 20, 20, 10, 10, 0, true, VETAJ_DoCMYKToRgb_Partial},
      {kColourYcck, 20, 20, 80, 80, 2, false, VETAJ_DoYCCKToRgb},
      {kColourYcck, 20, 20, 20, 20, 0, true, VETAJ_DoYCCKToRgb_Partial},
  };
  for (const Case& c : cases) {
    Fixture f(c.space);
    if (c.region) f.owner.region_mode = 1;
    ASSERT_EQ(f.select(c.sw, c.sh, c.dw, c.dh, c.mode), 200);
    EXPECT_EQ(f.converter.convert, c.expected) << c.space << " " << c.sw << "x" << c.sh << " -> "
                                               << c.dw << "x" << c.dh << " mode " << c.mode;
  }
  Fixture bad(0);
  EXPECT_EQ(bad.select(8, 8, 8, 8), 201);
  Fixture empty(kColourGrey);
  EXPECT_EQ(empty.select(8, 8, 0, 8), 201);
  EXPECT_EQ(empty.select(8, 0, 8, 8), 201);
  empty.d->crop_x = 4;  // window past the reduced picture
  empty.d->reduced_width = 10;
  empty.d->cropped_reduced_width = 7;
  EXPECT_EQ(vj_select_converter(empty.d.get()), 201);
}

// ---------------------------------------------------------------------------
// Cursor edge cases.

TEST(Cursor, ZeroRowBatchOnlyClearsTheMoreOutputFlag) {
  Fixture f(kColourYcc);
  ASSERT_EQ(f.select(8, 8, 4, 4), 200);
  Canvas canvas = f.attach(7);
  f.d->resampler->more_output = 1;
  uint8_t* const* none[3] = {};
  f.converter.convert(f.d.get(), none, 0);
  EXPECT_EQ(f.d->resampler->more_output, 0u);
  EXPECT_EQ(f.d->output_rows, 0u);
  EXPECT_EQ(f.d->resampler->src_row, 0u);
  EXPECT_TRUE(same_bytes(canvas.buf, std::vector<uint8_t>(canvas.buf.size(), kSentinel)));
}

TEST(Cursor, RowsBeyondTheVisibleHeightAreNotWritten) {
  Fixture f(kColourGrey);
  ASSERT_EQ(f.select(6, 3, 6, 3), 200);
  Canvas canvas = f.attach(8, 8);
  Planes s(1, 6, 7, 5);
  feed(f, s);  // four rows too many
  EXPECT_EQ(f.d->output_rows, 3u);
  EXPECT_TRUE(holds_picture(canvas, kColourGrey, s));
}

// Calls wider than the visible width (the row length of a buffer larger
// than the picture) are clipped to it.
TEST(Cursor, WideCallsAreClippedToTheVisibleWidth) {
  Fixture f(kColourYcc);
  ASSERT_EQ(f.select(5, 2, 5, 2), 200);
  Canvas canvas = f.attach(7);
  Planes s(3, 16, 2, 21);
  const uint8_t* row0[3] = {s.row(0, 0), s.row(1, 0), s.row(2, 0)};
  VETAJ_YcbcrWriteOutput1to1(f.d.get(), row0, 12);
  VETAJ_YcbcrWriteOutput1to1_YUV444_toRGBA8888(f.d.get(), s.row(0, 1), nullptr, s.row(1, 1),
                                               s.row(2, 1), 12);
  EXPECT_TRUE(holds_picture(canvas, kColourYcc, s));
}

TEST(Cursor, CropOffsetShiftsTheFirstSourceColumn) {
  Fixture f(kColourRgb);
  f.d->crop_x = 3;
  f.d->reduced_width = 12;
  ASSERT_EQ(vj_select_converter(f.d.get()), 201);  // no window yet
  f.d->cropped_reduced_width = 7;
  f.d->visible_width = 7;
  f.d->cropped_reduced_height = f.d->visible_height = 2;
  f.d->reduced_height = 2;
  ASSERT_EQ(vj_select_converter(f.d.get()), 200);
  Canvas canvas = f.attach(1);
  Planes s(3, 12, 2, 9);
  feed(f, s);
  EXPECT_TRUE(holds_picture(canvas, kColourRgb, s, 3, 0));
}

// ---------------------------------------------------------------------------
// Region decoding: left column rule and the row window.

class RegionColumns : public ::testing::TestWithParam<std::tuple<uint32_t, uint32_t>> {};

// A 4:2:0 fused writer on a region whose top row is odd and whose last row
// ends inside a two-row call; the first column follows the mask rule, and
// an odd first column starts with a single pixel.
TEST_P(RegionColumns, FusedWriterHonoursWindowEdgesAndFirstColumn) {
  const auto [path, left] = GetParam();
  const uint32_t mask_of[23] = {0, 14, 6, 0, 2,  0,  0,  0,  0, 0, 0, 0,
                                0, 0,  0, 0, 62, 30, 63, 31, 6, 3, 1};
  const int first = int(path < 23 ? left & mask_of[path] : 0);
  const int top = 3, rw = 5, rh = 4;
  for (const int format : {7, 0, 2}) {
    Fixture f(kColourYcc);
    f.region(left, uint32_t(top), rw, rh, path);
    ASSERT_EQ(f.select(rw, rh, rw, rh), 200);
    Canvas canvas = f.attach(format, 0, 2, 2);
    Planes luma(1, 128, 10, 3), chroma(2, 64, 5, 4);
    vj_converter_set_row(f.d.get(), 0);
    for (int y = 0; y < 10; y += 2)
      VETAJ_YcbcrWriteOutput1to1_YUV420(f.d.get(), luma.row(0, y), luma.row(0, y + 1),
                                        chroma.row(0, y / 2), chroma.row(1, y / 2), rw);
    EXPECT_EQ(f.d->output_rows, uint32_t(rh));
    EXPECT_TRUE(same_bytes(canvas.buf, canvas.expect([&](int x, int y) {
      const int sx = first + x, sy = top + y;
      return Px{true, luma.at(0, sx, sy), chroma.at(0, sx / 2, sy / 2),
                chroma.at(1, sx / 2, sy / 2)};
    }))) << "format "
         << format;
  }
}

// The partial converters pass only the rows of the window and start at the
// region's first column.
TEST_P(RegionColumns, PartialConvertersWriteOnlyTheWindow) {
  const auto [path, left] = GetParam();
  const uint32_t mask_of[23] = {0, 14, 6, 0, 2,  0,  0,  0,  0, 0, 0, 0,
                                0, 0,  0, 0, 62, 30, 63, 31, 6, 3, 1};
  const int first = int(path < 23 ? left & mask_of[path] : 0);
  for (const int space : {kColourYcc, kColourCmyk, kColourGrey}) {
    Fixture f(space);
    f.region(left, 2, 6, 3, path);
    ASSERT_EQ(f.select(6, 3, 6, 3), 200);
    Canvas canvas = f.attach(5, 12);
    Planes s(components_of(space), 128, 9, 11);
    feed(f, s);
    EXPECT_TRUE(holds_picture(canvas, space, s, first, 2));
  }
}

INSTANTIATE_TEST_SUITE_P(MaskTable, RegionColumns,
                         ::testing::Values(std::make_tuple(16u, 77u), std::make_tuple(17u, 45u),
                                           std::make_tuple(18u, 69u), std::make_tuple(19u, 13u),
                                           std::make_tuple(22u, 3u), std::make_tuple(21u, 7u),
                                           std::make_tuple(3u, 9u), std::make_tuple(40u, 9u)));

}  // namespace
