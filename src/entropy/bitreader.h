// The bit reader of the entropy decoders.
//
// Bits arrive most significant first into a 32-bit buffer whose low
// `bits` bits are valid. Bytes are appended one at a time: a 0xFF followed by
// 0x00 is a data byte 0xFF; 0xFF followed by anything else is a marker,
// after which the decoder reads zero bits (and notes that it had to).
//
// Two byte-fetch policies share every decoding routine:
// - CarefulFetch follows the refill rule exactly: it refills the window from
//   the input when the cursor runs out, records a marker it meets, and
//   supplies zero bits after it.
// - FastFetch is used only when the window is known to hold every byte one
//   MCU can possibly need, so it never tests for the end of the window. It
//   takes several bytes per refill. When it meets a marker it supplies zeros
//   and reports it; the caller then decodes that MCU again with
//   CarefulFetch, so both policies always produce the same result. On
//   64-bit hosts the MCU decoders work on its state through a left-aligned
//   64-bit word with the same byte rules.
#ifndef VETAJ_ENTROPY_BITREADER_H
#define VETAJ_ENTROPY_BITREADER_H

#include <bit>
#include <cstdint>
#include <cstring>

#include "drivers/decoder.h"
#include "entropy/mcu.h"

namespace vj {

// Bytes one block can take at most, with every byte stuffed: 64 symbols of at
// most 32 bits (17-bit corrupt code + 15 magnitude bits), doubled.
constexpr uint32_t kMaxBlockBytes = 512;
// Bytes the fast policy may look at beyond what it consumes.
constexpr uint32_t kFetchSlack = 16;

inline uint32_t fast_margin(uint32_t blocks) { return blocks * kMaxBlockBytes + kFetchSlack; }

// Test knob: when true every MCU is decoded with the careful policy.
extern bool g_entropy_careful_only;

// Refills the entropy cursor so that at least `want` bytes are in the
// window when the input has them. Memory inputs extend the window in place;
// other inputs move the unread bytes to the start of the window buffer and
// read behind them. Returns the bytes now available.
uint32_t entropy_top_up(DecoderInfo* d, uint32_t want);

// Whether the fast policy may decode the next `blocks` blocks: no marker is
// pending and the window holds (after a top-up) every byte they can need.
inline bool fast_policy_fits(DecoderInfo* d, uint32_t blocks) {
  const uint32_t margin = fast_margin(blocks);
  return d->unread_marker == 0 && !g_entropy_careful_only &&
         (d->window->remaining >= margin || entropy_top_up(d, margin) >= margin);
}

// Four bytes in memory order as a big-endian value.
inline uint32_t load_be32(uint32_t native) {
  if constexpr (std::endian::native == std::endian::little) return __builtin_bswap32(native);
  return native;
}

// Shift left that yields 0 for counts of 32 or more.
inline uint32_t shl(uint32_t v, int32_t n) { return n >= 32 ? 0u : v << n; }

struct BitState {
  uint32_t buf;
  int32_t bits;
  const uint8_t* cur;
  uint32_t avail;
};

struct FastFetch;
struct CarefulFetch;

// The working registers of one MCU. Fetch is FastFetch or CarefulFetch.
template <class FetchPolicy>
struct BitReader {
  using Fetch = FetchPolicy;
  using Word = typename Fetch::Word;
  // Whether every byte a block can need is in the window.
  static constexpr bool kFast = Fetch::kFast;
  Word buf;
  int32_t bits;
  const uint8_t* cur;
  uint32_t avail;
  const uint8_t* start;  // cursor when the state was loaded
  DecoderInfo* d;
  EntropyState* e;
  uint8_t insufficient;
  bool marker_seen = false;    // FastFetch: a marker was met
  bool eof_as_marker = false;  // CarefulFetch: end of input reads as zero bits

  explicit BitReader(DecoderInfo* dec)
      : buf(dec->entropy->bit_buffer),
        bits(dec->entropy->bits_left),
        cur(dec->window->window),
        avail(dec->window->remaining),
        start(dec->window->window),
        d(dec),
        e(dec->entropy),
        insufficient(dec->entropy->insufficient) {}

  void store() {
    Fetch::normalize(*this);
    e->bit_buffer = static_cast<uint32_t>(buf);
    e->bits_left = bits;
    e->insufficient = insufficient;
    d->window->window = const_cast<uint8_t*>(cur);
    d->window->remaining = avail;
  }

  // Ensures at least n valid bits (n <= 25). False when the input ended.
  bool ensure(int32_t n) { return Fetch::ensure(*this, n); }
  // Ensures 8 bits for a lookahead if the data has them (no zero fill).
  void prefetch8() { Fetch::prefetch8(*this); }

  uint32_t peek(int32_t n) const {
    return static_cast<uint32_t>(buf >> (bits - n)) & ((1u << n) - 1u);
  }
  // Drops n bits looked at with peek.
  void consume(int32_t n) { bits -= n; }
  uint32_t take(int32_t n) {
    bits -= n;
    return static_cast<uint32_t>(buf >> bits) & ((1u << n) - 1u);
  }

