#include "support/encoder.h"

#if VETAJ_HAVE_LIBJPEG

#include <algorithm>
#include <cstdio>  // jpeglib.h needs FILE and size_t
#include <cstdlib>

#include <jpeglib.h>

namespace vjtest {

std::vector<uint8_t> encode_synthetic(int width, int height, int restart_interval) {
  jpeg_compress_struct c;
  jpeg_error_mgr err;
  c.err = jpeg_std_error(&err);
  jpeg_create_compress(&c);
  unsigned char* out = nullptr;
  unsigned long out_size = 0;
  jpeg_mem_dest(&c, &out, &out_size);
  c.image_width = JDIMENSION(width);
  c.image_height = JDIMENSION(height);
  c.input_components = 3;
  c.in_color_space = JCS_RGB;
  jpeg_set_defaults(&c);
  jpeg_set_quality(&c, 90, TRUE);
  c.dct_method = JDCT_ISLOW;
  c.restart_interval = unsigned(restart_interval);
  jpeg_start_compress(&c, TRUE);
  std::vector<uint8_t> row(size_t(width) * 3);
  const int radius = std::min(width, height) / 4;
  while (c.next_scanline < c.image_height) {
    const int y = int(c.next_scanline);
    for (int x = 0; x < width; ++x) {
      for (int k = 0; k < 3; ++k) {
        int v = k == 0   ? x * 255 / width
                : k == 1 ? y * 255 / height
                         : (x + y) * 127 / (width + height);
        const int dx = x - width / 3, dy = y - height / 2;
        if (dx * dx + dy * dy < radius * radius) v = 230 - 40 * k;
        if ((x / 7) % 5 == 0 && (y / 3) % 4 != 0) v /= 3;
        uint32_t h =
            uint32_t(x) * 73856093u ^ uint32_t(y) * 19349663u ^ uint32_t(k + 1) * 83492791u;
        v += int((h ^ (h >> 13)) % 17) - 8;
        row[size_t(x * 3 + k)] = uint8_t(std::clamp(v, 0, 255));
      }
    }
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
