// Baseline MCU decoding: one routine per coefficient range, each running
// on the fast or the careful byte-fetch policy of the bit reader.
#include "entropy/mcu.h"

#include <cstring>

#include "entropy/bitreader.h"

namespace vj {

bool g_entropy_careful_only = false;

uint32_t entropy_top_up(DecoderInfo* d, uint32_t want) {
  StreamWindow* w = d->window;
  IoStream* s = w->stream;
  if (w->remaining >= want || s == nullptr) return w->remaining;
  if (s->kind == kIoMemory || s->kind == kIoMemoryOwned) {
    // The block is contiguous: further bytes simply follow the window.
    while (w->remaining < want) {
      uint8_t* at = nullptr;
      const int32_t n = KOLVAVETA_Read_IO2(s, &at, kWindowSize);
      if (n <= 0) break;
      if (w->remaining == 0) w->window = at;
      w->remaining += static_cast<uint32_t>(n);
      w->consumed += static_cast<uint32_t>(n);
    }
    d->input_buffer = w->window;
    return w->remaining;
  }
  uint8_t* buffer = w->buffer != nullptr ? w->buffer : d->input_buffer;
  if (buffer == nullptr) return w->remaining;
  if (w->remaining > 0 && w->window != buffer) std::memmove(buffer, w->window, w->remaining);
  w->window = buffer;
  w->index = 0;
  while (w->remaining < kWindowSize) {
    uint8_t* dst = buffer + w->remaining;
    const int32_t n = KOLVAVETA_Read_IO2(s, &dst, kWindowSize - w->remaining);
    if (n <= 0) break;
    w->remaining += static_cast<uint32_t>(n);
    w->consumed += static_cast<uint32_t>(n);
    if (w->remaining >= want && w->remaining >= kWindowSize / 2) break;
  }
  d->input_buffer = buffer;
  return w->remaining;
}

}  // namespace vj

namespace {

using vj::BitReader;
using vj::CarefulFetch;
using vj::FastFetch;

// The block and skipping loops keep their bit state in registers only when
// inlined into the MCU loop.
#define VJ_ALWAYS_INLINE inline __attribute__((always_inline))

// What a decoder keeps of each block.
enum class Keep {
  kAll,   // decode and store coefficients up to a zig-zag limit
  kNone,  // skip: only the DC predictor is kept up to date
};

// What one skip-table lookup means at block position k.
enum class SkipStep { kGoOn, kEnds, kByHand };

// Fields of a skip entry; advance 0 means no complete code in the window.
struct SkipEntry {
  int32_t advance;
  int32_t nbits;
};
inline SkipEntry narrow_entry(uint32_t e) {
  return {static_cast<int32_t>(e >> 16), static_cast<int32_t>(e & 0xFFFF)};
}
inline SkipEntry wide_entry(uint32_t e) {
  return {static_cast<int32_t>(e >> kWideSkipAdvanceShift), static_cast<int32_t>(e & 63)};
}

// The common case takes the lookup's symbols and the block goes on; the
// block can also end inside the lookup (an end of block, or exactly at
// position 63); otherwise the lookup runs past the block or holds no
// complete code, and the next symbol is taken by hand.
template <class R>
inline SkipStep take_lookup(R& r, SkipEntry entry, int32_t* k) {
  if (entry.advance == 0) return SkipStep::kByHand;
  const int32_t eob = static_cast<int32_t>(kSkipEob);
  if (*k + entry.advance < 64) {
    r.bits -= entry.nbits;  // may go negative: the next refill restores it
    *k += entry.advance;
    return SkipStep::kGoOn;
  }
  if ((entry.advance >= eob && *k + entry.advance - eob < 64) ||
      (entry.advance < eob && *k + entry.advance == 64)) {
    r.bits -= entry.nbits;
    return SkipStep::kEnds;
  }
  return SkipStep::kByHand;
}

// One AC symbol decoded and stepped over. False at the end of the block
// (`*ok` tells whether the input held out).
template <class R>
inline bool skip_symbol(R& r, const DerivedHuffTable* act, int32_t* k, bool* ok) {
  const int32_t rs = r.decode(act);
  *ok = rs >= 0;
  if (rs < 0) return false;
  const int32_t run = rs >> 4;
  const int32_t s = rs & 15;
  if (s != 0) {
    *k += run + 1;
    *ok = r.drop(s);
    return *ok;
  }
  if (run != 15) return false;  // end of block
  *k += 16;
  return true;
}

// Bit state of the fast policy on 64-bit hosts. The next bits are held
// left-aligned in a 64-bit word, so that one lookup is a shift right, a load
// and a shift left by the entry's bit count: the shortest chain from one
// group of symbols to the next. A refill keeps at least 56 bits, enough for
// two skip lookups of at most 28 bits each or one DC difference. When the
// window's next 8 bytes hold no 0xFF they are merged in whole (bits below
// the valid ones are then the next bytes themselves, so merging them again
// changes nothing); otherwise bytes are taken one at a time with the
// stuffing and marker rules of FastFetch.
struct LeftBits {
  uint64_t left;
  int32_t have;  // valid bits at the top of `left`
  const uint8_t* cur;

