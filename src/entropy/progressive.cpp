// Progressive MCU decoders. The end of the input reads as zero bits, like
// data cut short by a marker. AC passes run on the fast fetch policy where
// the window holds every byte a block can need, and again on the exact
// (careful) refill rule after a marker, as the baseline decoders do.
#include "entropy/progressive.h"

#include <cstring>

#include "entropy/bitreader.h"
#include "entropy/mcu.h"

namespace {

using Careful = vj::BitReader<vj::CarefulFetch>;
using Fast = vj::BitReader<vj::FastFetch>;

enum class Pass { kDcFirst, kDcRefine, kAcFirst, kAcRefine };

// One coefficient block's worth of work of each pass.
template <class Reader>
bool dc_first(Reader& r, DecoderInfo* d, int16_t** blocks) {
  EntropyState* e = d->entropy;
  for (uint32_t b = 0; b < d->blocks_in_mcu; ++b) {
    const int32_t s = r.decode(e->block_dc[b]);
    if (s < 0) return false;
    int32_t diff = 0;
    if (s != 0 && !r.receive(s, &diff)) return false;
    int32_t& pred = e->last_dc[d->mcu_membership[b] & 3];
    pred += diff;
    blocks[b][0] = static_cast<int16_t>(static_cast<uint32_t>(pred) << d->Al);
  }
  return true;
}

template <class Reader>
bool dc_refine(Reader& r, DecoderInfo* d, int16_t** blocks) {
  const int32_t p1 = 1 << d->Al;
  for (uint32_t b = 0; b < d->blocks_in_mcu; ++b) {
    uint32_t bit;
    if (!r.bit(&bit)) return false;
    if (bit != 0) blocks[b][0] = static_cast<int16_t>(blocks[b][0] | p1);
  }
  return true;
}

template <class Reader>
bool ac_first(Reader& r, DecoderInfo* d, int16_t** blocks) {
  EntropyState* e = d->entropy;
  const uint32_t nb = d->blocks_in_mcu;
  const uint32_t first = vj::blocks_passed_by_eob_run(d);
  if (first == nb) return true;
  const int32_t ss = static_cast<int32_t>(d->Ss);
  const int32_t se = static_cast<int32_t>(d->Se);
  const uint32_t al = d->Al;
  for (uint32_t b = first; b < nb; ++b) {
    if (ss > se) continue;
    int16_t* blk = blocks[b];
    for (int32_t k = ss; k <= se; ++k) {
      const int32_t rs = r.decode(e->block_ac[b]);
      if (rs < 0) return false;
      const int32_t run = rs >> 4;
      const int32_t s = rs & 15;
      if (s != 0) {
        k += run;
        int32_t v;
        if (!r.receive(s, &v)) return false;
        blk[VETAJ_NATURAL_ORDER[k]] = static_cast<int16_t>(static_cast<uint32_t>(v) << al);
      } else if (run == 15) {
        k += 15;
      } else {
        // End of band: this block is the first of a run of 2^run blocks.
        uint32_t eob = 1u << run;
        if (run != 0) {
          if (r.bits < run && !r.ensure(run)) return false;
          eob += r.take(run);
        }
        d->eob_run = eob - 1;
        break;
      }
    }
    if (d->eob_run != 0 && b + 1 < nb) {
      // A run that starts inside an MCU passes over its remaining blocks.
      const uint32_t rest = nb - b - 1;
      if (d->eob_run <= rest) {
        b += d->eob_run;
        d->eob_run = 0;
      } else {
        d->eob_run -= rest;
        break;
      }
    }
  }
  return true;
}

// Correction bit of an already non-zero coefficient.
template <class Reader>
inline bool refine_one(Reader& r, int16_t* coef, int32_t p1, int32_t m1) {
  uint32_t bit;
  if (!r.bit(&bit)) return false;
  if (bit != 0 && (*coef & p1) == 0) *coef = static_cast<int16_t>(*coef + (*coef >= 0 ? p1 : m1));
  return true;
}

template <class Reader>
bool ac_refine(Reader& r, DecoderInfo* d, int16_t** blocks) {
  EntropyState* e = d->entropy;
  const int32_t p1 = 1 << d->Al;
  const int32_t m1 = static_cast<int32_t>(~0u << d->Al);
  const int32_t se = static_cast<int32_t>(d->Se);
  int16_t* blk = blocks[0];
  int32_t k = static_cast<int32_t>(d->Ss);
  uint8_t made[64];
  uint32_t made_count = 0;
  auto undo = [&] {
    for (uint32_t i = 0; i < made_count; ++i) blk[made[i]] = 0;
    return false;
  };
  if (d->eob_run == 0) {
    for (; k <= se; ++k) {
      const int32_t rs = r.decode(e->block_ac[0]);
      if (rs < 0) return undo();
      int32_t run = rs >> 4;
      int32_t s = rs & 15;
      if (s != 0) {
        uint32_t bit;
        if (!r.bit(&bit)) return undo();
        s = bit != 0 ? p1 : m1;
      } else if (run != 15) {
        uint32_t eob = 1u << run;
        if (run != 0) {
          if (r.bits < run && !r.ensure(run)) return undo();
          eob += r.take(run);
        }
        d->eob_run = eob;
        break;  // the rest of this block is refined below
      }
      // Walk over already non-zero coefficients (each takes a correction
      // bit) and `run` zero ones; the new value goes at the next zero one.
      do {
        int16_t* coef = &blk[VETAJ_NATURAL_ORDER[k]];
        if (*coef != 0) {
          if (!refine_one(r, coef, p1, m1)) return undo();
        } else if (--run < 0) {
          break;
        }
        ++k;
      } while (k <= se);
      if (s != 0) {
        const uint8_t z = VETAJ_NATURAL_ORDER[k];
        blk[z] = static_cast<int16_t>(s);
        if (made_count < 64) made[made_count++] = z;
      }
    }
  }
  if (d->eob_run > 0) {
    for (; k <= se; ++k) {
      int16_t* coef = &blk[VETAJ_NATURAL_ORDER[k]];
      if (*coef != 0 && !refine_one(r, coef, p1, m1)) return undo();
    }
    --d->eob_run;
  }
  return true;
}

template <Pass kPass, class Reader>
bool run_pass(Reader& r, DecoderInfo* d, int16_t** blocks) {
  switch (kPass) {
    case Pass::kDcFirst:
      return dc_first(r, d, blocks);
    case Pass::kDcRefine:
      return dc_refine(r, d, blocks);
    case Pass::kAcFirst:
      return ac_first(r, d, blocks);
    default:
      return ac_refine(r, d, blocks);
  }
}

template <Pass kPass>
int32_t decode_prog_mcu(DecoderInfo* d, int16_t** blocks) {
  // A DC refinement reads its bits whatever the insufficient-data flag says.
  const int32_t early = vj::begin_mcu(d, kPass != Pass::kDcRefine);
  if (early >= 0) return early;
  EntropyState* e = d->entropy;
  // AC scans hold one block per MCU: where the window holds all it can
  // need, the fast policy decodes it; a marker met on the way sends the
  // block back, as it was, to the careful policy.
  if constexpr (kPass == Pass::kAcFirst || kPass == Pass::kAcRefine) {
    if (d->blocks_in_mcu == 1 && vj::fast_policy_fits(d, 1)) {
      int16_t saved[64];
      std::memcpy(saved, blocks[0], sizeof saved);
      const uint32_t eob_run = d->eob_run;
      Fast fast(d);
      if (run_pass<kPass>(fast, d, blocks) && !fast.marker_seen) {
        fast.store();
        --e->restarts_to_go;
        return 1;
      }
      std::memcpy(blocks[0], saved, sizeof saved);
      d->eob_run = eob_run;
    }
  }
  Careful r(d);
  r.eof_as_marker = true;
  const bool ok = run_pass<kPass>(r, d, blocks);
  r.store();
  if (!ok) return 0;
  --e->restarts_to_go;
  return 1;
}

}  // namespace

int32_t VETAJ_ProgDecodeMcu_DC(DecoderInfo* d, int16_t** blocks) {
  return decode_prog_mcu<Pass::kDcFirst>(d, blocks);
}
int32_t VETAJ_ProgDecodeMcu_AC(DecoderInfo* d, int16_t** blocks) {
  return decode_prog_mcu<Pass::kAcFirst>(d, blocks);
}
int32_t VETAJ_ProgDecodeMcuRefine_DC(DecoderInfo* d, int16_t** blocks) {
  return decode_prog_mcu<Pass::kDcRefine>(d, blocks);
}
int32_t VETAJ_ProgDecodeMcuRefine_AC(DecoderInfo* d, int16_t** blocks) {
  return decode_prog_mcu<Pass::kAcRefine>(d, blocks);
}
int32_t VETAJ_ProgDecodeMcu(DecoderInfo* d, int16_t** blocks) {
  return d->Ss == 0 ? VETAJ_ProgDecodeMcu_DC(d, blocks) : VETAJ_ProgDecodeMcu_AC(d, blocks);
}
