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

// ---------------------------------------------------------------------------
// Derived tables

// The standard luminance DC table.
HuffTable luma_dc() {
  HuffTable h{};
  const uint8_t bits[17] = {0, 0, 1, 5, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0, 0};
  std::memcpy(h.bits, bits, 17);
  for (int i = 0; i < 12; ++i) h.huffval[i] = static_cast<uint8_t>(i);
  return h;
}

struct TableFixture {
  DecoderInfo d{};
  MarkerState m{};
  EntropyState e{};
  TableFixture() {
    d.marker = &m;
    m.frame_kind = kFrameBaseline;
  }
  ~TableFixture() {
    for (uint32_t i = 0; i < d.derived_count; ++i) vj_free_derived_table(d.derived_tables[i]);
    KOLVAVETA_OsFree(d.derived_tables);
    for (auto* s : e.ac_skip) KOLVAVETA_OsFree(s);
  }
};

TEST(HuffTables, StandardLuminanceDcTable) {
  TableFixture f;
  HuffTable h = luma_dc();
  f.d.dc_huff[0] = &h;
  DerivedHuffTable* t = nullptr;
  ASSERT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 1, 0, &t, &f.e), 200);
  ASSERT_NE(t, nullptr);
  EXPECT_EQ(t->maxcode[1], -1);
  EXPECT_EQ(t->maxcode[2], 0);
  EXPECT_EQ(t->maxcode[3], 6);
  EXPECT_EQ(t->maxcode[17], 0xFFFFF);
  for (int v = 0; v < 0x40; ++v) EXPECT_EQ(t->lookahead[v], (2u << 8) | 0u);
  // Rebuilding reuses the slot's table.
  DerivedHuffTable* same = t;
  ASSERT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 1, 0, &t, &f.e), 200);
  EXPECT_EQ(t, same);
  EXPECT_EQ(f.d.derived_count, 1u);
  // The progressive builder always makes a new one.
  ASSERT_EQ(VETAJ_P_PrepareDerivedTbl(&f.d, 1, 0, &t, &f.e), 200);
  EXPECT_NE(t, same);
  EXPECT_EQ(f.d.derived_count, 2u);
}

TEST(HuffTables, InvalidTablesAreRefused) {
  TableFixture f;
  DerivedHuffTable* t = nullptr;
  EXPECT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 1, 0, &t, &f.e), 201);  // missing table
  EXPECT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 1, 7, &t, &f.e), 201);  // number out of range
  HuffTable too_many{};
  too_many.bits[16] = 255;
  too_many.bits[15] = 2;  // 257 symbols
  f.d.ac_huff[0] = &too_many;
  EXPECT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 0, 0, &t, &f.e), 201);
  HuffTable over{};
  over.bits[1] = 3;  // three 1-bit codes
  f.d.ac_huff[1] = &over;
  EXPECT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 0, 1, &t, &f.e), 201);
  HuffTable dc16 = luma_dc();
  dc16.huffval[3] = 16;
  f.d.dc_huff[2] = &dc16;
  t = nullptr;
  EXPECT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 1, 2, &t, &f.e), 201);
}

// An AC table with an end-of-block code "00", a 2-bit code for (0,1), and
// codes longer than 8 bits.
HuffTable test_ac_table() {
  HuffTable h{};
  h.bits[2] = 2;   // 00 -> EOB, 01 -> 0x01
  h.bits[3] = 1;   // 100 -> 0xF0 (sixteen zeros)
  h.bits[4] = 1;   // 1010 -> 0x22
  h.bits[10] = 2;  // long codes
  const uint8_t vals[] = {0x00, 0x01, 0xF0, 0x22, 0x13, 0x31};
  std::memcpy(h.huffval, vals, sizeof vals);
  return h;
}

