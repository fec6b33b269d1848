// Whole-image decodes through the public interface, with a guard area behind
// the output buffer, and the full-size pictures they are compared with.
#ifndef VETAJ_TESTS_SUPPORT_DECODING_H
#define VETAJ_TESTS_SUPPORT_DECODING_H

#include <cstdint>
#include <memory>
#include <vector>

#include "VetaJpegDecoder.h"
#include "support/pictures.h"

namespace vjtest {

using Bytes = std::vector<uint8_t>;

// A decoder object, destroyed with its header summary.
struct ObjectCloser {
  void operator()(DecInfo* object) const;
};
using Object = std::unique_ptr<DecInfo, ObjectCloser>;
// An object over a memory image (which must outlive it).
Object open_memory(const Bytes& jpeg, int format = KOLVAVETA_FMT_RGBA8888,
                   uint32_t options = KOLVAVETA_OPT_THUMB_NEVER);

struct DecodeRequest {
  int format = KOLVAVETA_FMT_RGBA8888;
  int width = 0, height = 0;  // the buffer, in pixels
  uint32_t options = KOLVAVETA_OPT_THUMB_NEVER;
  int mode = KOLVAVETA_MODE_BEST;
  uint32_t sample_size = 0;
};

// The result of KOLVAVETA_DecodeJPEG and the object's fields afterwards.
struct Decoded {
  int ok = 0;
  int error = 0;
  int output_width = 0, output_height = 0;
  int image_width = 0;
  uint32_t options = 0;
  int decode_mode = 0;
  uint32_t sample_size = 0;
  std::vector<uint8_t> buffer;  // buffer_bytes(format, width, height), filled with kFill first
  bool guard_intact = true;     // nothing was written behind the buffer
  bool kept_decoder = false;    // the object holds a decoder afterwards
};

// Decodes on an existing object after setting its format, options, mode and
// sample size; or a memory image on a fresh object.
Decoded decode_on(DecInfo* object, const DecodeRequest& request);
Decoded decode_bytes(const Bytes& jpeg, const DecodeRequest& request);

// The decode succeeded, wrote nothing behind its buffer and left exactly the
// buffer that `where` and `colour` describe.
::testing::AssertionResult shows(const Decoded& decoded, const Placement& where,
                                 const ColourAt& colour);

// The frame size from the header summary; false when there is none.
bool frame_size(const Bytes& jpeg, int* width, int* height);

struct FullPicture {
  int width = 0, height = 0;
  ColourAt at;
};
// The picture of libjpeg's full-size samples (box upsampling) under the
// colour space given (colour_in).
bool oracle_picture(const Bytes& jpeg, int space, FullPicture* out);
// The whole picture at full size: YCbCr frames from libjpeg, other colour
// spaces (and every frame without libjpeg) the library's own RGBA decode,
// which the decode tests compare with libjpeg.
bool full_picture(const Bytes& jpeg, FullPicture* out);

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_DECODING_H
