// Huffman tables, scan set-up, the bit reader and baseline MCU decoding.
#include <gtest/gtest.h>

#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "entropy/bitreader.h"
#include "entropy/mcu.h"
#include "support/files.h"
#include "support/scan_harness.h"
#include "syntax/scan_setup.h"
#if VETAJ_HAVE_LIBJPEG
#include "support/oracle.h"
#endif

namespace {

using Bytes = std::vector<uint8_t>;

HuffTable table(const std::vector<std::pair<int, int>>& counts, const Bytes& values) {
  HuffTable h{};
  for (const auto& [length, n] : counts) h.bits[length] = static_cast<uint8_t>(n);
  std::copy(values.begin(), values.end(), h.huffval);
  return h;
}
// The standard luminance DC table.
HuffTable luma_dc() {
  return table({{2, 1}, {3, 5}, {4, 1}, {5, 1}, {6, 1}, {7, 1}, {8, 1}, {9, 1}},
               {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11});
}
// An AC table: 00 end of block, 01 (0,1), 100 sixteen zeros, 1010 (2,2), and
// two 10-bit codes.
HuffTable test_ac() {
  return table({{2, 2}, {3, 1}, {4, 1}, {10, 2}}, {0x00, 0x01, 0xF0, 0x22, 0x13, 0x31});
}

// A decoder record as the marker parser leaves it (the first component
// sampled as given, every table defined), freed as the decoder frees it.
struct Frame {
  DecoderInfo d{};
  HuffTable dc = luma_dc(), ac = test_ac();
  explicit Frame(std::vector<std::pair<int, int>> samp = {{1, 1}}) {
    d.marker = vj::fake_alloc_zeroed<MarkerState>();
    d.marker->frame_kind = kFrameBaseline;
    d.entropy = vj::alloc_zeroed<EntropyState>();
    d.components = vj::alloc_zeroed<ComponentInfo>(4);
    d.quant_tables[0] = vj::alloc_zeroed<QuantTable>();
    d.image_width = d.image_height = 64;
    d.num_components = d.comps_in_scan = static_cast<uint8_t>(samp.size());
    for (size_t i = 0; i < samp.size(); ++i) {
      ComponentInfo& c = d.components[i];
      d.dc_huff[i] = &dc;
      d.ac_huff[i] = &ac;
      c.index = static_cast<uint8_t>(i);
      c.h_samp = static_cast<uint8_t>(samp[i].first);
      c.v_samp = static_cast<uint8_t>(samp[i].second);
      d.max_h_samp = std::max(d.max_h_samp, c.h_samp);
      d.max_v_samp = std::max(d.max_v_samp, c.v_samp);
      d.scan_components[i] = &c;
    }
    vj_setup_component_geometry(&d);
  }
  ~Frame() { VETAJ_DeleteDecoderInfo(&d); }
  int32_t prepare(int is_dc, int number, DerivedHuffTable** t, bool progressive = false) {
    return (progressive ? VETAJ_P_PrepareDerivedTbl : VETAJ_PrepareDerivedTbl)(&d, is_dc, number, t,
                                                                               d.entropy);
  }
};

// Rebuilding reuses the slot's table; the progressive builder always makes
// a new one.
TEST(HuffTables, BaselineRebuildReusesItsSlot) {
  Frame f;
  DerivedHuffTable* t = nullptr;
  ASSERT_EQ(f.prepare(1, 0, &t), 200);
  DerivedHuffTable* first = t;
  ASSERT_EQ(f.prepare(1, 0, &t), 200);
  EXPECT_EQ(t, first);
  ASSERT_EQ(f.prepare(1, 0, &t, true), 200);
  EXPECT_NE(t, first);
  EXPECT_EQ(f.d.derived_count, 2u);
}

TEST(HuffTables, InvalidTablesAreRefused) {
  HuffTable too_many = table({{15, 2}, {16, 255}}, {});  // 257 symbols
  HuffTable over = table({{1, 3}}, {0, 1, 2});           // three 1-bit codes
  HuffTable dc16 = luma_dc();                            // a DC category above 15
  dc16.huffval[3] = 16;
  const struct {
    HuffTable* h;
    int is_dc, number;
  } cases[] = {{nullptr, 1, 0}, {&too_many, 1, 7}, {&too_many, 0, 0}, {&over, 0, 1}, {&dc16, 1, 2}};
  for (const auto& c : cases) {
    Frame f;
    if (c.number < 4) (c.is_dc ? f.d.dc_huff : f.d.ac_huff)[c.number] = c.h;
    DerivedHuffTable* t = nullptr;
    EXPECT_EQ(f.prepare(c.is_dc, c.number, &t), 201) << c.is_dc << " " << c.number;
  }
}

TEST(HuffTables, SkipTableCoversSymbolsAndEndOfBlock) {
  Frame f;
  f.d.scale_shift = 1;  // reduced output wants skip tables
  DerivedHuffTable* t = nullptr;
  ASSERT_EQ(f.prepare(0, 0, &t), 200);
  const AcSkipTable* s = f.d.entropy->ac_skip[0];
  ASSERT_NE(s, nullptr);
  EXPECT_EQ(s->entry[0x00], 2u | (128u << 16));  // end of block at once
  // The skip table follows a redefinition of the same table number: "01" is
  // now the end of block.
  std::swap(f.ac.huffval[0], f.ac.huffval[1]);
  ASSERT_EQ(f.prepare(0, 0, &t), 200);
  EXPECT_EQ(f.d.entropy->ac_skip[0]->entry[0b01000000], 2u | (128u << 16));
}

// ---------------------------------------------------------------------------
// Scan set-up

// Ten blocks per MCU is the limit; a missing quantisation table is copied
// from the next one up, else refused.
TEST(ScanSetup, BlockLimitAndMissingQuantTables) {
  Frame eleven({{2, 2}, {2, 2}, {2, 1}, {1, 1}}), ten({{2, 2}, {2, 2}, {1, 1}, {1, 1}});
  EXPECT_EQ(VETAJ_SetupScan(&eleven.d), 201);
  ASSERT_EQ(VETAJ_SetupScan(&ten.d), 200);
  EXPECT_EQ(ten.d.blocks_in_mcu, 10);
  Frame f;
  std::swap(f.d.quant_tables[0], f.d.quant_tables[1]);  // only table 1
  f.d.quant_tables[1]->values[0] = 77;
  ASSERT_EQ(VETAJ_SetupScan(&f.d), 200);
  EXPECT_NE(f.d.quant_tables[0], f.d.quant_tables[1]);  // a copy
  EXPECT_EQ(f.d.components[0].quant->values[0], 77);
  Frame g;
  g.d.quant_tables[2] = vj::alloc_zeroed<QuantTable>();
  g.d.components[0].quant_no = 1;  // tables 0 and 2 exist, 1 does not
  EXPECT_EQ(VETAJ_SetupScan(&g.d), 201);
}

// ---------------------------------------------------------------------------
// Coefficients against libjpeg-turbo

#if VETAJ_HAVE_LIBJPEG

std::vector<std::string> baseline_fixtures() {
  return vjtest::fixtures_where([](const std::string& n, const vjtest::OracleHeader& h) {
    for (const char* kind : {"base_", "grey_", "rgb_", "cmyk_", "ycck_", "exif_", "sample"})
      if (n.rfind(kind, 0) == 0) return !h.progressive;
    return false;
  });
}

class BaselineCoefficients : public ::testing::TestWithParam<std::string> {};

// Every block of the first scan equals the oracle's coefficients: the full
// decoder on both fetch policies (the recorded last index pointing at the
// last non-zero coefficient), then the reduced decoders and MCU skipping in
// turn, which keep exactly the low coefficients and the DC predictors.
TEST_P(BaselineCoefficients, MatchLibjpegInEveryDecoderAndFetchPolicy) {
  const struct {
    int32_t (*decode)(DecoderInfo*, int16_t**);
    int last;  // zig-zag index of the last coefficient kept; -1: skipped
  } full = {VETAJ_DecodeMcu, 63}, reduced[] = {{nullptr, -1},
                                               {VETAJ_DecodeMcu_2to1, 18},
                                               {VETAJ_DecodeMcu_4to1, 4},
                                               {VETAJ_DecodeMcu_8to3, 8},
                                               {VETAJ_DecodeMcu_8to1, 0},
                                               {VETAJ_DecodeMcu, 63}};
  const auto jpeg = vjtest::read_fixture(GetParam());
  std::vector<vjtest::OracleComponent> oracle;
  ASSERT_TRUE(vjtest::oracle_coefficients(jpeg, &oracle));
  for (int pass = 0; pass < 3; ++pass) {  // fast, careful, reduced
    vjtest::ScanHarness h;
    ASSERT_TRUE(h.open(jpeg, pass == 2 ? KOLVAVETA_OPT_SKIP_TABLES : 0));
    vj::g_entropy_careful_only = pass == 1;
    for (uint32_t m = 0; m < h.total_mcus() && !HasFailure(); ++m) {
      h.at(m);
      const auto& dec = pass == 2 ? reduced[(m + 1) % 6] : full;
      ASSERT_EQ(dec.decode ? dec.decode(h.d(), h.blocks()) : VETAJ_SkipMcu(h.d()), 1)
          << "MCU " << m << " pass " << pass;
      for (uint32_t b = 0; b < h.d()->blocks_in_mcu && dec.last >= 0; ++b) {
        int comp, row, col;
        h.block_position(m, b, &comp, &row, &col);
        const auto& oc = oracle[size_t(comp)];
        if (row >= oc.rows_blocks || col >= oc.stride_blocks) continue;
        int16_t want[64] = {};
        for (int k = 0; k <= dec.last; ++k)
          want[VETAJ_NATURAL_ORDER[k]] = oc.block(row, col)[VETAJ_NATURAL_ORDER[k]];
        EXPECT_EQ(std::memcmp(h.blocks()[b], want, 128), 0)
            << "MCU " << m << " block " << b << " pass " << pass << " last " << dec.last;
        for (int k = h.d()->last_nonzero[b] + 1; k < 64 && dec.last == 63; ++k)
          EXPECT_EQ(h.blocks()[b][VETAJ_NATURAL_ORDER[k]], 0) << "MCU " << m << " block " << b;
      }
    }
    vj::g_entropy_careful_only = false;
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, BaselineCoefficients, ::testing::ValuesIn(baseline_fixtures()),
                         vjtest::fixture_test_name);

#endif  // VETAJ_HAVE_LIBJPEG

// ---------------------------------------------------------------------------
// Restart markers and damaged data

// Offset of the first entropy byte and of the 0xFF of each RST marker.
struct EntropyLayout {
  size_t start = 0;
  std::vector<size_t> rst;
};

EntropyLayout layout_of(const Bytes& j) {
  EntropyLayout l;
  for (size_t i = 2; i + 3 < j.size() && j[i] == 0xFF && l.start == 0;) {
    const size_t next = i + 2 + ((size_t(j[i + 2]) << 8) | j[i + 3]);
    if (j[i + 1] == 0xDA) l.start = next;
    i = next;
  }
  for (size_t i = l.start; i + 1 < j.size() && l.start != 0; ++i)
    if (j[i] == 0xFF && j[i + 1] >= 0xD0 && j[i + 1] <= 0xD7) l.rst.push_back(i);
  return l;
}

// Blocks of every MCU of the first scan, up to the first that fails.
std::vector<std::vector<int16_t>> decode_all(const Bytes& jpeg) {
  vjtest::ScanHarness h;
  std::vector<std::vector<int16_t>> out;
  for (uint32_t m = 0; (m > 0 || h.open(jpeg)) && m < h.total_mcus(); ++m) {
    h.at(m);
    if (VETAJ_DecodeMcu(h.d(), h.blocks()) != 1) break;
    out.emplace_back(h.blocks()[0], h.blocks()[0] + 64 * h.d()->blocks_in_mcu);
  }
  return out;
}

TEST(RestartMarkers, MissingMarkerSkipsOneIntervalAndResynchronises) {
  const auto jpeg = vjtest::read_fixture("base_420_opt_rst4_q92_63x65.jpg");
  const auto l = layout_of(jpeg);
  ASSERT_GE(l.rst.size(), 3u);
  vjtest::ScanHarness probe;
  ASSERT_TRUE(probe.open(jpeg));
  const uint32_t ri = probe.d()->restart_interval;
  ASSERT_GT(ri, 1u);
  const auto good = decode_all(jpeg);
  ASSERT_EQ(good.size(), probe.total_mcus());
  // Without RST1: intervals 0 and 1 decode, interval 2 reads zero bits (its
  // first MCU from zeros, the rest untouched, still counting down to the
  // next restart), decoding resumes at RST2.
  auto broken = jpeg;
  broken.erase(broken.begin() + long(l.rst[1]), broken.begin() + long(l.rst[1]) + 2);
  const auto got = decode_all(broken);
  ASSERT_EQ(got.size(), good.size());
  for (size_t m = 0; m < got.size(); ++m) {
    if (m / ri != 2) {
      EXPECT_EQ(got[m], good[m]) << "MCU " << m;
    } else if (m % ri != 0) {
      EXPECT_EQ(got[m], std::vector<int16_t>(got[m].size(), 0)) << m;
    }
  }
  // Out-of-order markers: the intervals before them decode, nothing fails.
  auto swapped = jpeg;
  std::swap(swapped[l.rst[1] + 1], swapped[l.rst[2] + 1]);
  const auto got2 = decode_all(swapped);
  ASSERT_EQ(got2.size(), good.size());
  for (size_t m = 0; m < 2 * ri; ++m) EXPECT_EQ(got2[m], good[m]) << "MCU " << m;
}

// A decoder reading a raw byte stream through its window.
struct RawInput {
  Bytes data;
  IoStream* s;
  StreamWindow w{};
  DecoderInfo d{};
  MarkerState m{};
  EntropyState e{};
  explicit RawInput(Bytes bytes) : data(std::move(bytes)) {
    s = KOLVAVETA_Open_IO(1, data.data(), static_cast<uint32_t>(data.size()));
    vj::window_open(&w, s);
    VETAJ_CheckBuffer(&w, 1);
    d.marker = &m;
    d.entropy = &e;
    d.window = &w;
    d.stream = s;
  }
  ~RawInput() {
    vj::window_close(&w);
    KOLVAVETA_Close_IO(s);
  }
};

TEST(BitReader, StuffingMarkersAndZeroFill) {
  // 0xFF 0x00 and 0xFF 0xFF 0x00 are data bytes 0xFF; EOI stops the data.
  RawInput in({0xFF, 0x00, 0xFF, 0xFF, 0x00, 0x81, 0xFF, 0xD9});
  BitWorkState ws{0, 0, &in.d};
  ASSERT_EQ(VETAJ_ReadBits(&ws, 0, 0, 24), 1);
  EXPECT_EQ(ws.bits_left, 24);
  EXPECT_EQ(ws.buffer & 0xFFFFFF, 0xFFFF81u);
  EXPECT_EQ(in.d.unread_marker, 0xD9u);
  EXPECT_EQ(in.e.insufficient, 0);
  // Asking for more than there is supplies zero bits and sets the flag.
  ASSERT_EQ(VETAJ_ReadBits(&ws, ws.buffer, ws.bits_left, 25), 1);
  EXPECT_EQ(ws.bits_left, 25);
  EXPECT_EQ(ws.buffer & 0x1FFFFFF, 0xFFFF81u << 1);
  EXPECT_EQ(in.e.insufficient, 1);
}

using McuDecoder = int32_t (*)(DecoderInfo*, int16_t**);
// Every decoder in turn; null: skip the MCU.
const McuDecoder kDecoders[7] = {VETAJ_DecodeMcu,      nullptr,
                                 VETAJ_DecodeMcu_8to1, VETAJ_DecodeMcu_2to1,
                                 VETAJ_DecodeMcu_4to1, VETAJ_DecodeMcu_8to3,
                                 VETAJ_FastDecodeMcu};

// Damaged entropy data: every decoder either succeeds or fails, never
// reading outside the input or writing outside the blocks (sanitizers).
TEST(BaselineDecoding, CorruptAndTruncatedDataIsSurvived) {
  std::mt19937 rng(1234);
  for (const char* name :
       {"base_420_q75_64x48.jpg", "base_422_rst2_q80_63x65.jpg", "base_444_rst3_q85_48x40.jpg",
        "base_420_opt_rst4_q92_63x65.jpg", "base_mixed_y22_cb21_cr12_q95_50x38.jpg",
        "base_420_rst2_q85_192x144.jpg"}) {
    const auto jpeg = vjtest::read_fixture(name);
    const auto l = layout_of(jpeg);
    ASSERT_GT(l.start, 0u) << name;
    std::vector<Bytes> variants;
    for (size_t cut = l.start; cut < jpeg.size(); cut += 1 + (jpeg.size() - l.start) / 64)
      variants.emplace_back(jpeg.begin(), jpeg.begin() + long(cut));
    for (int i = 0; i < 24; ++i) {
      auto v = jpeg;
      for (int k = 0; k < 1 + i % 5; ++k)
        v[l.start + rng() % (jpeg.size() - l.start)] ^= uint8_t(1u << (rng() % 8));
      variants.push_back(v);
    }
    for (size_t at = l.start; at + 2 < jpeg.size(); at += 1 + (jpeg.size() - l.start) / 16) {
      variants.push_back(jpeg);  // a stray end-of-image marker inside the data
      variants.back()[at] = 0xFF;
      variants.back()[at + 1] = 0xD9;
    }
    variants.push_back(jpeg);
    std::fill(variants.back().begin() + long(l.start),
              variants.back().begin() + long(std::min(jpeg.size(), l.start + 300)), 0xFF);
    // Every decoder in turn, on both fetch policies: the fast policy hands
    // an MCU that meets a marker to the careful one, so both must give the
    // same results, coefficients and end state even on damaged data.
    for (const auto& v : variants) {
      std::vector<int32_t> seen[2];
      for (bool careful : {false, true}) {
        vjtest::ScanHarness h;
        if (!h.open(v, KOLVAVETA_OPT_SKIP_TABLES)) continue;
        vj::g_entropy_careful_only = careful;
        auto& out = seen[careful];
        for (uint32_t m = 0; m < h.total_mcus(); ++m) {
          h.at(m);
          const McuDecoder dec = kDecoders[m % 7];
          out.push_back(dec ? dec(h.d(), h.blocks()) : VETAJ_SkipMcu(h.d()));
          if (dec == nullptr) continue;
          for (uint32_t b = 0; b < h.d()->blocks_in_mcu; ++b) {
            out.push_back(h.d()->last_nonzero[b]);
            out.insert(out.end(), h.blocks()[b], h.blocks()[b] + 64);
          }
        }
        const EntropyState* e = h.d()->entropy;
        out.insert(out.end(), {int32_t(e->insufficient), int32_t(h.d()->unread_marker),
                               int32_t(h.d()->window->remaining), e->last_dc[0], e->last_dc[1]});
        vj::g_entropy_careful_only = false;
      }
      EXPECT_EQ(seen[0], seen[1]) << name;
    }
  }
}

}  // namespace