  template <class R>
  void load(R& r) {
    if (r.bits < 0) R::Fetch::fill(r);  // bits owed from a skip lookup
    left = r.bits > 0 ? static_cast<uint64_t>(r.buf) << (64 - r.bits) : 0;
    have = r.bits;
    cur = r.cur;
  }
  template <class R>
  void store(R& r) const {
    r.buf = have > 0 ? static_cast<typename R::Word>(left >> (64 - have)) : 0;
    r.bits = have;
    r.avail -= static_cast<uint32_t>(cur - r.cur);
    r.cur = cur;
  }
  template <class R>
  VJ_ALWAYS_INLINE void refill(R& r) {
    uint64_t w;
    std::memcpy(&w, cur, 8);
    const uint64_t inv = ~w;  // a 0xFF byte becomes a zero byte
    if (((inv - 0x0101010101010101ull) & ~inv & 0x8080808080808080ull) == 0) {
      left |= __builtin_bswap64(w) >> have;
      cur += (63 - have) >> 3;
      have |= 56;
      return;
    }
    while (have <= 56) {
      uint64_t c = cur[0];
      if (c == 0xFF) {
        if (cur[1] == 0x00) {
          cur += 2;
        } else {
          c = 0;  // a marker: zeros from here on, the cursor stays on it
          r.marker_seen = true;
        }
      } else {
        ++cur;
      }
      left |= c << (56 - have);
      have += 8;
    }
  }
  uint32_t peek(int n) const { return static_cast<uint32_t>(left >> (64 - n)); }
  void drop(uint32_t n) {
    left <<= n & 63;
    have -= static_cast<int32_t>(n & 63);
  }
};

// Steps over AC data from position *k with the 13-bit skip table. True when
// the block ended; false when the next symbol must be taken by hand (a code
// longer than 8 bits, or a lookup running past the block), with *k where
// that symbol starts.
template <class R>
VJ_ALWAYS_INLINE bool skip_ac_left(LeftBits& lb, R& r, const uint16_t* wide, int32_t* k_io) {
  int32_t k = *k_io;
  uint32_t e;
  int32_t advance;
  for (;;) {
    lb.refill(r);
    e = wide[lb.peek(kWideSkipBits)];
    advance = static_cast<int32_t>(e >> kWideSkipAdvanceShift);
    if (e == 0 || k + advance > 63) break;
    lb.drop(e);
    k += advance;
    e = wide[lb.peek(kWideSkipBits)];
    advance = static_cast<int32_t>(e >> kWideSkipAdvanceShift);
    if (e == 0 || k + advance > 63) break;
    lb.drop(e);
    k += advance;
  }
  *k_io = k;
  const int32_t eob = static_cast<int32_t>(kSkipEob);
  if (e != 0 && ((advance >= eob && k + advance - eob < 64) || k + advance == 64)) {
    lb.drop(e);
    return true;
  }
  return false;
}

// Skips the rest of a block from position k on left-aligned bits, taking
// symbols by hand where the table cannot. False when the input ended.
template <class R>
VJ_ALWAYS_INLINE bool skip_rest_left(LeftBits& lb, R& r, const DerivedHuffTable* act,
                                     const uint16_t* wide, int32_t k) {
  while (k < 64 && !skip_ac_left(lb, r, wide, &k)) {
    lb.store(r);
    bool ok = true;
    const bool more = skip_symbol(r, act, &k, &ok);
    lb.load(r);
    if (!more) return ok;
  }
  return true;
}

// Bits one symbol can take from left-aligned bits: a code of at most 8 bits
// (longer ones go through the bit reader) and 15 magnitude bits.
constexpr int32_t kMaxSymbolBits = 8 + 15;

// A magnitude of s bits taken from left-aligned bits, extended to its
// signed value.
VJ_ALWAYS_INLINE int32_t take_magnitude(LeftBits& lb, int32_t s) {
  const int32_t v = static_cast<int32_t>(lb.peek(s));
  lb.drop(static_cast<uint32_t>(s));
  const int32_t negative = (v - VETAJ_HUFF_EXTEND_TEST[s]) >> 31;  // all ones or 0
  return v + (negative & static_cast<int32_t>(1u - (1u << s)));
}

// One Huffman symbol from left-aligned bits through the 8-bit lookahead,
// or by the bit-by-bit search for a longer code.
template <class R>
VJ_ALWAYS_INLINE int32_t symbol_left(LeftBits& lb, R& r, const DerivedHuffTable* t) {
  const uint32_t e = t->lookahead[lb.peek(8)];
  if ((e >> 8) <= 8) {
    lb.drop(e >> 8);
    return static_cast<int32_t>(e & 0xFF);
  }
  lb.store(r);
  const int32_t sym = r.decode(t);
  lb.load(r);
  return sym;
}

// Steps over the AC data of one block with the skip table, several symbols
// per lookup; ends exactly where a full decode of the block would.
template <class R>
inline bool skip_ac(R& r, const DerivedHuffTable* act, const AcSkipTable* skip, int32_t k) {
  bool ok = true;
  // Where the window holds the bits, the 13-bit table of the same symbols
  // covers more symbols per lookup.
  const uint16_t* wide = nullptr;
  if constexpr (R::kFast) {
    if (act->fast != nullptr) wide = act->fast->skip;
    if constexpr (sizeof(typename R::Word) == 8) {
      if (wide != nullptr) {
        LeftBits lb;
        lb.load(r);
        ok = skip_rest_left(lb, r, act, wide, k);
        lb.store(r);
        return ok;
      }
    }
  }
  while (k < 64) {
    r.prefetch8();
    if (r.bits >= 8) {
      const SkipStep step = take_lookup(r,
                                        wide != nullptr ? wide_entry(wide[r.peek(kWideSkipBits)])
                                                        : narrow_entry(skip->entry[r.peek(8)]),
                                        &k);
      if (step == SkipStep::kGoOn) continue;
      if (step == SkipStep::kEnds) return true;
    }
    if (!skip_symbol(r, act, &k, &ok)) return ok;
  }
  return true;
}

// The bit reader seen through left-aligned bits (64-bit fast policy, every
// table of the MCU with its wide tables): the same operations as BitReader
// for the block decoder, with the skip table always at hand.
template <class R>
struct LeftReader {
  static constexpr bool kFast = true;
  R& r;
  LeftBits lb;

