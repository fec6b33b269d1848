// The decoder's marker reader: frame, tables, restart interval and scan
// headers, read into the DecoderInfo.
#include "syntax/markers.h"

#include <cstring>

#include "drivers/decoder.h"
#include "syntax/marker_io.h"

namespace {

using vj::kStatusFail;
using vj::kStatusOk;

// Head of one Huffman table definition: class/number byte and 16 code counts.
constexpr uint32_t kHuffTableHead = 17;
// Size of one 8-bit quantisation table definition.
constexpr uint32_t kQuantTableBytes = 65;
// Largest successive-approximation bit position of an 8-bit progressive scan.
constexpr uint32_t kMaxApproxBit = 13;

// A caller's stream cannot seek back, yet progressive decoding revisits the
// scans: read the whole input into one block and turn the stream into a
// memory stream over it. The window is re-pointed into the block; its own
// buffer stays with it for its owner to free.
bool make_stream_seekable(StreamWindow* w) {
  IoStream* s = w->stream;
  const uint32_t held = w->index + w->remaining;  // bytes the window holds
  const uint32_t size = s->size;
  if (size == 0 || size < w->consumed || held > w->consumed) return false;
  auto* block = vj::alloc_zeroed<uint8_t>(size);
  if (block == nullptr) return false;
  const uint32_t first = w->consumed - held;  // input position of window[0]
  if (held > 0) std::memcpy(block + first, w->window, held);

  // The rest of the input, in window-sized requests.
  uint32_t have = w->consumed;
  while (have < size) {
    const uint32_t want = size - have < vj::kWindowSize ? size - have : vj::kWindowSize;
    const int32_t n = KOLVAVETA_Read_IO(s, block + have, want);
    if (n <= 0) break;
    have += static_cast<uint32_t>(n) < want ? static_cast<uint32_t>(n) : want;
    if (static_cast<uint32_t>(n) < want) break;
  }
  // The part before the window, when the stream can go back for it, so that
  // a later decode that starts again from the beginning finds it.
  if (first > 0 && s->rewind_callback != nullptr && s->read_callback != nullptr) {
    s->rewind_callback(s->source, nullptr, 0);
    uint32_t got = 0;
    while (got < first) {
      const int32_t n = s->read_callback(s->source, block + got, first - got);
      if (n <= 0) break;
      got += static_cast<uint32_t>(n) < first - got ? static_cast<uint32_t>(n) : first - got;
    }
  }

  s->kind = vj::kIoMemoryOwned;
  s->source = block;
  s->size = have;  // a stream that ended early ends here too
  s->position = w->consumed;
  s->read_callback = nullptr;
  s->skip_callback = nullptr;
  s->rewind_callback = nullptr;
  w->window = block + first;
  w->size = have;
  return true;
}

// SOF0 / SOF2: the frame header.
bool read_frame(DecoderInfo* d, StreamWindow* w, uint8_t kind) {
  MarkerState* m = d->marker;
  if (m->frame_kind != kFrameNone || d->components != nullptr) return false;
  vj::FrameFields f;
  if (!vj::read_frame_fields(w, &f)) return false;
  if (f.precision != 8 || f.height > vj::kMaxImageSide || f.width > vj::kMaxImageSide)
    return false;
  if (f.count < 1 || f.count > 4 || f.length != 3 * f.count + vj::kFrameFixedBytes)
    return false;
  if (VETAJ_CheckBuffer(w, 3 * f.count) == 0) return false;
  auto* comps = vj::alloc_zeroed<ComponentInfo>(f.count);
  if (comps == nullptr) return false;
  d->components = comps;
  d->num_components = static_cast<uint8_t>(f.count);
  d->image_width = static_cast<uint16_t>(f.width);
  d->image_height = static_cast<uint16_t>(f.height);
  d->max_h_samp = 0;
  d->max_v_samp = 0;

  const uint8_t* c = vj::window_take(w, 3 * f.count);
  for (uint32_t i = 0; i < f.count; ++i, c += 3) {
    uint32_t h = 0, v = 0;
    if (!vj::split_sampling(c[1], &h, &v)) return false;
    ComponentInfo& ci = comps[i];
    ci.id = c[0];
    ci.index = static_cast<uint8_t>(i);
    ci.h_samp = static_cast<uint8_t>(h);
    ci.v_samp = static_cast<uint8_t>(v);
    ci.quant_no = c[2];
    m->component_ids[i] = c[0];
    if (h > d->max_h_samp) d->max_h_samp = static_cast<uint8_t>(h);
    if (v > d->max_v_samp) d->max_v_samp = static_cast<uint8_t>(v);
  }
  d->mcu_width_px = static_cast<uint8_t>(8 * d->max_h_samp);
  d->mcu_height_px = static_cast<uint8_t>(8 * d->max_v_samp);
  m->frame_kind = kind;
  return true;
}

// DHT: each table definition takes the next slot of the table store.
bool read_dht(DecoderInfo* d, StreamWindow* w) {
  d->marker->seen_dht = 1;
  uint32_t length = 0;
  if (!vj::read_be16(w, &length) || length < 2) return false;
  uint32_t left = length - 2;
  while (left > 0) {
    if (left < kHuffTableHead || d->huff_store_count >= kMaxTableSpecs) return false;
    if (VETAJ_CheckBuffer(w, kHuffTableHead) == 0) return false;
    const uint8_t* p = vj::window_take(w, kHuffTableHead);
    const uint32_t table_class = p[0] >> 4;
    const uint32_t number = p[0] & 15u;
    if (table_class > 1 || number > 3) return false;
    uint32_t symbols = 0;
    for (uint32_t i = 1; i <= 16; ++i) symbols += p[i];
    if (symbols > 256 || symbols > left - kHuffTableHead) return false;

    auto* table = vj::alloc_zeroed<HuffTable>();
    if (table == nullptr) return false;
    d->huff_store[d->huff_store_count++] = table;
    std::memcpy(table->bits + 1, p + 1, 16);
    if (!vj::read_bytes(w, table->huffval, symbols)) return false;
    (table_class == 0 ? d->dc_huff : d->ac_huff)[number] = table;
    left -= kHuffTableHead + symbols;
  }
  return true;
}

// DQT: 8-bit tables only, stored in natural order.
bool read_dqt(DecoderInfo* d, StreamWindow* w) {
  uint32_t length = 0;
  if (!vj::read_be16(w, &length) || length < 2) return false;
  uint32_t left = length - 2;
  while (left > 0) {
    if (left < kQuantTableBytes) return false;
    if (VETAJ_CheckBuffer(w, kQuantTableBytes) == 0) return false;
    const uint8_t* p = vj::window_take(w, kQuantTableBytes);
    const uint32_t precision = p[0] >> 4;
    const uint32_t number = p[0] & 15u;
    if (precision != 0 || number > 3) return false;
    QuantTable*& table = d->quant_tables[number];
    if (table == nullptr) {
      table = vj::alloc_zeroed<QuantTable>();
      if (table == nullptr) return false;
    }
    for (uint32_t k = 0; k < 64; ++k) table->values[VETAJ_NATURAL_ORDER[k]] = p[1 + k];
    left -= kQuantTableBytes;
  }
  d->marker->seen_dqt = 1;
  return true;
}

// DRI: the restart interval in MCUs.
bool read_dri(DecoderInfo* d, StreamWindow* w) {
  uint32_t length = 0, interval = 0;
  if (!vj::read_be16(w, &length) || length != 4) return false;
  if (!vj::read_be16(w, &interval)) return false;
  d->restart_interval = interval;
  return true;
}

// SOS: the scan header. Everything is checked before the decoder is changed.
bool read_sos(DecoderInfo* d, StreamWindow* w) {
  MarkerState* m = d->marker;
  if (m->frame_kind == kFrameNone) return false;
  if (VETAJ_CheckBuffer(w, 3) == 0) return false;
  const uint8_t* p = vj::window_take(w, 3);
  const uint32_t length = vj::be16(p);
  const uint32_t count = p[2];
  if (count < 1 || count > 4 || length != 2 * (count + 3)) return false;
  const uint32_t rest = length - 3;  // component entries, Ss, Se, Ah/Al
  if (VETAJ_CheckBuffer(w, rest) == 0) return false;
  const uint8_t* s = vj::window_take(w, rest);

  ComponentInfo* chosen[4] = {};
  for (uint32_t k = 0; k < count; ++k) {
    ComponentInfo* comp = nullptr;
    for (uint32_t i = 0; i < d->num_components && comp == nullptr; ++i)
      if (d->components[i].id == s[2 * k]) comp = &d->components[i];
    if (comp == nullptr) return false;
    for (uint32_t j = 0; j < k; ++j)
      if (chosen[j] == comp) return false;  // a component named twice
    if ((s[2 * k + 1] >> 4) > 3 || (s[2 * k + 1] & 15u) > 3) return false;
    chosen[k] = comp;
  }
  const uint8_t* band = s + 2 * count;
  uint32_t ss = band[0], se = band[1], ah = band[2] >> 4, al = band[2] & 15u;
  if (m->frame_kind != kFrameProgressive) {
    ss = 0;
    se = 63;
    ah = 0;
    al = 0;
  } else if (se > 63 || ss > se || ah > kMaxApproxBit || al > kMaxApproxBit) {
    return false;
  }

  d->comps_in_scan = static_cast<uint8_t>(count);
  if (d->first_scan_comps == 0) {
    d->first_scan_comps = static_cast<int32_t>(count);
    if (count == d->num_components) d->first_scan_comps = -1;
  }
  for (uint32_t k = 0; k < count; ++k) {
    ComponentInfo* comp = chosen[k];
    comp->dc_no = static_cast<uint8_t>(s[2 * k + 1] >> 4);
    comp->ac_no = static_cast<uint8_t>(s[2 * k + 1] & 15u);
    d->scan_components[k] = comp;
    d->scan_comp_index = comp->index;
  }
  d->Ss = ss;
  d->Se = se;
  d->Ah = ah;
  d->Al = al;
  m->seen_sos = 1;
  return true;
}

// APPn, COM and DNL: skipped by length; APP0 and an Adobe APP14 leave flags.
bool read_skipped(DecoderInfo* d, StreamWindow* w, uint32_t code) {
  MarkerState* m = d->marker;
  uint32_t length = 0;
  if (!vj::read_be16(w, &length) || length < 2) return false;
  const uint32_t payload = length - 2;
  if (code == vj::kMarkerApp0) m->seen_app0 = 1;
  constexpr uint32_t kAdobeBytes = 12;  // "Adobe", version, two flag words, transform
  if (code == vj::kMarkerApp14 && payload >= kAdobeBytes) {
    if (VETAJ_CheckBuffer(w, kAdobeBytes) == 0) return false;
    const uint8_t* p = w->window + w->index;
    if (std::memcmp(p, "Adobe", 5) == 0) {
      m->seen_adobe = 1;
      m->adobe_transform = p[11];
    }
  }
  return vj::skip_bytes(w, payload);
}

}  // namespace

