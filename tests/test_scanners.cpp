// The quick stream scanners and the JPEG header summary call.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "io/stream.h"
#include "support/files.h"
#include "support/manifest.h"
#include "support/oracle.h"
#include "support/segments.h"
#include "syntax/scanners.h"

namespace {

using vjtest::Bytes;
using vjtest::InputHolder;
using vjtest::InputKind;
using vjtest::JpegBuilder;

const InputKind kAllKinds[] = {InputKind::kPath, InputKind::kHandle, InputKind::kMemory,
                               InputKind::kOwnedMemory, InputKind::kStream};

int32_t summarise(const Bytes& bytes, uint32_t result[kSummaryWords], int32_t mode = 8) {
  return vjtest::on_memory_window(
      bytes, [&](StreamWindow* w) { return VETAJ_SimpleParser(w, mode, result); });
}

int32_t find_end(const Bytes& bytes, uint32_t* end, uint32_t result[3]) {
  return vjtest::on_memory_window(
      bytes, [&](StreamWindow* w) { return VETAJ_EOIParser(w, 8, result, end); });
}

// The summary words a caller sees, in one comparable record.
std::vector<int32_t> words(const JpegInfo& info) {
  std::vector<int32_t> w(sizeof info / 4);
  std::memcpy(w.data(), &info, sizeof info);
  return w;
}

// A one-component frame (sampling hv) and a scan.
Bytes frame(uint32_t w, uint32_t h, uint8_t hv = 0x11) {
  JpegBuilder b;
  b.soi().sof(0xC0, w, h, {{1, uint8_t(hv >> 4), uint8_t(hv & 15), 0}});
  return b.sos({{1, 0}}).raw({1, 2}).eoi().bytes();
}

struct SummaryCase {
  const char* name;
  Bytes bytes;
  int32_t status;
  uint32_t words[kSummaryWords];  // including what a failing walk wrote
};

std::vector<SummaryCase> summary_cases() {
  const Bytes b420 = vjtest::small_baseline(33, 17, 2, 2);
  Bytes garbage{0x00, 0xFF, 0x12, 0xD8, 0xFF, 0xFF, 0x00};
  garbage.resize(3000, 0x5A);
  garbage.insert(garbage.end(), b420.begin(), b420.end());
  Bytes sof1 = b420, no_soi = b420, prog12 = vjtest::small_progressive(8, 8);
  for (size_t i = 0; i + 1 < sof1.size(); ++i)
    if (sof1[i] == 0xFF && sof1[i + 1] == 0xC0) sof1[i + 1] = 0xC1;
  for (size_t i = 0; i + 1 < prog12.size(); ++i)
    if (prog12[i] == 0xFF && prog12[i + 1] == 0xC2) prog12[i + 4] = 12;
  no_soi[1] = 0xD7;
  JpegBuilder bad_dri, no_frame, length_mismatch;
  bad_dri.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).segment(0xDD, {0, 4, 0}).sos({{1, 0}});
  no_frame.soi().dqt(0).sos({{1, 0}});
  length_mismatch.soi().raw({0xFF, 0xC0, 0, 12, 8, 0, 8, 0, 8, 1, 1, 0x11, 0, 0}).sos({{1, 0}});
  return {
      {"ExtendedSequential", sof1, 200, {33, 17, 0, 0, 2, 2}},
      {"LeadingGarbage", garbage, 200, {33, 17, 0, 0, 2, 2}},
      {"NoSoi", no_soi, 201, {}},
      {"ScanWithoutFrame", no_frame.bytes(), 201, {}},
      {"DriLengthFive", bad_dri.bytes(), 201, {8, 8, 0, 0, 1, 1}},
      {"Progressive12Bit", prog12, 201, {8, 8, 1}},
      {"WidthZero", frame(0, 8), 201, {0, 8}},
      {"Height50001", frame(8, 50001), 201, {8, 50001}},
      {"Sampling5", frame(8, 8, 0x51), 201, {8, 8}},
      {"SamplingZero", frame(8, 8, 0x10), 201, {8, 8}},
      {"FrameLengthMismatch", length_mismatch.bytes(), 201, {8, 8}},
  };
}

