// Derived Huffman tables, AC skip tables and the constant block tables.
#include "entropy/huffman.h"

#include "drivers/decoder.h"

extern "C" {

// Zig-zag index -> natural (row-major) position, with 16 guard entries so
// that a corrupt run carrying the position past 63 stays inside the block.
const uint8_t VETAJ_NATURAL_ORDER[80] = {
    0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,  12, 19, 26, 33,
    40, 48, 41, 34, 27, 20, 13, 6,  7,  14, 21, 28, 35, 42, 49, 56, 57, 50, 43, 36,
    29, 22, 15, 23, 30, 37, 44, 51, 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54,
    47, 55, 62, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63, 63};

// A magnitude value v of s bits is negative when v < entry s.
const int32_t VETAJ_HUFF_EXTEND_TEST[16] = {0,     0x1,    0x2,    0x4,   0x8,   0x10,
                                            0x20,  0x40,   0x80,   0x100, 0x200, 0x400,
                                            0x800, 0x1000, 0x2000, 0x4000};

}  // extern "C"

namespace {

// Fills `t` from `src`. Returns false for an invalid table.
bool build_derived(DerivedHuffTable* t, const HuffTable* src) {
  FastTables* fast = t->fast;  // kept across a rebuild in place
  KOLVAVETA_OsMemset(t, 0, sizeof(*t));
  t->fast = fast;
  t->source = src;
  uint8_t sizes[257];
  uint32_t codes[257];
  uint32_t count = 0;
  for (int l = 1; l <= 16; ++l) {
    for (uint32_t i = 0; i < src->bits[l]; ++i) {
      if (count >= 256) return false;  // more than 256 symbols
      sizes[count++] = static_cast<uint8_t>(l);
    }
  }
  sizes[count] = 0;
  // Canonical code assignment.
  uint32_t code = 0;
  uint32_t k = 0;
  uint32_t si = count > 0 ? sizes[0] : 0;
  while (k < count) {
    while (k < count && sizes[k] == si) codes[k++] = code++;
    if (code >= (1u << si)) return false;  // over-subscribed
    code <<= 1;
    ++si;
  }
  // maxcode / valoffset per length.
  uint32_t p = 0;
  for (int l = 1; l <= 16; ++l) {
    if (src->bits[l] != 0) {
      t->valoffset[l] = static_cast<int32_t>(p) - static_cast<int32_t>(codes[p]);
      p += src->bits[l];
      t->maxcode[l] = static_cast<int32_t>(codes[p - 1]);
    } else {
      t->maxcode[l] = -1;
    }
  }
  t->maxcode[17] = 0xFFFFF;
  // 8-bit lookahead.
  for (uint32_t& e : t->lookahead) e = kLongCode;
  for (uint32_t i = 0; i < count; ++i) {
    const uint32_t l = sizes[i];
    if (l > static_cast<uint32_t>(kLookaheadBits)) continue;
    const uint32_t shift = kLookaheadBits - l;
    const uint32_t first = codes[i] << shift;
    for (uint32_t j = 0; j < (1u << shift); ++j)
      t->lookahead[first + j] = (l << 8) | src->huffval[i];
  }
  return true;
}

// Skip entries over a window of kBits bits: every symbol whose code lies
// wholly inside the window, with its magnitude bits (which may run past
// it), until an end of block or more than 63 positions.
template <int kBits, int kAdvanceShift, class Entry>
void build_skip_entries(Entry* out, const DerivedHuffTable* t) {
  constexpr uint32_t kMask = (1u << kBits) - 1;
  for (uint32_t v = 0; v <= kMask; ++v) {
    uint32_t bits = 0;
    uint32_t advance = 0;
    for (;;) {
      if (bits >= kBits) break;
      // The code at `bits` into the window, looked up by its first 8 bits.
      const uint32_t rest = (v << bits) & kMask;
      const uint32_t e = t->lookahead[rest >> (kBits - 8)];
      const uint32_t len = (e >> 8) % 9;  // a long code gives 0
      if (len == 0 || bits + len > kBits) break;
      bits += len;
      const uint32_t r = (e >> 4) & 15;
      const uint32_t s = e & 15;
      if (s != 0) {
        advance += r + 1;
        bits += s;
      } else {
        advance += r < 15 ? kSkipEob : 16;
      }
      if (advance > 63) break;
    }
    out[v] = static_cast<Entry>(advance == 0 ? 0 : (bits | (advance << kAdvanceShift)));
  }
}

void build_skip_table(AcSkipTable* skip, const DerivedHuffTable* t) {
  build_skip_entries<8, 16>(skip->entry, t);
}

// Whole-coefficient entries: a code of at most 8 bits followed by its
// magnitude bits, within the window; an end of block or a run of 16 zeros
// gives value 0.
void build_fast_coefficients(int32_t* out, const DerivedHuffTable* t) {
  constexpr uint32_t kMask = (1u << kFastCoefBits) - 1;
  for (uint32_t v = 0; v <= kMask; ++v) {
    out[v] = 0;
    const uint32_t e = t->lookahead[v >> (kFastCoefBits - 8)];
    const uint32_t len = e >> 8;
    const uint32_t r = (e >> 4) & 15;
    const uint32_t s = e & 15;
    if (len > 8 || len + s > kFastCoefBits) continue;
    if (s == 0) {  // end of block or run of 16 zeros: value 0
      out[v] = static_cast<int32_t>((r << 8) | len);
      continue;
    }
    const uint32_t mag = (v >> (kFastCoefBits - len - s)) & ((1u << s) - 1);
    int32_t value = static_cast<int32_t>(mag);
    if (value < VETAJ_HUFF_EXTEND_TEST[s]) value += static_cast<int32_t>(1u - (1u << s));
    out[v] = static_cast<int32_t>(static_cast<uint32_t>(value) << 16) |
             static_cast<int32_t>(r << 8) | static_cast<int32_t>(len + s);
  }
}

bool skipping_wanted(const DecoderInfo* d) {
  if (d->scale_shift != 0 || d->region_map_flag != 0) return true;
  const DecInfo* o = d->owner;
  return o != nullptr && (o->region_mode != 0 || (o->options & KOLVAVETA_OPT_SKIP_TABLES) != 0);
}

int32_t prepare(DecoderInfo* d, int32_t is_dc, int32_t table_no, DerivedHuffTable** slot,
                EntropyState* entropy, bool progressive) {
  if (table_no < 0 || table_no > 3 || slot == nullptr) return vj::kStatusFail;
  const HuffTable* src = is_dc ? d->dc_huff[table_no] : d->ac_huff[table_no];
  if (src == nullptr) return vj::kStatusFail;
  DerivedHuffTable* t = progressive ? nullptr : *slot;
  if (t == nullptr) {
    t = vj::alloc_zeroed<DerivedHuffTable>();
    if (t == nullptr) return vj::kStatusFail;
    if (!vj_register_derived_table(d, t)) {
      KOLVAVETA_OsFree(t);
      return vj::kStatusFail;
    }
    *slot = t;
  }
  if (!build_derived(t, src)) return vj::kStatusFail;
  if (!progressive) {
    if (t->fast == nullptr) t->fast = vj::alloc_zeroed<FastTables>();
    if (t->fast == nullptr) return vj::kStatusFail;
    build_fast_coefficients(t->fast->coef, t);
    if (!is_dc) build_skip_entries<kWideSkipBits, kWideSkipAdvanceShift>(t->fast->skip, t);
  }
  if (is_dc) {
    uint32_t n = 0;
    for (int l = 1; l <= 16; ++l) n += src->bits[l];
    for (uint32_t i = 0; i < n; ++i)
      if (src->huffval[i] > 15) return vj::kStatusFail;
    return vj::kStatusOk;
  }
  // Skip tables serve baseline frames only (the progressive builder is used
  // for progressive frames and so never makes one).
  const bool baseline = d->marker != nullptr && d->marker->frame_kind == kFrameBaseline;
  if (progressive || entropy == nullptr || !baseline || !skipping_wanted(d)) return vj::kStatusOk;
  // The skip table follows its derived table: a table number redefined
  // between scans gets its skip table rebuilt too.
  AcSkipTable* skip = entropy->ac_skip[table_no];
  if (skip == nullptr) {
    skip = vj::alloc_zeroed<AcSkipTable>();
    if (skip == nullptr) return vj::kStatusFail;
    entropy->ac_skip[table_no] = skip;
  }
  entropy->ac_skip_copy[table_no] = skip;
  build_skip_table(skip, t);
  return vj::kStatusOk;
}

}  // namespace

void vj_free_derived_table(DerivedHuffTable*& table) {
  if (table != nullptr) vj::os_free(table->fast);
  vj::os_free(table);
}

int32_t VETAJ_PrepareDerivedTbl(DecoderInfo* d, int32_t is_dc, int32_t table_no,
                                DerivedHuffTable** slot, EntropyState* entropy) {
  return prepare(d, is_dc, table_no, slot, entropy, false);
}

int32_t VETAJ_P_PrepareDerivedTbl(DecoderInfo* d, int32_t is_dc, int32_t table_no,
                                  DerivedHuffTable** slot, EntropyState* entropy) {
  return prepare(d, is_dc, table_no, slot, entropy, true);
}