  explicit LeftReader(R& reader) : r(reader) { lb.load(r); }
  void store() { lb.store(r); }
  void prefetch8() {
    if (lb.have < kMaxSymbolBits) lb.refill(r);
  }
  uint32_t peek(int32_t n) const { return lb.peek(n); }
  void consume(int32_t n) { lb.drop(static_cast<uint32_t>(n)); }
  int32_t decode(const DerivedHuffTable* t) { return symbol_left(lb, r, t); }
  bool receive(int32_t s, int32_t* value) {
    *value = take_magnitude(lb, s);
    return true;
  }
  bool drop(int32_t s) {
    lb.drop(static_cast<uint32_t>(s));
    return true;
  }
};

// Whether the rest of a block can be stepped over with a skip table, and
// doing so.
template <class F>
inline bool can_skip(const BitReader<F>&, const AcSkipTable* skip) {
  return skip != nullptr;
}
template <class R>
inline bool can_skip(const LeftReader<R>&, const AcSkipTable*) {
  return true;
}
template <class F>
inline bool skip_rest(BitReader<F>& r, const DerivedHuffTable* act, const AcSkipTable* skip,
                      int32_t k) {
  return skip_ac(r, act, skip, k);
}
template <class R>
VJ_ALWAYS_INLINE bool skip_rest(LeftReader<R>& src, const DerivedHuffTable* act, const AcSkipTable*,
                                int32_t k) {
  return skip_rest_left(src.lb, src.r, act, act->fast->skip, k);
}

// Decodes one block: the DC difference, then the coefficients up to zig-zag
// position kLastStored (stored when kStore). Past that position the rest of
// the block is stepped over with the skip table when there is one, else
// decoded and dropped. Where the source holds the bits for it (kFast), a
// whole coefficient or DC difference comes from one lookup of the next 10
// bits when its code and magnitude fit. False when the input ended.
template <int kLastStored, bool kStore, class Src>
VJ_ALWAYS_INLINE bool decode_block(Src& src, const DerivedHuffTable* dct,
                                   const DerivedHuffTable* act, const AcSkipTable* skip,
                                   int16_t* blk, int32_t* pred, int32_t* last_out) {
  *last_out = 0;
  src.prefetch8();
  int32_t dc_entry = 0;
  if constexpr (Src::kFast) {
    if (dct->fast != nullptr) dc_entry = dct->fast->coef[src.peek(kFastCoefBits)];
  }
  if (dc_entry != 0) {
    src.consume(dc_entry & 0xFF);
    *pred += dc_entry >> 16;
  } else {
    const int32_t s = src.decode(dct);
    if (s < 0) return false;
    int32_t diff = 0;
    if (s != 0 && !src.receive(s, &diff)) return false;
    *pred += diff;
  }
  if constexpr (kStore) blk[0] = static_cast<int16_t>(*pred);
  const bool skipping = can_skip(src, skip);
  if constexpr (kLastStored == 0) {
    if (skipping) return skip_rest(src, act, skip, 1);
  }
  const int32_t* fast = nullptr;
  if constexpr (Src::kFast) {
    if (act->fast != nullptr) fast = act->fast->coef;
  }
  int32_t last = 0;
  for (int32_t k = 1; k < 64; ++k) {
    src.prefetch8();
    const int32_t fe = fast != nullptr ? fast[src.peek(kFastCoefBits)] : 0;
    int32_t v = 0;
    int32_t run;
    int32_t s = 0;
    if (fe != 0) {
      src.consume(fe & 0xFF);
      run = (fe >> 8) & 15;
      v = fe >> 16;
      if (v == 0) {  // end of block, or 16 zeros
        if (run != 15) break;
        k += 15;
        continue;
      }
    } else {
      const int32_t rs = src.decode(act);
      if (rs < 0) return false;
      run = rs >> 4;
      s = rs & 15;
      if (s == 0) {
        if (run != 15) break;  // end of block
        k += 15;
        continue;
      }
    }
    k += run;
    if (kLastStored == 63 || k <= kLastStored) {
      if (s != 0 && !src.receive(s, &v)) return false;
      if constexpr (kStore) blk[VETAJ_NATURAL_ORDER[k]] = static_cast<int16_t>(v);
      last = k;
      continue;
    }
    // Past the kept range.
    if (s != 0 && !src.drop(s)) return false;
    if (skipping) {
      *last_out = last;
      return skip_rest(src, act, skip, k + 1);
    }
  }
  *last_out = last;
  return true;
}

// The blocks of one MCU from one bit source.
template <int kLastStored, Keep kKeep, bool kDcCheck, class Src>
bool run_blocks(Src& src, DecoderInfo* d, int16_t** blocks, int32_t* pred, bool* dc_bad) {
  constexpr bool kStore = kKeep == Keep::kAll;
  const EntropyState* e = d->entropy;
  const uint32_t nb = d->blocks_in_mcu;
  for (uint32_t b = 0; b < nb; ++b) {
    const DerivedHuffTable* dct = e->block_dc[b];
    const DerivedHuffTable* act = e->block_ac[b];
    if (dct == nullptr || act == nullptr) return false;
    int32_t* p = &pred[d->mcu_membership[b] & 3];
    const AcSkipTable* skip = !kStore || kLastStored < 63 ? e->block_skip[b] : nullptr;
    int32_t last;
    if (!decode_block < kStore ? kLastStored : 0,
        kStore > (src, dct, act, skip, kStore ? blocks[b] : nullptr, p, &last))
      return false;
    if constexpr (kStore) d->last_nonzero[b] = last;
    if constexpr (kDcCheck) {
      if (*p < -2047 || *p > 2047) *dc_bad = true;
    }
  }
  return true;
}

// The blocks of one MCU on one fetch policy: on 64-bit hosts the fast
// policy works on left-aligned bits when every table has its wide tables.
template <int kLastStored, Keep kKeep, bool kDcCheck, class Fetch>
bool run_mcu(BitReader<Fetch>& r, DecoderInfo* d, int16_t** blocks, bool* dc_out_of_range) {
  EntropyState* e = d->entropy;
  int32_t pred[4] = {e->last_dc[0], e->last_dc[1], e->last_dc[2], e->last_dc[3]};
  bool left = false;
  if constexpr (Fetch::kFast && sizeof(typename Fetch::Word) == 8) {
    left = true;
    for (uint32_t b = 0; b < d->blocks_in_mcu; ++b) {
      const DerivedHuffTable* dct = e->block_dc[b];
      const DerivedHuffTable* act = e->block_ac[b];
      left =
          left && dct != nullptr && dct->fast != nullptr && act != nullptr && act->fast != nullptr;
    }
    if (left) {
      LeftReader<BitReader<Fetch>> src(r);
      if (!run_blocks<kLastStored, kKeep, kDcCheck>(src, d, blocks, pred, dc_out_of_range))
        return false;
      src.store();
    }
  }
  if (!left && !run_blocks<kLastStored, kKeep, kDcCheck>(r, d, blocks, pred, dc_out_of_range))
    return false;
  for (int i = 0; i < 4; ++i) e->last_dc[i] = pred[i];
  return true;
}

// An MCU that is not decoded leaves its blocks empty.
inline void clear_last(DecoderInfo* d) {
  for (uint32_t b = 0; b < d->blocks_in_mcu; ++b) d->last_nonzero[b] = 0;
}

// Shared MCU entry: restarts, the insufficient-data rule, then the fast
// policy when the window holds enough bytes, else (or after a marker) the
// careful one.
template <int kLastStored, Keep kKeep, bool kDcCheck>
int32_t decode_mcu(DecoderInfo* d, int16_t** blocks) {
  EntropyState* e = d->entropy;
  if (e == nullptr || d->window == nullptr) return 0;
  if (d->restart_interval != 0) {
    if (e->restarts_to_go == 0 && VETAJ_ProcessRestartMarker(d) == 0) return 0;
    if (d->index_use_state == 0 && d->region_map_flag == 0) {
      const int32_t skip = VETAJ_SkipMcuUsingRST(d);
      if (skip == 1 || skip == 2) {
        clear_last(d);
        return 1;
      }
    }
  }
  if (e->insufficient != 0) {
    clear_last(d);
    --e->restarts_to_go;
    return 1;
  }
  const uint32_t nb = d->blocks_in_mcu;
  bool dc_bad = false;
  if (vj::fast_policy_fits(d, nb)) {
    const int32_t saved_dc[4] = {e->last_dc[0], e->last_dc[1], e->last_dc[2], e->last_dc[3]};
    BitReader<FastFetch> fast(d);
    if (run_mcu<kLastStored, kKeep, kDcCheck>(fast, d, blocks, &dc_bad) && !fast.marker_seen) {
      fast.store();
      --e->restarts_to_go;
      return dc_bad ? 0 : 1;
    }
    // A marker was met: decode this MCU again with the exact refill rule.
    for (int i = 0; i < 4; ++i) e->last_dc[i] = saved_dc[i];
    if constexpr (kKeep != Keep::kNone) {
      for (uint32_t b = 0; b < nb; ++b) std::memset(blocks[b], 0, 64 * sizeof(int16_t));
    }
    dc_bad = false;
  }
  BitReader<CarefulFetch> careful(d);
  const bool ok = run_mcu<kLastStored, kKeep, kDcCheck>(careful, d, blocks, &dc_bad);
  careful.store();
  if (!ok) return 0;
  --e->restarts_to_go;
  return dc_bad ? 0 : 1;
}

}  // namespace

