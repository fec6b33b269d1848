// Records owned by the decoder object besides the public DecInfo.
#ifndef VETAJ_API_DECINFO_H
#define VETAJ_API_DECINFO_H

#include "platform/common.h"

// Region decoding record kept in DecInfo.region_info; its first word is the
// one further buffer it owns.
struct RegionInfo {
  void* buffer;
  uint32_t words[8];
};

// Releases the retained decoder of an object (used by KOLVAVETA_DestroyJpegInfo).
extern "C" int32_t VETAJ_DestroyJpegInfo(DecInfo* object);

#endif  // VETAJ_API_DECINFO_H