TEST(HuffTables, SkipTableCoversSymbolsAndEndOfBlock) {
  TableFixture f;
  f.d.scale_shift = 1;  // reduced output wants skip tables
  HuffTable h = test_ac_table();
  f.d.ac_huff[0] = &h;
  DerivedHuffTable* t = nullptr;
  ASSERT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 0, 0, &t, &f.e), 200);
  ASSERT_NE(f.e.ac_skip[0], nullptr);
  const AcSkipTable* s = f.e.ac_skip[0];
  // 00xxxxxx: end of block at once.
  EXPECT_EQ(s->entry[0x00], 2u | (128u << 16));
  // 01 0 01 1 00 : (0,1) with 1 magnitude bit, again, then EOB: 2+1+2+1+2 = 8 bits.
  EXPECT_EQ(s->entry[0b01001100], 8u | ((1u + 1u + 128u) << 16));
  // Long codes (11111111 prefix) have no complete code: 0.
  EXPECT_EQ(s->entry[0xFF], 0u);
  EXPECT_EQ(t->lookahead[0xFF], kLongCode);
  // The skip table follows a redefinition of the same table number.
  HuffTable other = test_ac_table();
  other.huffval[0] = 0x01;
  other.huffval[1] = 0x00;
  f.d.ac_huff[0] = &other;
  ASSERT_EQ(VETAJ_PrepareDerivedTbl(&f.d, 0, 0, &t, &f.e), 200);
  // "01" is now the end of block (it was (0,1), a magnitude bit and EOB).
  EXPECT_EQ(f.e.ac_skip[0]->entry[0b01000000], 2u | (128u << 16));
}

// ---------------------------------------------------------------------------
// Scan set-up

struct ScanSetupFixture {
  DecoderInfo d{};
  MarkerState m{};
  ComponentInfo comps[4]{};
  HuffTable dc = luma_dc();
  HuffTable ac = test_ac_table();
  QuantTable q[4]{};
  ScanSetupFixture() {
    d.marker = &m;
    m.frame_kind = kFrameBaseline;
    d.components = comps;
    for (int i = 0; i < 4; ++i) {
      d.dc_huff[i] = &dc;
      d.ac_huff[i] = &ac;
      comps[i].index = static_cast<uint8_t>(i);
    }
  }
  ~ScanSetupFixture() {
    for (uint32_t i = 0; i < d.derived_count; ++i) vj_free_derived_table(d.derived_tables[i]);
    KOLVAVETA_OsFree(d.derived_tables);
    KOLVAVETA_OsFree(d.entropy);
    for (auto* t : d.quant_tables)
      if (t < q || t >= q + 4) KOLVAVETA_OsFree(t);
  }
  void frame(uint16_t w, uint16_t h, std::vector<std::pair<int, int>> samp) {
    d.image_width = w;
    d.image_height = h;
    d.num_components = static_cast<uint8_t>(samp.size());
    d.comps_in_scan = d.num_components;
    for (size_t i = 0; i < samp.size(); ++i) {
      comps[i].h_samp = static_cast<uint8_t>(samp[i].first);
      comps[i].v_samp = static_cast<uint8_t>(samp[i].second);
      d.max_h_samp = std::max<uint8_t>(d.max_h_samp, comps[i].h_samp);
      d.max_v_samp = std::max<uint8_t>(d.max_v_samp, comps[i].v_samp);
      d.scan_components[i] = &comps[i];
    }
    d.quant_tables[0] = &q[0];
    d.num_components = static_cast<uint8_t>(samp.size());
    vj_setup_component_geometry(&d);
  }
};

TEST(ScanSetup, InterleavedLayoutAndGeometry) {
  ScanSetupFixture f;
  f.frame(100, 100, {{2, 2}, {1, 1}, {1, 1}});
  ASSERT_EQ(VETAJ_SetupScan(&f.d), 200);
  EXPECT_EQ(f.d.blocks_in_mcu, 6);
  const uint32_t expect[6] = {0, 0, 0, 0, 1, 2};
  for (int b = 0; b < 6; ++b) EXPECT_EQ(f.d.mcu_membership[b], expect[b]);
  EXPECT_EQ(f.d.mcus_per_row, 7u);
  EXPECT_EQ(f.d.mcu_rows, 7u);
  EXPECT_EQ(f.comps[0].width_blocks, 13u);
  EXPECT_EQ(f.comps[0].last_col_width, 1u);
  EXPECT_EQ(f.comps[0].last_row_height, 1u);
  EXPECT_EQ(f.d.entropy->block_dc[5], f.d.entropy->dc_tables[0]);
}

