#include "support/encoder.h"

#if VETAJ_HAVE_LIBJPEG

#include <cstdio>
#include <cstdlib>

#include <jpeglib.h>

namespace vjtest {
namespace {

// Sample c of pixel (x, y): diagonal gradients, a bright disc, a grid of
// dark bars and a little hashed noise.
uint8_t sample(const SyntheticPicture& s, int x, int y, int c) {
  int v = c == 0   ? x * 255 / s.width
          : c == 1 ? y * 255 / s.height
                   : (x + y) * 127 / (s.width + s.height);
  const int dx = x - s.width / 3, dy = y - s.height / 2,
            r = (s.width < s.height ? s.width : s.height) / 4;
  if (dx * dx + dy * dy < r * r) v = 230 - 40 * c;
  if ((x / 7) % 5 == 0 && (y / 3) % 4 != 0) v /= 3;
  uint32_t h =
      uint32_t(x) * 73856093u ^ uint32_t(y) * 19349663u ^ (s.seed + uint32_t(c)) * 83492791u;
  h ^= h >> 13;
  v += int(h % 17) - 8;
  return uint8_t(v < 0 ? 0 : v > 255 ? 255 : v);
}

}  // namespace

std::vector<uint8_t> encode_synthetic(const SyntheticPicture& s) {
  jpeg_compress_struct c;
  jpeg_error_mgr err;
  c.err = jpeg_std_error(&err);
  jpeg_create_compress(&c);
  unsigned char* out = nullptr;
  unsigned long out_size = 0;
  jpeg_mem_dest(&c, &out, &out_size);
  c.image_width = JDIMENSION(s.width);
  c.image_height = JDIMENSION(s.height);
  c.input_components = s.components;
  c.in_color_space = s.components == 1 ? JCS_GRAYSCALE : JCS_RGB;
  jpeg_set_defaults(&c);
  jpeg_set_quality(&c, s.quality, TRUE);
  c.dct_method = JDCT_ISLOW;
  if (s.components == 3) {
    c.comp_info[0].h_samp_factor = s.h_samp;
    c.comp_info[0].v_samp_factor = s.v_samp;
  }
  c.restart_interval = unsigned(s.restart_interval);
  jpeg_start_compress(&c, TRUE);
  std::vector<uint8_t> row(size_t(s.width) * size_t(s.components));
  while (c.next_scanline < c.image_height) {
    const int y = int(c.next_scanline);
    for (int x = 0; x < s.width; ++x)
      for (int k = 0; k < s.components; ++k) row[size_t(x * s.components + k)] = sample(s, x, y, k);
    JSAMPROW rows[1] = {row.data()};
    jpeg_write_scanlines(&c, rows, 1);
  }
  jpeg_finish_compress(&c);
  std::vector<uint8_t> bytes(out, out + out_size);
  jpeg_destroy_compress(&c);
  std::free(out);
  return bytes;
}

}  // namespace vjtest

#endif  // VETAJ_HAVE_LIBJPEG