  // One bit, for the bit-by-bit code search.
  bool bit(uint32_t* out) {
    if (bits < 1 && !ensure(1)) return false;
    *out = take(1);
    return true;
  }

  // Code search from length `l`, with the first l bits already in `code`.
  // A code longer than 16 bits decodes as symbol 0. Returns -1 when the
  // input ended.
  int32_t slow_decode(const DerivedHuffTable* t, int32_t l, uint32_t code) {
    while (l <= 16 && static_cast<int32_t>(code) > t->maxcode[l]) {
      uint32_t b;
      if (!bit(&b)) return -1;
      code = (code << 1) | b;
      ++l;
    }
    if (l > 16) return 0;
    return t->source
        ->huffval[static_cast<uint32_t>(static_cast<int32_t>(code) + t->valoffset[l]) & 255u];
  }

  // Decodes one Huffman symbol; -1 when the input ended.
  int32_t decode(const DerivedHuffTable* t) {
    prefetch8();
    if (bits >= 8) {
      const uint32_t entry = t->lookahead[peek(8)];
      const int32_t len = static_cast<int32_t>(entry >> 8);
      if (len <= 8) {
        bits -= len;
        return static_cast<int32_t>(entry & 0xFF);
      }
      if (bits < 17 && !ensure(17) && bits < 9) return -1;
      return slow_decode(t, 9, take(9));
    }
    // Fewer than 8 bits exist before a marker or the end of the input.
    uint32_t b;
    if (!bit(&b)) return -1;
    return slow_decode(t, 1, b);
  }

  // Reads s magnitude bits and extends them to a signed value (without a
  // data-dependent branch: values below 2^(s-1) are negative).
  bool receive(int32_t s, int32_t* value) {
    if (!Fetch::kHoldsSymbol && bits < s && !ensure(s)) return false;
    const int32_t v = static_cast<int32_t>(take(s));
    const int32_t negative = (v - VETAJ_HUFF_EXTEND_TEST[s]) >> 31;  // all ones or 0
    *value = v + (negative & static_cast<int32_t>(1u - (1u << s)));
    return true;
  }

  // Drops s bits (magnitude bits that are not needed).
  bool drop(int32_t s) {
    if (!Fetch::kHoldsSymbol && bits < s && !ensure(s)) return false;
    bits -= s;
    return true;
  }
};

// Window known to hold enough bytes: no end tests. On 64-bit hosts the
// buffer is a 64-bit word refilled four bytes at a time, so that one check
// per symbol covers its code and magnitude bits; bytes fetched ahead are
// handed back when the state is stored. On 32-bit hosts two bytes per refill.
struct FastFetch {
  using Word = uintptr_t;
  static constexpr bool kFast = true;
  static constexpr bool kWide = sizeof(Word) == 8;
  // Whether the refill before a symbol guarantees its magnitude bits too.
  static constexpr bool kHoldsSymbol = kWide;
  static constexpr int32_t kRefillBelow = kWide ? 32 : 16;