int32_t VETAJ_DecodeMcu(DecoderInfo* d, int16_t** blocks) {
  return decode_mcu<63, Keep::kAll, false>(d, blocks);
}
int32_t VETAJ_DecodeMcu_2to1(DecoderInfo* d, int16_t** blocks) {
  return decode_mcu<18, Keep::kAll, false>(d, blocks);
}
int32_t VETAJ_DecodeMcu_4to1(DecoderInfo* d, int16_t** blocks) {
  return decode_mcu<4, Keep::kAll, false>(d, blocks);
}
int32_t VETAJ_DecodeMcu_8to3(DecoderInfo* d, int16_t** blocks) {
  return decode_mcu<8, Keep::kAll, false>(d, blocks);
}
int32_t VETAJ_DecodeMcu_8to1(DecoderInfo* d, int16_t** blocks) {
  return decode_mcu<0, Keep::kAll, true>(d, blocks);
}
int32_t VETAJ_SkipMcu(DecoderInfo* d) { return decode_mcu<0, Keep::kNone, false>(d, nullptr); }

int32_t VETAJ_FastDecodeMcu(DecoderInfo* d, int16_t** blocks) {
  const int32_t early = vj::begin_mcu(d, true);
  if (early >= 0) return early;
  EntropyState* e = d->entropy;
  const uint32_t nb = d->blocks_in_mcu;
  const uint32_t first = vj::blocks_passed_by_eob_run(d);
  if (first == nb) {
    --e->restarts_to_go;
    return 1;
  }
  BitReader<CarefulFetch> r(d);
  int32_t pred[4] = {e->last_dc[0], e->last_dc[1], e->last_dc[2], e->last_dc[3]};
  const int32_t ss = static_cast<int32_t>(d->Ss);
  const int32_t se = static_cast<int32_t>(d->Se > 63 ? 63 : d->Se);
  for (uint32_t b = first; b < nb; ++b) {
    const DerivedHuffTable* dct = e->block_dc[b];
    const DerivedHuffTable* act = e->block_ac[b];
    const uint32_t* ratio = e->block_ratios[b];
    if (dct == nullptr || act == nullptr) {
      r.store();
      return 0;
    }
    int16_t* blk = blocks[b];
    int32_t* p = &pred[d->mcu_membership[b] & 3];
    int32_t s = r.decode(dct);
    int32_t diff = 0;
    if (s < 0 || (s != 0 && !r.receive(s, &diff))) {
      r.store();
      return 0;
    }
    *p += diff;
    blk[0] = static_cast<int16_t>(*p);
    int32_t last = 0;
    for (int32_t k = ss + 1; k <= se; ++k) {
      const int32_t rs = r.decode(act);
      if (rs < 0) {
        r.store();
        return 0;
      }
      const int32_t run = rs >> 4;
      s = rs & 15;
      if (s != 0) {
        k += run;
        int32_t v;
        if (!r.receive(s, &v)) {
          r.store();
          return 0;
        }
        // Requantise in Q13, rounding toward zero.
        const int32_t rk = ratio != nullptr ? static_cast<int32_t>(ratio[k & 63]) : 0x2000;
        const int32_t t = v > 0 ? v * rk : v * rk + 0x1FFF;
        const int32_t q = t >> 13;
        if (q != 0) {
          blk[VETAJ_NATURAL_ORDER[k]] = static_cast<int16_t>(q);
          last = k;
        }
      } else {
        if (run != 15) break;
        k += 15;
      }
    }
    d->last_nonzero[b] = last;
  }
  for (int i = 0; i < 4; ++i) e->last_dc[i] = pred[i];
  r.store();
  --e->restarts_to_go;
  return 1;
}