TEST(ScanSetup, TenBlocksPerMcuIsTheLimit) {
  ScanSetupFixture f;
  f.frame(64, 64, {{2, 2}, {2, 2}, {2, 2}, {2, 2}});
  EXPECT_EQ(VETAJ_SetupScan(&f.d), 201);
  ScanSetupFixture g;
  g.frame(64, 64, {{2, 2}, {2, 1}, {1, 1}});
  EXPECT_EQ(VETAJ_SetupScan(&g.d), 200);
  EXPECT_EQ(g.d.blocks_in_mcu, 7);
}

TEST(ScanSetup, MissingQuantTablesAreCopiedDownwardOrRefused) {
  ScanSetupFixture f;
  f.frame(16, 16, {{1, 1}});
  f.d.quant_tables[0] = nullptr;
  f.d.quant_tables[1] = &f.q[1];
  f.q[1].values[0] = 77;
  ASSERT_EQ(VETAJ_SetupScan(&f.d), 200);
  ASSERT_NE(f.d.quant_tables[0], nullptr);
  EXPECT_NE(f.d.quant_tables[0], &f.q[1]);
  EXPECT_EQ(f.d.quant_tables[0]->values[0], 77);
  EXPECT_EQ(f.comps[0].quant, f.d.quant_tables[0]);

  ScanSetupFixture g;
  g.frame(16, 16, {{1, 1}});
  g.d.quant_tables[2] = &g.q[2];
  g.comps[0].quant_no = 1;  // tables 0 and 2 exist, 1 does not
  EXPECT_EQ(VETAJ_SetupScan(&g.d), 201);
}

// ---------------------------------------------------------------------------
// Coefficients against libjpeg-turbo

#if VETAJ_HAVE_LIBJPEG

bool is_baseline_fixture(const std::string& n) {
  return n.rfind("base_", 0) == 0 || n.rfind("grey_", 0) == 0 || n.rfind("rgb_", 0) == 0 ||
         n.rfind("cmyk_", 0) == 0 || n.rfind("ycck_", 0) == 0 || n.rfind("exif_", 0) == 0 ||
         n == "sample.jpg";
}

std::vector<std::string> baseline_fixtures() {
  return vjtest::fixtures_where([](const std::string& n, const vjtest::OracleHeader& h) {
    return is_baseline_fixture(n) && !h.progressive;
  });
}

// Decodes every MCU of the first scan and compares each block with the
// oracle's coefficients. Returns the number of MCUs checked.
uint32_t check_against_oracle(const std::string& name, bool careful_only) {
  const auto jpeg = vjtest::read_fixture(name);
  std::vector<vjtest::OracleComponent> oracle;
  EXPECT_TRUE(vjtest::oracle_coefficients(jpeg, &oracle)) << name;
  vjtest::ScanHarness h;
  EXPECT_TRUE(h.open(jpeg)) << name;
  if (oracle.empty() || h.d() == nullptr || h.d()->entropy == nullptr) return 0;
  vj::g_entropy_careful_only = careful_only;
  uint32_t checked = 0;
  for (uint32_t m = 0; m < h.total_mcus(); ++m) {
    h.clear_mcu();
    h.at(m);
    if (VETAJ_DecodeMcu(h.d(), h.blocks()) != 1) {
      ADD_FAILURE() << name << ": MCU " << m << " failed";
      break;
    }
    for (uint32_t b = 0; b < h.d()->blocks_in_mcu; ++b) {
      int comp, row, col;
      h.block_position(m, b, &comp, &row, &col);
      const auto& oc = oracle[comp];
      if (row >= oc.rows_blocks || col >= oc.stride_blocks) continue;
      if (std::memcmp(h.blocks()[b], oc.block(row, col), 128) != 0) {
        ADD_FAILURE() << name << ": MCU " << m << " block " << b << " (comp " << comp << " at "
                      << row << "," << col << ") differs";
        vj::g_entropy_careful_only = false;
        return checked;
      }
      // The recorded last index points at the last non-zero coefficient.
      const int last = h.d()->last_nonzero[b];
      for (int k = last + 1; k < 64; ++k) EXPECT_EQ(h.blocks()[b][VETAJ_NATURAL_ORDER[k]], 0);
    }
    ++checked;
  }
  vj::g_entropy_careful_only = false;
  return checked;
}