class SimpleParserCase : public ::testing::TestWithParam<SummaryCase> {};

TEST_P(SimpleParserCase, ReportsTheSummaryOrFails) {
  const SummaryCase& c = GetParam();
  uint32_t result[kSummaryWords] = {};
  ASSERT_EQ(summarise(c.bytes, result), c.status);
  for (uint32_t i = 0; i < kSummaryWords; ++i) EXPECT_EQ(result[i], c.words[i]) << "word " << i;
}

INSTANTIATE_TEST_SUITE_P(Streams, SimpleParserCase, ::testing::ValuesIn(summary_cases()),
                         [](const auto& p) { return std::string(p.param.name); });

// A comment of 0 to 40000 bytes before the frame moves EOI across window
// refills; 300 bytes follow it; a JPEG inside an APP1 segment holds an EOI
// of its own.
TEST(EOIParser, ReportsTheOffsetPastTheOuterEoi) {
  const Bytes scans = vjtest::small_progressive(16, 9);
  for (uint32_t comment : {0u, 1u, 5000u, 40000u}) {
    JpegBuilder b;
    b.soi().com(comment).segment(0xE1, vjtest::small_baseline(4, 4));
    Bytes bytes = b.raw(Bytes(scans.begin() + 2, scans.end())).bytes();
    const size_t end = bytes.size();
    bytes.resize(end + 300, 0xFF);
    uint32_t offset = 0, result[3] = {};
    ASSERT_EQ(find_end(bytes, &offset, result), 200) << comment;
    EXPECT_EQ(offset, end);
    EXPECT_EQ(std::vector<uint32_t>(result, result + 3), std::vector<uint32_t>({16, 9, 1}));
  }
}

// ---------------------------------------------------------------------------
// KOLVAVETA_JpgParser on every input kind

class JpgParserKinds : public ::testing::TestWithParam<InputKind> {};

// Segments that straddle window refills: large comments and an APP1 block
// before the frame; a repeated call gives the same summary.
TEST_P(JpgParserKinds, ReadSegmentsThatStraddleWindowRefills) {
  JpegBuilder b;
  b.soi().com(20000, 0x11).segment(0xE1, Bytes(40000, 0xFF)).com(3, 0xD8);
  const Bytes body = vjtest::small_baseline(1023, 17, 2, 1, 7);
  const Bytes bytes = b.raw(Bytes(body.begin() + 2, body.end())).bytes();
  InputHolder in(GetParam(), bytes);
  ASSERT_NE(in.object(), nullptr);
  const std::vector<int32_t> want{1023, 17, int32_t(bytes.size()), 1, 0, 7, 2, 1, 0, 0, 0, 0, 0};
  for (int round = 0; round < 2; ++round) {
    JpegInfo info;
    std::memset(&info, 0x7F, sizeof info);
    ASSERT_EQ(KOLVAVETA_JpgParser(in.object(), &info), 1);
    EXPECT_EQ(gKOLVAVETA_Error, 0);
    EXPECT_EQ(words(info), want);
    EXPECT_EQ(in.object()->image_width, 1023);
  }
}

INSTANTIATE_TEST_SUITE_P(Inputs, JpgParserKinds, ::testing::ValuesIn(kAllKinds),
                         [](const auto& p) { return vjtest::input_kind_name(p.param); });