int32_t VETAJ_ProcessRestartMarker(DecoderInfo* d) {
  EntropyState* e = d->entropy;
  MarkerState* m = d->marker;
  if (e == nullptr || m == nullptr) return 0;
  if (e->bits_left > 0) m->discarded += static_cast<uint32_t>(e->bits_left) / 8;
  e->bits_left = 0;
  if (d->unread_marker == 0) {
    BitReader<CarefulFetch> r(d);
    for (;;) {
      int32_t c = CarefulFetch::raw(r);
      if (c < 0) {
        r.store();
        return 0;
      }
      if (c != 0xFF) {
        ++m->discarded;
        continue;
      }
      do {
        c = CarefulFetch::raw(r);
      } while (c == 0xFF);
      if (c < 0) {
        r.store();
        return 0;
      }
      if (c == 0) {
        m->discarded += 2;
        continue;
      }
      d->unread_marker = static_cast<uint32_t>(c);
      break;
    }
    r.bits = 0;
    r.store();
  }
  if (d->unread_marker == 0xD0u + m->next_restart) d->unread_marker = 0;
  m->next_restart = static_cast<uint8_t>((m->next_restart + 1) & 7);
  // Every predictor of the scan starts again (a scan of one component keeps
  // its predictor at the component's frame index), and so does an
  // end-of-band run.
  for (int32_t& p : e->last_dc) p = 0;
  d->eob_run = 0;
  if (d->unread_marker == 0) e->insufficient = 0;
  e->restarts_to_go = d->restart_interval;
  return 1;
}