  template <class R>
  static void append(R& r) {
    uint32_t c = r.cur[0];
    if (c == 0xFF) {
      if (r.cur[1] == 0x00) {
        r.cur += 2;
        r.avail -= 2;
      } else {
        c = 0;  // a marker: zeros from here on, the cursor stays on it
        r.marker_seen = true;
      }
    } else {
      ++r.cur;
      --r.avail;
    }
    r.buf = (r.buf << 8) | c;
  }
  // Appends a whole refill at once when none of its bytes is 0xFF (the
  // common case), otherwise byte by byte.
  template <class R>
  static void fill(R& r) {
    if constexpr (kWide && std::endian::native == std::endian::little) {
      // As many whole bytes as the 64-bit word takes (at most seven).
      int32_t n = (63 - r.bits) >> 3;
      if (n > 7) n = 7;
      uint64_t w;
      std::memcpy(&w, r.cur, 8);
      const uint64_t inv = ~w;  // a 0xFF byte becomes a zero byte
      const uint64_t ff = (inv - 0x0101010101010101ull) & ~inv & 0x8080808080808080ull;
      if ((ff & ((1ull << (8 * n)) - 1)) == 0) {
        r.buf = (r.buf << (8 * n)) | (__builtin_bswap64(w) >> (64 - 8 * n));
        r.cur += n;
        r.avail -= static_cast<uint32_t>(n);
        r.bits += 8 * n;
        return;
      }
      for (int32_t i = 0; i < n; ++i) append(r);
      r.bits += 8 * n;
    } else {
      constexpr int kBytes = kWide ? 4 : 2;
      if constexpr (!kWide) {
        if (r.cur[0] != 0xFF && r.cur[1] != 0xFF) {
          r.buf = (r.buf << 16) | (Word(r.cur[0]) << 8) | r.cur[1];
          r.cur += 2;
          r.avail -= 2;
          r.bits += 16;
          return;
        }
      }
      for (int i = 0; i < kBytes; ++i) append(r);
      r.bits += kBytes * 8;
    }
  }
  template <class R>
  static bool ensure(R& r, int32_t n) {
    while (r.bits < n) fill(r);
    return true;
  }
  template <class R>
  static void prefetch8(R& r) {
    while (r.bits < kRefillBelow) fill(r);
  }
  // Hands back whole bytes fetched ahead so that at most 32 bits remain.
  // Only bytes taken since the state was loaded come back (the stored state
  // never holds more than 32 bits), and a stuffed pair is taken whole, so a
  // byte that came from one is recognised by its two raw bytes.
  template <class R>
  static void normalize(R& r) {
    if (r.bits <= 32) return;
    const int32_t n = (r.bits - 25) >> 3;  // bytes to hand back
    // Without a 0xFF among them or just before them, every byte handed back
    // is one raw byte: all go back at once.
    bool plain = r.cur - n - 1 >= r.start;
    if (kWide && std::endian::native == std::endian::little && r.cur - 8 >= r.start) {
      uint64_t w;  // the 8 bytes before the cursor, the last one on top
      std::memcpy(&w, r.cur - 8, 8);
      const uint64_t inv = ~w;  // a 0xFF byte becomes a zero byte
      const uint64_t ff = (inv - 0x0101010101010101ull) & ~inv & 0x8080808080808080ull;
      plain = (ff >> (8 * (7 - n))) == 0;
    } else {
      for (int32_t i = 1; plain && i <= n + 1; ++i) plain = r.cur[-i] != 0xFF;
    }
    if (plain) {
      r.cur -= n;
      r.avail += static_cast<uint32_t>(n);
      r.buf >>= 8 * n;
      r.bits -= 8 * n;
      return;
    }
    while (r.bits > 32) {
      const bool stuffed = r.cur - 2 >= r.start && r.cur[-1] == 0x00 && r.cur[-2] == 0xFF;
      const uint32_t back = stuffed ? 2 : 1;
      r.cur -= back;
      r.avail += back;
      r.buf >>= 8;
      r.bits -= 8;
    }
  }
};

// The exact refill rule, with input refills and marker recording.
struct CarefulFetch {
  using Word = uint32_t;
  static constexpr bool kFast = false;
  static constexpr bool kHoldsSymbol = false;
  template <class R>
  static void normalize(R&) {}
  // Next raw byte of the input; -1 at its end.
  template <class R>
  static int32_t raw(R& r) {
    if (r.avail == 0) {
      r.d->window->window = const_cast<uint8_t*>(r.cur);
      r.d->window->remaining = 0;
      if (entropy_top_up(r.d, 1) == 0) return -1;
      r.cur = r.d->window->window;
      r.avail = r.d->window->remaining;
    }
    --r.avail;
    return *r.cur++;
  }
  // Appends bytes while 24 or fewer bits are held and no marker is pending.
  // Returns false when the input ended.
  template <class R>
  static bool append(R& r) {
    if (r.d->unread_marker != 0) return true;
    while (r.bits <= 24) {
      int32_t c = raw(r);
      if (c < 0) return false;
      if (c == 0xFF) {
        do {
          c = raw(r);
        } while (c == 0xFF);
        if (c < 0) return false;
        if (c != 0) {
          r.d->unread_marker = static_cast<uint32_t>(c);
          return true;
        }
        c = 0xFF;
      }
      r.buf = (r.buf << 8) | static_cast<uint32_t>(c);
      r.bits += 8;
    }
    return true;
  }
  template <class R>
  static void zero_fill(R& r) {
    if (r.insufficient == 0) r.insufficient = 1;
    r.buf = shl(r.buf, 25 - r.bits);
    r.bits = 25;
  }
  template <class R>
  static bool ensure(R& r, int32_t n) {
    const bool more = append(r);
    if (r.bits >= n) return true;
    if (r.d->unread_marker != 0 || (!more && r.eof_as_marker)) {
      zero_fill(r);
      return true;
    }
    return false;
  }
  template <class R>
  static void prefetch8(R& r) {
    if (r.bits < 8) (void)append(r);
  }
};

// What every MCU decoder does first: the restart marker when one is due,
// then the insufficient-data rule (an MCU after data cut short decodes to
// nothing). Returns -1 to decode the MCU, otherwise its result.
inline int32_t begin_mcu(DecoderInfo* d, bool honour_insufficient) {
  EntropyState* e = d->entropy;
  if (e == nullptr || d->window == nullptr) return 0;
  if (d->restart_interval != 0 && e->restarts_to_go == 0 && VETAJ_ProcessRestartMarker(d) == 0)
    return 0;
  if (honour_insufficient && e->insufficient != 0) {
    --e->restarts_to_go;
    return 1;
  }
  return -1;
}

// A pending end-of-band run passes over whole blocks of the MCU first:
// returns the first block to decode (blocks in MCU when the run covers
// them all).
inline uint32_t blocks_passed_by_eob_run(DecoderInfo* d) {
  const uint32_t nb = d->blocks_in_mcu;
  if (d->eob_run == 0) return 0;
  if (d->eob_run < nb) {
    const uint32_t first = d->eob_run;
    d->eob_run = 0;
    return first;
  }
  d->eob_run -= nb;
  return nb;
}

}  // namespace vj

#endif  // VETAJ_ENTROPY_BITREADER_H
