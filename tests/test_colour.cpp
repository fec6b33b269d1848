// Colour conversion and pixel output, checked against the references of
// tests/support/pictures.h: the colour equations, the pixel layouts and the
// sampling rules.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <memory>
#include <random>
#include <tuple>
#include <vector>

#include "recon/colour.h"
#include "recon/colour_routines.h"
#include "support/pictures.h"

namespace {

using namespace vjtest;

// A kFill buffer of the visible box (turned by the rotation) with a margin
// around it, attached to the decoder's output cursor.
struct Canvas {
  Placement where;
  std::vector<uint8_t> buf;

  Canvas(DecoderInfo& d, int format, uint32_t rotation, int margin_x, int margin_y) {
    const bool quarter = rotation == 4 || rotation == 12;
    const int vw = d.visible_width, vh = d.visible_height;
    where = Placement::centred(format, (quarter ? vh : vw) + 2 * margin_x + 1,
                               (quarter ? vw : vh) + 2 * margin_y + 1, vw, vh, rotation);
    const int bw = where.buffer_width, bh = where.buffer_height;
    const int bpp = std::max(pixel_bytes(format), 1);
    // Format 4 writes nothing; its buffer is there to catch stray writes.
    buf.assign(std::max(buffer_bytes(format, bw, bh), size_t(bw) * size_t(bh)), kFill);
    int x0 = 0, y0 = 0;
    where.locate(0, 0, &x0, &y0);
    d.output_format = format;
    d.rotation = rotation;
    d.output_rows = 0;
    d.output_ptr = buf.data() + (size_t(y0) * size_t(bw) + size_t(x0)) * size_t(bpp);
    const int steps[4][2] = {{1, bw * bpp}, {bw, -bpp}, {-1, -bw * bpp}, {-bw, bpp}};
    d.pixel_step = steps[rotation / 4][0];
    d.row_step = steps[rotation / 4][1];
    if (format == 2) {
      const size_t cs = size_t(bw + 1) / 2;
      d.y_plane = buf.data();
      d.u_plane = d.y_plane + size_t(bw) * size_t(bh);
      d.v_plane = d.u_plane + cs * (size_t(bh + 1) / 2);
      d.y_stride = uint32_t(bw);
      d.c_stride = uint32_t(cs);
      d.plane_height = uint32_t(bh);
      d.u_ptr = d.u_plane + size_t(where.top / 2) * cs + size_t(where.left / 2);
      d.v_ptr = d.v_plane + size_t(where.top / 2) * cs + size_t(where.left / 2);
    }
  }
  ::testing::AssertionResult holds(const ColourAt& colour) const {
    std::vector<uint8_t> expected = expected_buffer(where, colour);
    expected.resize(buf.size(), kFill);
    return same_output(buf, expected);
  }
};

// Component planes of random samples.
struct Planes {
  int w, h;
  std::vector<std::vector<uint8_t>> p;
  Planes(int n, int w_, int h_, uint32_t seed) : w(w_), h(h_), p(size_t(n)) {
    std::mt19937 rng(seed);
    for (auto& plane : p) {
      plane.resize(size_t(w) * size_t(h));
      for (auto& v : plane) v = uint8_t(rng());
    }
  }
  int at(int c, int x, int y) const { return p[size_t(c)][size_t(y) * size_t(w) + size_t(x)]; }
  uint8_t* row(int c, int y) { return p[size_t(c)].data() + size_t(y) * size_t(w); }
};

int components_of(int space) { return space == kColourGrey ? 1 : space >= kColourCmyk ? 4 : 3; }

// The colour of source pixel (x + dx, y + dy) under a colour space.
ColourAt source_colours(int space, const Planes& s, int dx = 0, int dy = 0) {
  return [space, &s, dx, dy](int x, int y) {
    int v[4] = {};
    for (int c = 0; c < components_of(space); ++c) v[c] = s.at(c, x + dx, y + dy);
    return colour_in(space, v);
  };
}

// Decoder geometry, clamping table, converter record and owner.
struct Fixture {
  std::unique_ptr<DecoderInfo> d = std::make_unique<DecoderInfo>();
  DecInfo owner{};
  ColourConverter converter{};
  std::vector<uint8_t> table = std::vector<uint8_t>(1024);