class BaselineCoefficients : public ::testing::TestWithParam<std::string> {};

TEST_P(BaselineCoefficients, MatchLibjpegInBothFetchPolicies) {
  EXPECT_GT(check_against_oracle(GetParam(), false), 0u);
  EXPECT_GT(check_against_oracle(GetParam(), true), 0u);
}

INSTANTIATE_TEST_SUITE_P(Corpus, BaselineCoefficients, ::testing::ValuesIn(baseline_fixtures()),
                         vjtest::fixture_test_name);

// Skipping an MCU keeps the DC predictors exact, and the reduced decoders
// keep exactly the low coefficients of the full decode.
TEST(BaselineDecoding, SkipAndReducedDecodersAgreeWithTheFullDecoder) {
  for (const auto& name : baseline_fixtures()) {
    const auto jpeg = vjtest::read_fixture(name);
    vjtest::ScanHarness full, other;
    ASSERT_TRUE(full.open(jpeg)) << name;
    ASSERT_TRUE(other.open(jpeg, KOLVAVETA_OPT_SKIP_TABLES)) << name;
    const uint32_t n = full.total_mcus();
    int which = 0;
    for (uint32_t m = 0; m < n; ++m) {
      full.clear_mcu();
      other.clear_mcu();
      full.at(m);
      other.at(m);
      ASSERT_EQ(VETAJ_DecodeMcu(full.d(), full.blocks()), 1) << name;
      which = (which + 1) % 5;
      int limit = 63;
      int32_t r;
      switch (which) {
        case 0: r = VETAJ_SkipMcu(other.d()); limit = -1; break;
        case 1: r = VETAJ_DecodeMcu_2to1(other.d(), other.blocks()); limit = 18; break;
        case 2: r = VETAJ_DecodeMcu_4to1(other.d(), other.blocks()); limit = 4; break;
        case 3: r = VETAJ_DecodeMcu_8to3(other.d(), other.blocks()); limit = 8; break;
        default: r = VETAJ_DecodeMcu(other.d(), other.blocks()); break;
      }
      ASSERT_EQ(r, 1) << name << " MCU " << m;
      for (uint32_t b = 0; b < full.d()->blocks_in_mcu && limit >= 0; ++b) {
        for (int k = 0; k < 64; ++k) {
          const int z = VETAJ_NATURAL_ORDER[k];
          const int16_t want = k <= limit ? full.blocks()[b][z] : 0;
          ASSERT_EQ(other.blocks()[b][z], want) << name << " MCU " << m << " k " << k;
        }
      }
      for (int c = 0; c < 4; ++c)
        ASSERT_EQ(full.d()->entropy->last_dc[c], other.d()->entropy->last_dc[c]) << name;
    }
  }
}

#endif  // VETAJ_HAVE_LIBJPEG

// ---------------------------------------------------------------------------
// Restart markers and damaged data

// Offset of the first entropy byte and positions of the RSTn markers.
struct EntropyLayout {
  size_t start = 0;
  std::vector<size_t> rst;  // offset of the 0xFF of each RST marker
  size_t eoi = 0;
};

