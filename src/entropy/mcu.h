// Baseline MCU decoders (full size, reduced sizes, skipping) and restart
// marker handling.
#ifndef VETAJ_ENTROPY_MCU_H
#define VETAJ_ENTROPY_MCU_H

#include <cstdint>

struct DecoderInfo;
struct DerivedHuffTable;

// Decodes one MCU into the caller's zeroed blocks. 1 on success, 0 on failure.
int32_t VETAJ_DecodeMcu(DecoderInfo* decoder, int16_t** blocks);
// Reduced decoders: store only the coefficients the reduced transforms read
// (zig-zag positions 0..18, 0..4, 0..8 and the DC alone).
int32_t VETAJ_DecodeMcu_2to1(DecoderInfo* decoder, int16_t** blocks);
int32_t VETAJ_DecodeMcu_4to1(DecoderInfo* decoder, int16_t** blocks);
int32_t VETAJ_DecodeMcu_8to3(DecoderInfo* decoder, int16_t** blocks);
int32_t VETAJ_DecodeMcu_8to1(DecoderInfo* decoder, int16_t** blocks);
// Consumes one MCU without producing coefficients (DC predictors kept).
int32_t VETAJ_SkipMcu(DecoderInfo* decoder);
// Decodes one MCU requantising the AC values with the ratio tables.
int32_t VETAJ_FastDecodeMcu(DecoderInfo* decoder, int16_t** blocks);

// Restart processing before an MCU: 1 on success, 0 when the input ended.
int32_t VETAJ_ProcessRestartMarker(DecoderInfo* decoder);
// Region skipping with restart markers: 0 decode this MCU, 1 skipped to the
// next restart marker, 2 skipped without reading.
int32_t VETAJ_SkipMcuUsingRST(DecoderInfo* decoder);

// Working state of the out-of-line bit functions.
struct BitWorkState {
  uint32_t buffer;
  int32_t bits_left;
  DecoderInfo* decoder;
};
// Ensures nbits are available (end of input reads as zero bits after the
// insufficient-data flag is set). 1 on success, 0 on a read error.
int32_t VETAJ_ReadBits(BitWorkState* state, uint32_t buffer, int32_t bits_left, int32_t nbits);
// Code search from min_bits; the symbol, -1 on a read error, 0 for a code
// longer than 16 bits.
int32_t VETAJ_DecodeHuffMan(BitWorkState* state, uint32_t buffer, int32_t bits_left,
                            const DerivedHuffTable* table, int32_t min_bits);

#endif  // VETAJ_ENTROPY_MCU_H
