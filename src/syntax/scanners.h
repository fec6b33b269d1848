// Light scanners that read a JPEG header summary, or find where the JPEG data
// ends, without building a decoder.
#ifndef VETAJ_SYNTAX_SCANNERS_H
#define VETAJ_SYNTAX_SCANNERS_H

#include <cstdint>

#include "io/stream.h"
#include "platform/common.h"

// Words of the header summary collected by VETAJ_SimpleParser.
enum SummaryWord : uint32_t {
  kSummaryWidth = 0,
  kSummaryHeight = 1,
  kSummaryProgressive = 2,  // 1 once an SOF2 was seen
  kSummaryRestart = 3,      // restart interval from DRI
  kSummaryMaxH = 4,         // largest sampling factors of an SOF0/SOF1 frame
  kSummaryMaxV = 5,
  kSummaryWords = 6,
};

// Reads from the window's position (at or before SOI) up to the first SOS and
// fills `result` (see SummaryWord). `mode` must be 8 or 2. Returns 200 at the
// first SOS and 201 on any failure: a malformed SOF0/SOF1/SOF2 segment, or an
// SOS not preceded by one of those frame headers.
int32_t VETAJ_SimpleParser(StreamWindow* window, int32_t mode, uint32_t result[kSummaryWords]);

// Walks from SOI through every segment and the entropy-coded data to the EOI
// marker. Fills result words 0..2 (width, height, progressive) and stores in
// *end_offset the absolute input offset just past EOI. Returns 200, or 201
// on failure (the offset is then left alone).
int32_t VETAJ_EOIParser(StreamWindow* window, int32_t mode, uint32_t result[3],
                        uint32_t* end_offset);

// Header summary of the JPEG data starting at info->jpeg_offset: fills width,
// height, progressive flag, restart interval and largest sampling factors
// and clears word 8. Returns 1, or 0 on failure.
int32_t VETAJ_GetHInfo(IoStream* stream, JpegInfo* info);

// Offset just past the EOI of the JPEG data starting at info->jpeg_offset;
// also fills width, height and progressive flag and clears word 8. Returns 0
// on failure.
uint32_t VETAJ_GetEOIOffset(IoStream* stream, JpegInfo* info);

#endif  // VETAJ_SYNTAX_SCANNERS_H