  explicit Fixture(int space) {
    for (int i = 0; i < 1024; ++i) table[size_t(i)] = uint8_t(std::clamp(i - 256, 0, 255));
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
  Canvas attach(int format, uint32_t rotation = 0, int margin_x = 3, int margin_y = 1) {
    return Canvas(*d, format, rotation, margin_x, margin_y);
  }
  void region(uint32_t left, uint32_t top, uint32_t width, uint32_t height, uint32_t path) {
    owner.region_mode = 1;
    owner.region_left = left;
    owner.region_top = top;
    owner.region_width = width;
    owner.region_height = height;
    d->path_code = path;
  }
  // Hands every row of the planes to the converter, in batches of 1, 2, 3,
  // ... after a batch of no rows, which only clears the flag asking for
  // more output.
  void feed(Planes& s) {
    if (d->resampler != nullptr) d->resampler->more_output = 1;
    uint8_t* const* none[4] = {};
    converter.convert(d.get(), none, 0);
    EXPECT_TRUE(d->resampler == nullptr || d->resampler->more_output == 0);
    for (int y = 0, turn = 0; y < s.h; ++turn) {
      const int n = std::min(turn % 3 + 1, s.h - y);
      std::vector<uint8_t*> rows[4];
      uint8_t* const* sets[4] = {};
      for (size_t c = 0; c < s.p.size(); ++c) {
        for (int i = 0; i < n; ++i) rows[c].push_back(s.row(int(c), y + i));
        sets[c] = rows[c].data();
      }
      converter.convert(d.get(), sets, uint32_t(n));
      y += n;
    }
  }
  // The picture a converter makes of the planes by centre sampling or
  // quarter-point averages (YCbCr averaged before the conversion, the other
  // spaces after it).
  ColourAt resized(int space, const Planes& s, bool centre) const {
    return resampled(source_colours(space, s), centre ? Sampling::kCentre : Sampling::kAverage, 0,
                     0, s.w, s.h, d->visible_width, d->visible_height);
  }
};

// ---------------------------------------------------------------------------
// Colour equations.

// YCbCr over every chroma pair at several luma values; CMYK over every
// product of a channel and black (the exact division); YCCK over a grid.
TEST(ColourEquations, GridsMatchFixedPointReferences) {
  auto check = [](int space, auto sample) {
    Fixture f(space);
    ASSERT_EQ(f.select(256, 256, 256, 256), 200);
    Canvas canvas = f.attach(7, 0, 0, 0);
    Planes s(components_of(space), 256, 256, 1);
    for (int c = 0; c < components_of(space); ++c)
      for (int y = 0; y < 256; ++y)
        for (int x = 0; x < 256; ++x) s.row(c, y)[x] = uint8_t(sample(y, x)[c]);
    f.feed(s);
    EXPECT_TRUE(canvas.holds(source_colours(space, s)));
  };
  for (const int luma : {0, 1, 64, 100, 128, 200, 254, 255})
    check(kColourYcc, [luma](int row, int col) { return std::array{luma, col, row}; });
  check(kColourCmyk, [](int row, int col) { return std::array{col, 255 - col, col ^ 0x5A, row}; });
  check(kColourYcck, [](int row, int col) {
    return std::array{col, row, (col * 7 + row) & 255, 255 - row};
  });
}

// ---------------------------------------------------------------------------
// Every format and rotation (the fused writers are checked by the whole-
// picture tests), each colour space at 1:1 and resized over size pairs in
// both directions. YCbCr takes centre sampling for outputs of at most 99x99
// pixels, in mode 2 and in mode 1 within 12/7 of the picture, but enlarges
// by centre sampling only in mode 2; everything else takes the averages.

class Layout : public ::testing::TestWithParam<std::tuple<int, uint32_t>> {};

TEST_P(Layout, ConvertersWriteEveryFormatAndRotation) {
  const auto [format, rotation] = GetParam();
  const int cases[][7] = {
      // space, mode, source size, output size, centre sampling
      {kColourGrey, 0, 7, 5, 7, 5, 0},        {kColourRgb, 0, 7, 5, 7, 5, 0},
      {kColourCmyk, 0, 7, 5, 7, 5, 0},        {kColourYcck, 0, 7, 5, 7, 5, 0},
      {kColourYcc, 0, 7, 5, 7, 5, 1},         {kColourYcc, 0, 11, 9, 5, 4, 1},
      {kColourYcc, 1, 13, 11, 5, 6, 1},       {kColourYcc, 2, 5, 4, 13, 9, 1},
      {kColourYcc, 0, 1, 1, 4, 3, 0},         {kColourYcc, 1, 120, 110, 240, 200, 0},
      {kColourYcc, 0, 160, 120, 100, 99, 0},  {kColourYcc, 2, 160, 120, 100, 99, 1},
      {kColourYcc, 0, 160, 120, 99, 99, 1},   {kColourYcc, 1, 240, 240, 140, 140, 1},
      {kColourYcc, 1, 241, 240, 140, 140, 0}, {kColourYcc, 1, 300, 7, 110, 3, 0},
      {kColourCmyk, 0, 11, 9, 5, 4, 0},       {kColourGrey, 0, 4, 3, 9, 7, 0},
      {kColourRgb, 0, 130, 8, 101, 5, 0},     {kColourRgb, 0, 4, 3, 1, 1, 0},
      {kColourGrey, 0, 61, 200, 29, 110, 0},  {kColourYcck, 4, 250, 130, 120, 101, 0}};
  for (const auto& [space, mode, sw, sh, dw, dh, centre] : cases) {
    SCOPED_TRACE(testing::Message() << "space " << space << " mode " << mode << " " << sw << "x"
                                    << sh << " -> " << dw << "x" << dh);
    Fixture f(space);
    ASSERT_EQ(f.select(sw, sh, dw, dh, mode), 200);
    Canvas canvas = f.attach(format, rotation);
    // At 1:1 three rows too many are handed over: they are not written.
    Planes s(components_of(space), sw, sh + (sw == dw ? 3 : 0), uint32_t(space * 31 + sw));
    f.feed(s);
    s.h = sh;
    EXPECT_TRUE(canvas.holds(f.resized(space, s, centre == 1)));
    EXPECT_EQ(f.d->output_rows, uint32_t(dh));
  }
}

INSTANTIATE_TEST_SUITE_P(AllFormats, Layout,
                         ::testing::Combine(::testing::Range(0, 13),
                                            ::testing::Values(0u, 4u, 8u, 12u)));

// Refused: an unknown colour space, empty sizes, a window past the reduced
// picture.
TEST(ConverterChoice, RefusesBadGeometry) {
  Fixture bad(0);
  EXPECT_EQ(bad.select(8, 8, 8, 8), 201);
  Fixture empty(kColourGrey);
  EXPECT_EQ(empty.select(8, 8, 0, 8), 201);
  EXPECT_EQ(empty.select(8, 0, 8, 8), 201);
  empty.d->crop_x = 4;
  empty.d->reduced_width = 10;
  empty.d->cropped_reduced_width = 7;
  EXPECT_EQ(vj_select_converter(empty.d.get()), 201);
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
  EXPECT_TRUE(canvas.holds(source_colours(kColourYcc, s)));
}

// ---------------------------------------------------------------------------
// Region decoding: the first column is region_left AND the mask of the path
// code; the rows outside the window are consumed without output.

class RegionColumns : public ::testing::TestWithParam<std::tuple<uint32_t, uint32_t>> {
 protected:
  int first_column() const {
    const auto [path, left] = GetParam();
    return int(path == 16 ? left & 62 : path == 19 ? left & 31 : path == 22 ? left & 1 : 0);
  }
};

// A 4:2:0 fused writer on a region whose top row is odd and whose last row
// ends inside a two-row call (an odd first column starts with a single
// pixel), and the partial converters, which pass only the rows of the window.
TEST_P(RegionColumns, WritersHonourWindowEdgesAndFirstColumn) {
  const auto [path, left] = GetParam();
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
    EXPECT_TRUE(canvas.holds([&](int x, int y) {
      const int sx = first_column() + x, sy = top + y;
      return Colour{true, luma.at(0, sx, sy), chroma.at(0, sx / 2, sy / 2),
                    chroma.at(1, sx / 2, sy / 2)};
    })) << "format " << format;
  }
  for (const int space : {kColourYcc, kColourCmyk, kColourGrey}) {
    Fixture f(space);
    f.region(left, 2, 6, 3, path);
    ASSERT_EQ(f.select(6, 3, 6, 3), 200);
    Canvas canvas = f.attach(5, 12);
    Planes s(components_of(space), 128, 9, 11);
    f.feed(s);
    EXPECT_TRUE(canvas.holds(source_colours(space, s, first_column(), 2))) << "space " << space;
  }
}

INSTANTIATE_TEST_SUITE_P(MaskTable, RegionColumns,
                         ::testing::Values(std::make_tuple(16u, 77u), std::make_tuple(19u, 13u),
                                           std::make_tuple(22u, 3u), std::make_tuple(40u, 9u)));

}  // namespace
