/* Compiled as C99 to prove the public header is valid C. */
#include "VetaJpegDecoder.h"

int vetaj_header_c_probe(void);
int vetaj_header_c_probe(void) {
  DecInfo info;
  JpegInfo summary;
  IoStream stream;
  (void)info;
  (void)stream;
  summary.width = 0;
  return (int)sizeof(JpegInfo) + summary.width + VETAJ_VERSION;
}
