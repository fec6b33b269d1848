// Progressive MCU decoders: DC first pass, DC refinement, AC first pass and
// AC refinement. Each consumes one MCU of the current scan into the caller's
// blocks (which hold the coefficients of earlier scans) and returns 1, or 0
// on failure.
#ifndef VETAJ_ENTROPY_PROGRESSIVE_H
#define VETAJ_ENTROPY_PROGRESSIVE_H

#include <cstdint>

struct DecoderInfo;

int32_t VETAJ_ProgDecodeMcu_DC(DecoderInfo* decoder, int16_t** blocks);
int32_t VETAJ_ProgDecodeMcu_AC(DecoderInfo* decoder, int16_t** blocks);
int32_t VETAJ_ProgDecodeMcuRefine_DC(DecoderInfo* decoder, int16_t** blocks);
int32_t VETAJ_ProgDecodeMcuRefine_AC(DecoderInfo* decoder, int16_t** blocks);
// First pass of either kind (DC when Ss is 0).
int32_t VETAJ_ProgDecodeMcu(DecoderInfo* decoder, int16_t** blocks);

#endif  // VETAJ_ENTROPY_PROGRESSIVE_H
