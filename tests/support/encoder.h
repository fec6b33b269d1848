// Synthetic JPEG streams encoded with libjpeg, for sizes and layouts the
// fixture corpus does not have.
#ifndef VETAJ_TESTS_SUPPORT_ENCODER_H
#define VETAJ_TESTS_SUPPORT_ENCODER_H

#if VETAJ_HAVE_LIBJPEG

#include <cstdint>
#include <vector>

namespace vjtest {

struct SyntheticPicture {
  int width = 64, height = 48;
  int components = 3;          // 1 (grey) or 3 (YCbCr with a JFIF marker)
  int h_samp = 2, v_samp = 2;  // luma sampling factors; chroma is 1x1
  int quality = 90;
  int restart_interval = 0;  // in MCUs
  uint32_t seed = 1;
};

// A baseline stream of a picture with gradients, hard edges and noise (the
// same picture for the same description).
std::vector<uint8_t> encode_synthetic(const SyntheticPicture& picture);

}  // namespace vjtest

#endif  // VETAJ_HAVE_LIBJPEG

#endif  // VETAJ_TESTS_SUPPORT_ENCODER_H