int32_t VETAJ_SkipMcuUsingRST(DecoderInfo* d) {
  const DecInfo* o = d->owner;
  if (o == nullptr || o->region_mode == 0 || d->restart_interval == 0) return 0;
  const uint32_t mcu_h = d->mcu_height_px != 0 ? d->mcu_height_px : 8;
  const uint32_t mcu_w = d->mcu_width_px != 0 ? d->mcu_width_px : 8;
  const uint32_t first_row = o->region_top / mcu_h;
  const uint32_t row = d->current_mcu_row;
  const uint32_t col = d->current_mcu_col;
  if (row >= first_row) return 0;
  const uint64_t here = uint64_t(row) * d->mcus_per_row + col;
  if (here > uint64_t(d->mcus_per_row) * first_row + o->region_left / mcu_w) return 0;
  const uint32_t ri = d->restart_interval;
  const uint32_t phase = d->mcus_per_row % ri == 0 ? 0 : (row * d->mcus_per_row) % ri;
  if ((phase + col) % ri != 0) return 2;
  VETAJ_ProcessRestartMarker(d);
  return 1;
}

int32_t VETAJ_ReadBits(BitWorkState* state, uint32_t buffer, int32_t bits_left, int32_t nbits) {
  DecoderInfo* d = state->decoder;
  BitReader<CarefulFetch> r(d);
  r.buf = buffer;
  r.bits = bits_left;
  r.eof_as_marker = true;
  if (r.bits <= 24 && !r.ensure(nbits > 25 ? 25 : nbits)) return 0;
  state->buffer = r.buf;
  state->bits_left = r.bits;
  d->entropy->insufficient = r.insufficient;
  d->window->window = const_cast<uint8_t*>(r.cur);
  d->window->remaining = r.avail;
  return 1;
}

int32_t VETAJ_DecodeHuffMan(BitWorkState* state, uint32_t buffer, int32_t bits_left,
                            const DerivedHuffTable* table, int32_t min_bits) {
  DecoderInfo* d = state->decoder;
  BitReader<CarefulFetch> r(d);
  r.buf = buffer;
  r.bits = bits_left;
  r.eof_as_marker = true;
  const int32_t l = min_bits < 1 ? 1 : (min_bits > 16 ? 16 : min_bits);
  if (r.bits < l && !r.ensure(l)) return -1;
  const int32_t sym = r.slow_decode(table, l, r.take(l));
  state->buffer = r.buf;
  state->bits_left = r.bits;
  d->entropy->insufficient = r.insufficient;
  d->window->window = const_cast<uint8_t*>(r.cur);
  d->window->remaining = r.avail;
  return sym;
}
