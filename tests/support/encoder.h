// Synthetic JPEG streams encoded with libjpeg, for sizes and layouts the
// fixture corpus does not have.
#ifndef VETAJ_TESTS_SUPPORT_ENCODER_H
#define VETAJ_TESTS_SUPPORT_ENCODER_H

#if VETAJ_HAVE_LIBJPEG

#include <cstdint>
#include <vector>

namespace vjtest {

// A baseline 4:2:0 YCbCr stream (quality 90, restart interval in MCUs) of a
// picture with gradients, a disc, dark bars and a little noise.
std::vector<uint8_t> encode_synthetic(int width, int height, int restart_interval = 0);

}  // namespace vjtest

#endif  // VETAJ_HAVE_LIBJPEG

#endif  // VETAJ_TESTS_SUPPORT_ENCODER_H
