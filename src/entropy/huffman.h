// Huffman decoding tables, the per-scan entropy state and the constant
// tables every block decoder uses.
#ifndef VETAJ_ENTROPY_HUFFMAN_H
#define VETAJ_ENTROPY_HUFFMAN_H

#include <cstdint>

#include "platform/common.h"

struct DecoderInfo;
struct HuffTable;

// Lookahead width of the derived tables.
constexpr int kLookaheadBits = 8;
// Lookahead entry of a code longer than 8 bits: length 9, symbol 0.
constexpr uint32_t kLongCode = 0x900;

struct FastTables;

// Decoding table built from a HuffTable.
struct DerivedHuffTable {
  int32_t maxcode[18];      // [l]: largest code of length l, -1 if none; [17] sentinel
  int32_t valoffset[17];    // [l]: index of the first symbol of length l minus its code
  const HuffTable* source;  // symbol values are read through it
  uint32_t lookahead[256];  // next 8 bits -> (length << 8) | symbol, or kLongCode
  FastTables* fast;         // wider tables of baseline tables (owned), or null
};

// Wider lookups of a baseline table, used where the window is known to hold
// the bits (skip entries for AC tables only; a DC table's coef entries give
// the difference's size as the symbol, with run 0):
// - coef: next 10 bits -> one whole symbol when its code and magnitude
//   fit: (value << 16) | (run << 8) | bits taken, value 0 for an end of
//   block (run below 15) or a run of 16 zeros (run 15); 0 otherwise;
// - skip: next 13 bits -> the symbols of AcSkipTable over a 13-bit window,
//   packed in 16 bits as bits | (advance << 6): the bit count sits in the
//   low six bits so that it can be used directly as a shift count.
constexpr int kFastCoefBits = 10;
constexpr int kWideSkipBits = 13;
constexpr int kWideSkipAdvanceShift = 6;
struct FastTables {
  int32_t coef[1 << kFastCoefBits];
  uint16_t skip[1 << kWideSkipBits];
};

// AC skip table: next 8 bits -> bits | (advance << 16). bits counts every
// stream bit of the symbols covered (magnitude bits included); advance is how
// far the block position moves, +128 once an end of block is met; 0 means no
// complete code in 8 bits.
struct AcSkipTable {
  uint32_t entry[256];
};
constexpr uint32_t kSkipEob = 128;

// Entropy state of the current scan.
struct EntropyState {
  uint8_t insufficient;  // zero bits were supplied after a marker
  uint32_t bit_buffer;   // valid bits are the low bits_left bits
  int32_t bits_left;
  int32_t last_dc[4];       // DC predictor per scan component
  uint32_t restarts_to_go;  // MCUs left before the next restart marker
  DerivedHuffTable* dc_tables[4];
  DerivedHuffTable* ac_tables[4];
  AcSkipTable* ac_skip[4];
  DerivedHuffTable* block_dc[10];
  DerivedHuffTable* block_ac[10];
  AcSkipTable* block_skip[10];
  uint32_t* block_multipliers[10];
  uint32_t* block_ratios[10];
  AcSkipTable* ac_skip_copy[4];
};

// Frees a derived table with its wider lookups, and clears the pointer.
void vj_free_derived_table(DerivedHuffTable*& table);

// Builds (or rebuilds in place) the derived table of a baseline scan.
int32_t VETAJ_PrepareDerivedTbl(DecoderInfo* decoder, int32_t is_dc, int32_t table_no,
                                DerivedHuffTable** slot, EntropyState* entropy);
// Progressive form: always builds a new table.
int32_t VETAJ_P_PrepareDerivedTbl(DecoderInfo* decoder, int32_t is_dc, int32_t table_no,
                                  DerivedHuffTable** slot, EntropyState* entropy);

#endif  // VETAJ_ENTROPY_HUFFMAN_H