uint8_t VETAJ_ParseNextMarker(DecoderInfo* d, int32_t* status) {
  *status = kStatusOk;
  if (d == nullptr || d->window == nullptr || d->marker == nullptr) {
    *status = kStatusFail;
    return 0;
  }
  StreamWindow* w = d->window;
  uint8_t last = 0;
  for (;;) {
    const int32_t code = vj::next_marker(w);
    if (code < 0) break;
    last = static_cast<uint8_t>(code);
    bool ok = true;
    switch (static_cast<uint32_t>(code)) {
      case vj::kMarkerSof0:
        ok = read_frame(d, w, kFrameBaseline);
        break;
      case vj::kMarkerSof2:
        if (d->marker->frame_kind == kFrameNone && w->stream != nullptr &&
            w->stream->kind == vj::kIoStream)
          ok = make_stream_seekable(w);
        ok = ok && read_frame(d, w, kFrameProgressive);
        break;
      case vj::kMarkerDht:
        ok = read_dht(d, w);
        break;
      case vj::kMarkerDqt:
        ok = read_dqt(d, w);
        break;
      case vj::kMarkerDri:
        ok = read_dri(d, w);
        break;
      case vj::kMarkerSos:
        if (read_sos(d, w)) return static_cast<uint8_t>(vj::kMarkerSos);
        // A scan header that could not be read is not reported as one.
        *status = kStatusFail;
        return 0;
      default:
        // Other frame types, RSTn, SOI, EOI and reserved codes carry no
        // segment that is read here: the search goes on.
        if (vj::is_skippable_segment(static_cast<uint32_t>(code)))
          ok = read_skipped(d, w, static_cast<uint32_t>(code));
        break;
    }
    if (!ok) break;
  }
  *status = kStatusFail;
  return last;
}
