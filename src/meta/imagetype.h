// Image type detection: the signature test, the size readers of the other
// picture formats (PNG, BMP, GIF, WBMP) and the JPEG stream inside a TIFF
// container.
//
// Every reader works on a StreamWindow that starts at input offset 0 and
// writes the picture size into the object's image_width and image_height.
// The exported entry points are declared in the public header:
//   VETA_GetImageType(object, window)          type code from the first 8 bytes
//   VETA_Parse(object, window, info)           type code, size and summary
//   VETA_ParseJPEGOffset(object, window, info) the same, measuring a JPEG
//                                              inside a TIFF up to its EOI
//   __VETA_ParserGIF(object, window, info, minimum_delay)   4, 6 or 0
//   __VETA_ParserWBMP(object, window)          5 or 0
//   KOLVAVETA_GetImageType, KOLVAVETA_SimpleParserGIF, KOLVAVETA_GetJpegOffset
#ifndef VETAJ_META_IMAGETYPE_H
#define VETAJ_META_IMAGETYPE_H

#include <cstdint>

#include "io/stream.h"
#include "platform/common.h"

namespace vj {

// GIF and WBMP pictures wider or higher than this are refused.
constexpr uint32_t kMaxSmallImageSide = 5000;

}  // namespace vj

#endif  // VETAJ_META_IMAGETYPE_H