EntropyLayout layout_of(const std::vector<uint8_t>& j) {
  EntropyLayout l;
  for (size_t i = 2; i + 3 < j.size();) {
    if (j[i] != 0xFF) return l;
    const uint8_t m = j[i + 1];
    const size_t len = (size_t(j[i + 2]) << 8) | j[i + 3];
    if (m == 0xDA) {
      l.start = i + 2 + len;
      break;
    }
    i += 2 + len;
  }
  for (size_t i = l.start; i + 1 < j.size(); ++i) {
    if (j[i] != 0xFF) continue;
    if (j[i + 1] >= 0xD0 && j[i + 1] <= 0xD7) l.rst.push_back(i);
    if (j[i + 1] == 0xD9) {
      l.eoi = i;
      break;
    }
  }
  return l;
}

std::string restart_fixture() {
  for (const auto& n : vjtest::list_fixtures(".jpg")) {
    const auto j = vjtest::read_fixture(n);
    if (n.rfind("base_", 0) != 0) continue;
    const auto l = layout_of(j);
    if (l.rst.size() >= 4) return n;
  }
  return "";
}

std::vector<std::vector<int16_t>> decode_all(const std::vector<uint8_t>& jpeg, int* failures) {
  vjtest::ScanHarness h;
  std::vector<std::vector<int16_t>> out;
  *failures = 0;
  if (!h.open(jpeg)) return out;
  for (uint32_t m = 0; m < h.total_mcus(); ++m) {
    h.clear_mcu();
    h.at(m);
    if (VETAJ_DecodeMcu(h.d(), h.blocks()) != 1) ++*failures;
    out.emplace_back(h.blocks()[0], h.blocks()[0] + 64 * h.d()->blocks_in_mcu);
  }
  return out;
}

TEST(RestartMarkers, MissingMarkerSkipsOneIntervalAndResynchronises) {
  const std::string name = restart_fixture();
  if (name.empty()) GTEST_SKIP() << "no fixture with restart markers";
  const auto jpeg = vjtest::read_fixture(name);
  const auto l = layout_of(jpeg);
  vjtest::ScanHarness probe;
  ASSERT_TRUE(probe.open(jpeg));
  const uint32_t ri = probe.d()->restart_interval;
  ASSERT_GT(ri, 0u);
  int failures = 0;
  const auto good = decode_all(jpeg, &failures);
  ASSERT_EQ(failures, 0);
  // Remove RST1: intervals 0 and 1 decode, interval 2 reads zero bits (its
  // first MCU from zeros, the rest untouched), decoding resumes at RST2.
  auto broken = jpeg;
  broken.erase(broken.begin() + static_cast<long>(l.rst[1]),
               broken.begin() + static_cast<long>(l.rst[1]) + 2);
  const auto got = decode_all(broken, &failures);
  ASSERT_EQ(got.size(), good.size());
  EXPECT_EQ(failures, 0);
  for (size_t m = 0; m < got.size(); ++m) {
    const size_t interval = m / ri;
    if (interval == 2) {
      if (m % ri != 0) {
        EXPECT_EQ(got[m], std::vector<int16_t>(got[m].size(), 0)) << m;
      }
    } else {
      EXPECT_EQ(got[m], good[m]) << "MCU " << m;
    }
  }
  // Out-of-order markers: the intervals before them decode, nothing fails.
  auto swapped = jpeg;
  std::swap(swapped[l.rst[1] + 1], swapped[l.rst[2] + 1]);
  const auto got2 = decode_all(swapped, &failures);
  ASSERT_EQ(got2.size(), good.size());
  EXPECT_EQ(failures, 0);
  for (size_t m = 0; m < 2 * ri; ++m) EXPECT_EQ(got2[m], good[m]) << "MCU " << m;
}