TEST(JpgParser, RefusesANullObjectAndOtherImages) {
  JpegInfo info{};
  EXPECT_EQ(KOLVAVETA_JpgParser(nullptr, &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, 1);
  InputHolder in(InputKind::kMemory, {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A, 0, 0, 0, 13,
                                      'I', 'H', 'D', 'R', 0, 0, 0, 16, 0, 0, 0, 16, 8, 2, 0});
  EXPECT_EQ(KOLVAVETA_JpgParser(in.object(), &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, 5);
  EXPECT_EQ(in.object()->image_width, 0);
}

// ---------------------------------------------------------------------------
// The fixture corpus

class CorpusSummary : public ::testing::TestWithParam<std::string> {};

TEST_P(CorpusSummary, AgreesWithTheOracleAndFindsTheEndOnEveryInputKind) {
  const std::string name = GetParam();
  const Bytes bytes = vjtest::read_fixture(name);
  ASSERT_FALSE(bytes.empty());
  InputHolder memory(InputKind::kMemory, bytes);
  JpegInfo reference{};
  const int32_t ok = KOLVAVETA_JpgParser(memory.object(), &reference);
  // 12-bit and arithmetic-coded frames have no summary; an extended
  // sequential frame is read like a baseline one.
  const bool refused = vjtest::has_kind(name, "bad_") && name.find("sof1") == std::string::npos;
  ASSERT_EQ(ok, refused ? 0 : 1);
#if VETAJ_HAVE_LIBJPEG
  vjtest::OracleHeader o;
  if (ok == 1) {
    ASSERT_TRUE(vjtest::oracle_header(bytes, &o));
    // The summary gives the sampling factors of sequential frames only.
    EXPECT_EQ(std::vector<int32_t>({reference.width, reference.height, reference.progressive,
                                    reference.restart_interval, reference.max_h_samp,
                                    reference.max_v_samp}),
              std::vector<int32_t>({o.width, o.height, o.progressive, o.restart_interval,
                                    o.progressive ? 0 : o.max_h, o.progressive ? 0 : o.max_v}));
  }
#endif
  // The end offset: where the JPEG data ends (none for a 12-bit frame).
  const vjtest::ManifestEntry* entry = vjtest::manifest_entry(name);
  ASSERT_NE(entry, nullptr);
  uint32_t end = name.find("12bit") != std::string::npos ? 0 : uint32_t(bytes.size());
  if (entry->fields.count("patch") != 0 && entry->fields.at("patch") == "300_bytes_after_EOI")
    end -= 300;
  for (InputKind kind : kAllKinds) {
    InputHolder in(kind, bytes);
    ASSERT_NE(in.object(), nullptr);
    JpegInfo info{};
    EXPECT_EQ(KOLVAVETA_JpgParser(in.object(), &info), ok) << vjtest::input_kind_name(kind);
    EXPECT_EQ(words(info), words(reference)) << vjtest::input_kind_name(kind);
    EXPECT_EQ(VETAJ_GetEOIOffset(in.object()->stream, &info), end)
        << vjtest::input_kind_name(kind);
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, CorpusSummary,
                         ::testing::ValuesIn(vjtest::list_fixtures(".jpg")),
                         [](const auto& p) { return vjtest::fixture_test_name(p.param); });

// Truncated copies of every fixture: never a crash, and a summary or end
// offset only when it is the whole file's.
TEST(CorpusTruncation, SummariesOfTruncatedCopiesAreAllOrNothing) {
  for (const std::string& name : vjtest::list_fixtures(".jpg")) {
    const Bytes full = vjtest::read_fixture(name);
    InputHolder whole(InputKind::kMemory, full);
    JpegInfo expected{}, end_info{};
    const int32_t full_ok = KOLVAVETA_JpgParser(whole.object(), &expected);
    const uint32_t full_end = VETAJ_GetEOIOffset(whole.object()->stream, &end_info);
    size_t i = 0;
    for (size_t n : vjtest::cut_lengths(full.size(), 400, 40)) {
      const Bytes cut(full.begin(), full.begin() + static_cast<long>(n));
      InputHolder in((i++ % 5 == 0) ? InputKind::kStream : InputKind::kMemory, cut);
      JpegInfo info{};
      if (KOLVAVETA_JpgParser(in.object(), &info) == 1) {
        EXPECT_EQ(full_ok, 1) << name << " at " << n;
        info.input_size = expected.input_size;
        EXPECT_EQ(words(info), words(expected)) << name << " at " << n;
      }
      JpegInfo e{};
      const uint32_t end = VETAJ_GetEOIOffset(in.object()->stream, &e);
      EXPECT_EQ(end, n >= full_end && full_end != 0 ? full_end : 0u) << name << " at " << n;
    }
  }
}

}  // namespace