TEST(RestartMarkers, RestartSearchCountsDiscardedBytes) {
  // Ten data bytes and one stuffed 0xFF 0x00 before RST0: 12 discarded, plus
  // the whole bytes left in the bit buffer.
  std::vector<uint8_t> data = {1, 2, 3, 4, 5, 0xFF, 0x00, 6, 7, 8, 9, 10, 0xFF, 0xD0, 0x55};
  IoStream* s = KOLVAVETA_Open_IO(1, data.data(), static_cast<uint32_t>(data.size()));
  StreamWindow w;
  ASSERT_TRUE(vj::window_open(&w, s));
  ASSERT_EQ(VETAJ_CheckBuffer(&w, 1), 1);
  DecoderInfo d{};
  MarkerState m{};
  EntropyState e{};
  d.marker = &m;
  d.entropy = &e;
  d.window = &w;
  d.stream = s;
  d.restart_interval = 4;
  d.comps_in_scan = 2;
  e.bits_left = 17;
  e.last_dc[0] = 5;
  e.last_dc[1] = 6;
  e.insufficient = 1;
  ASSERT_EQ(VETAJ_ProcessRestartMarker(&d), 1);
  EXPECT_EQ(m.discarded, 12u + 2u);
  EXPECT_EQ(d.unread_marker, 0u);
  EXPECT_EQ(m.next_restart, 1);
  EXPECT_EQ(e.last_dc[0], 0);
  EXPECT_EQ(e.last_dc[1], 0);
  EXPECT_EQ(e.insufficient, 0);
  EXPECT_EQ(e.restarts_to_go, 4u);
  EXPECT_EQ(w.remaining, 1u);  // cursor right after the marker
  // End of input while searching fails.
  EXPECT_EQ(VETAJ_ProcessRestartMarker(&d), 0);
  vj::window_close(&w);
  KOLVAVETA_Close_IO(s);
}

TEST(BitReader, StuffingMarkersAndZeroFill) {
  // 0xFF 0x00 and 0xFF 0xFF 0x00 are data bytes 0xFF; EOI stops the data.
  std::vector<uint8_t> data = {0xFF, 0x00, 0xFF, 0xFF, 0x00, 0x81, 0xFF, 0xD9};
  IoStream* s = KOLVAVETA_Open_IO(1, data.data(), static_cast<uint32_t>(data.size()));
  StreamWindow w;
  ASSERT_TRUE(vj::window_open(&w, s));
  ASSERT_EQ(VETAJ_CheckBuffer(&w, 1), 1);
  DecoderInfo d{};
  EntropyState e{};
  d.entropy = &e;
  d.window = &w;
  d.stream = s;
  BitWorkState ws{0, 0, &d};
  ASSERT_EQ(VETAJ_ReadBits(&ws, 0, 0, 24), 1);
  EXPECT_EQ(ws.bits_left, 24);  // 24 real bits, then the marker stops the data
  EXPECT_EQ(ws.buffer & 0xFFFFFF, 0xFFFF81u);
  EXPECT_EQ(d.unread_marker, 0xD9u);
  EXPECT_EQ(e.insufficient, 0);
  // Asking for more than there is supplies zero bits and sets the flag.
  ASSERT_EQ(VETAJ_ReadBits(&ws, ws.buffer, ws.bits_left, 25), 1);
  EXPECT_EQ(ws.bits_left, 25);
  EXPECT_EQ(ws.buffer & 0x1FFFFFF, 0xFFFF81u << 1);
  EXPECT_EQ(e.insufficient, 1);
  vj::window_close(&w);
  KOLVAVETA_Close_IO(s);
}

TEST(BaselineDecoding, InsufficientDataLeavesBlocksZeroAndCountsDown) {
  const std::string name = "sample.jpg";
  const auto jpeg = vjtest::read_fixture(name);
  if (jpeg.empty()) GTEST_SKIP();
  vjtest::ScanHarness h;
  ASSERT_TRUE(h.open(jpeg));
  h.d()->entropy->insufficient = 1;
  h.d()->entropy->restarts_to_go = 9;
  h.clear_mcu();
  ASSERT_EQ(VETAJ_DecodeMcu(h.d(), h.blocks()), 1);
  for (int i = 0; i < 64 * h.d()->blocks_in_mcu; ++i) ASSERT_EQ(h.blocks()[0][i], 0);
  EXPECT_EQ(h.d()->entropy->restarts_to_go, 8u);
}

TEST(BaselineDecoding, DataCutByEoiReadsZeroBitsWithTheFlagSet) {
  const auto jpeg = vjtest::read_fixture("sample.jpg");
  if (jpeg.empty()) GTEST_SKIP();
  const auto l = layout_of(jpeg);
  ASSERT_GT(l.eoi, l.start);
  std::vector<uint8_t> cut(jpeg.begin(), jpeg.begin() + static_cast<long>((l.start + l.eoi) / 2));
  if (cut.back() == 0xFF) cut.pop_back();
  cut.push_back(0xFF);
  cut.push_back(0xD9);
  vjtest::ScanHarness h;
  ASSERT_TRUE(h.open(cut));
  uint32_t m = 0;
  for (; m < h.total_mcus() && h.d()->entropy->insufficient == 0; ++m) {
    h.clear_mcu();
    ASSERT_EQ(VETAJ_DecodeMcu(h.d(), h.blocks()), 1);
  }
  EXPECT_LT(m, h.total_mcus());
  EXPECT_EQ(h.d()->unread_marker, 0xD9u);
  for (; m < h.total_mcus(); ++m) {
    h.clear_mcu();
    ASSERT_EQ(VETAJ_DecodeMcu(h.d(), h.blocks()), 1);
    for (int i = 0; i < 64 * h.d()->blocks_in_mcu; ++i) ASSERT_EQ(h.blocks()[0][i], 0);
  }
}

// Damaged entropy data: every decoder either succeeds or fails, never
// reading outside the input or writing outside the blocks (sanitizers).
TEST(BaselineDecoding, CorruptAndTruncatedDataIsSurvived) {
  std::vector<std::string> names;
  for (const auto& n : vjtest::list_fixtures(".jpg"))
    if (n.rfind("base_", 0) == 0 && vjtest::read_fixture(n).size() < 6000) names.push_back(n);
  if (names.size() > 6) names.resize(6);
  std::mt19937 rng(1234);
  for (const auto& name : names) {
    const auto jpeg = vjtest::read_fixture(name);
    const auto l = layout_of(jpeg);
    if (l.start == 0) continue;
    std::vector<std::vector<uint8_t>> variants;
    for (size_t cut = l.start; cut < jpeg.size(); cut += 1 + (jpeg.size() - l.start) / 64)
      variants.emplace_back(jpeg.begin(), jpeg.begin() + static_cast<long>(cut));
    for (int i = 0; i < 24; ++i) {
      auto v = jpeg;
      for (int k = 0; k < 1 + i % 5; ++k) {
        const size_t at = l.start + rng() % (jpeg.size() - l.start);
        v[at] ^= static_cast<uint8_t>(1u << (rng() % 8));
      }
      variants.push_back(v);
    }
    auto ff = jpeg;
    for (size_t i = l.start; i < std::min(ff.size(), l.start + 300); ++i) ff[i] = 0xFF;
    variants.push_back(ff);
    for (const auto& v : variants) {
      for (int policy = 0; policy < 2; ++policy) {
        vjtest::ScanHarness h;
        if (!h.open(v, KOLVAVETA_OPT_SKIP_TABLES)) continue;
        vj::g_entropy_careful_only = policy == 1;
        for (uint32_t m = 0; m < h.total_mcus(); ++m) {
          h.clear_mcu();
          h.at(m);
          switch (m % 4) {
            case 0: (void)VETAJ_DecodeMcu(h.d(), h.blocks()); break;
            case 1: (void)VETAJ_SkipMcu(h.d()); break;
            case 2: (void)VETAJ_DecodeMcu_8to1(h.d(), h.blocks()); break;
            default: (void)VETAJ_FastDecodeMcu(h.d(), h.blocks()); break;
          }
        }
        vj::g_entropy_careful_only = false;
      }
    }
  }
}

}  // namespace
