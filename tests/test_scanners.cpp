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

int32_t summarise(const Bytes& bytes, uint32_t result[kSummaryWords], int32_t mode = 8) {
  return vjtest::on_memory_window(
      bytes, [&](StreamWindow* w) { return VETAJ_SimpleParser(w, mode, result); });
}

int32_t find_end(const Bytes& bytes, uint32_t* end, uint32_t result[3]) {
  return vjtest::on_memory_window(
      bytes, [&](StreamWindow* w) { return VETAJ_EOIParser(w, 8, result, end); });
}

Bytes patched(Bytes b, size_t at, uint8_t value) {
  b[at] = value;
  return b;
}

// Offset of the first marker `code` in a stream.
size_t marker_at(const Bytes& b, uint8_t code) {
  for (size_t i = 0; i + 1 < b.size(); ++i)
    if (b[i] == 0xFF && b[i + 1] == code) return i;
  return b.size();
}

struct SummaryCase {
  const char* name;
  Bytes bytes;
  int32_t status;
  uint32_t words[kSummaryWords];
};

std::vector<SummaryCase> summary_cases() {
  const Bytes b420 = vjtest::small_baseline(33, 17, 2, 2);
  const size_t sof = marker_at(b420, 0xC0);
  Bytes garbage{0x00, 0xFF, 0x12, 0xD8, 0xFF, 0xFF, 0x00};
  garbage.resize(3000, 0x5A);
  garbage.insert(garbage.end(), b420.begin(), b420.end());
  const auto sof_with = [](uint32_t w, uint32_t h, uint8_t hv, uint8_t precision) {
    JpegBuilder b;
    b.soi().sof(0xC0, w, h, {{1, static_cast<uint8_t>(hv >> 4), static_cast<uint8_t>(hv & 15), 0}},
                precision);
    return b.sos({{1, 0}}).raw({1, 2}).eoi().bytes();
  };
  JpegBuilder bad_dri;
  bad_dri.soi().sof(0xC0, 8, 8, {{1, 1, 1, 0}}).segment(0xDD, {0, 4, 0}).sos({{1, 0}});
  JpegBuilder no_frame;
  no_frame.soi().dqt(0).sos({{1, 0}});
  JpegBuilder length_mismatch;
  length_mismatch.soi().raw({0xFF, 0xC0, 0, 12, 8, 0, 8, 0, 8, 1, 1, 0x11, 0, 0});
  length_mismatch.sos({{1, 0}});
  Bytes prog12 = vjtest::small_progressive(8, 8);
  prog12[marker_at(prog12, 0xC2) + 4] = 12;

  return {
      {"Progressive", vjtest::small_progressive(17, 33), 200, {17, 33, 1, 0, 0, 0}},
      {"ExtendedSequential", patched(b420, sof + 1, 0xC1), 200, {33, 17, 0, 0, 2, 2}},
      {"LeadingGarbage", garbage, 200, {33, 17, 0, 0, 2, 2}},
      {"NoSoi", patched(b420, 1, 0xD7), 201, {}},
      {"ScanWithoutFrame", no_frame.bytes(), 201, {}},
      {"DriLengthFive", bad_dri.bytes(), 201, {8, 8, 0, 0, 1, 1}},
      {"Progressive12Bit", prog12, 201, {8, 8, 1}},
      {"WidthZero", sof_with(0, 8, 0x11, 8), 201, {0, 8}},
      {"Height50001", sof_with(8, 50001, 0x11, 8), 201, {8, 50001}},
      {"Sampling5", sof_with(8, 8, 0x51, 8), 201, {8, 8}},
      {"SamplingZero", sof_with(8, 8, 0x10, 8), 201, {8, 8}},
      {"FrameLengthMismatch", length_mismatch.bytes(), 201, {8, 8}},
      {"Truncated", Bytes(b420.begin(), b420.begin() + static_cast<long>(sof + 12)), 201,
       {33, 17}},
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

TEST(SimpleParser, AcceptsOnlyModes8And2) {
  const Bytes b = vjtest::small_baseline(8, 8);
  for (int32_t mode : {0, 1, 3, 7, 9, -8}) {
    uint32_t result[kSummaryWords] = {};
    EXPECT_EQ(summarise(b, result, mode), 201) << mode;
  }
  uint32_t result[kSummaryWords] = {};
  EXPECT_EQ(summarise(b, result, 2), 200);
}

// A stream ending at exactly `end` bytes with `trailing` bytes after EOI.
Bytes stream_ending_at(size_t end, size_t trailing) {
  JpegBuilder body;
  body.sof(0xC0, 16, 16, {{1, 1, 1, 0}}).sos({{1, 0}}).raw({1, 2, 0xFF, 0, 3}).eoi();
  // A comment widened so that EOI ends at `end`.
  JpegBuilder b;
  b.soi().com(static_cast<uint32_t>(end - body.size() - 6)).raw(body.bytes());
  Bytes out = b.bytes();
  out.resize(out.size() + trailing, 0xFF);
  return out;
}

TEST(EOIParser, ReportsTheOffsetPastEoiNotTheInputSize) {
  for (size_t end : {201u, 202u, 5000u, 40000u}) {
    const Bytes b = stream_ending_at(end, 300);
    uint32_t offset = 0;
    uint32_t result[3] = {};
    ASSERT_EQ(find_end(b, &offset, result), 200) << end;
    EXPECT_EQ(offset, end);
    EXPECT_EQ(result[0], 16u);
    EXPECT_EQ(result[1], 16u);
    EXPECT_EQ(result[2], 0u);
  }
}

TEST(EOIParser, WalksThroughScansAndSkipsEmbeddedStreams) {
  // A JPEG inside an APP1 segment holds an EOI of its own.
  const Bytes inner = vjtest::small_baseline(4, 4);
  JpegBuilder b;
  b.soi().segment(0xE1, inner);
  const Bytes p = vjtest::small_progressive(9, 7);
  b.raw(Bytes(p.begin() + 2, p.end())).raw({0, 0, 0});
  uint32_t offset = 0;
  uint32_t result[3] = {};
  ASSERT_EQ(find_end(b.bytes(), &offset, result), 200);
  EXPECT_EQ(offset, b.size() - 3);
  EXPECT_EQ(result[0], 9u);
  EXPECT_EQ(result[1], 7u);
  EXPECT_EQ(result[2], 1u);

  Bytes no_eoi = vjtest::small_baseline(8, 8);
  no_eoi.resize(no_eoi.size() - 2);
  EXPECT_EQ(find_end(no_eoi, &offset, result), 201);
}

// ---------------------------------------------------------------------------
// KOLVAVETA_JpgParser on every input kind

const InputKind kAllKinds[] = {InputKind::kPath, InputKind::kHandle, InputKind::kMemory,
                               InputKind::kOwnedMemory, InputKind::kStream};

// A stream whose segments straddle window refills: large comments and an
// Exif block before the frame.
Bytes large_stream() {
  JpegBuilder b;
  b.soi().com(20000, 0x11).segment(0xE1, Bytes(40000, 0xFF)).com(3, 0xD8);
  const Bytes body = vjtest::small_baseline(1023, 17, 2, 1, 7);
  return b.raw(Bytes(body.begin() + 2, body.end())).bytes();
}

class JpgParserKinds : public ::testing::TestWithParam<InputKind> {};

TEST_P(JpgParserKinds, ReadSegmentsThatStraddleWindowRefillsAgainAndAgain) {
  const Bytes bytes = large_stream();
  InputHolder in(GetParam(), bytes);
  DecInfo* object = in.object();
  ASSERT_NE(object, nullptr);
  for (int round = 0; round < 2; ++round) {
    JpegInfo info;
    std::memset(&info, 0x7F, sizeof info);
    ASSERT_EQ(KOLVAVETA_JpgParser(object, &info), 1);
    EXPECT_EQ(gKOLVAVETA_Error, 0);
    EXPECT_EQ(info.width, 1023);
    EXPECT_EQ(info.height, 17);
    EXPECT_EQ(info.input_size, bytes.size());
    EXPECT_EQ(info.image_count, 1);
    EXPECT_EQ(info.restart_interval, 7);
    EXPECT_EQ(info.max_h_samp, 2);
    EXPECT_EQ(info.max_v_samp, 1);
    EXPECT_EQ(info.reserved[0], 0);
    EXPECT_EQ(object->image_width, 1023);
    EXPECT_EQ(object->image_height, 17);
  }
}

INSTANTIATE_TEST_SUITE_P(Inputs, JpgParserKinds, ::testing::ValuesIn(kAllKinds),
                         [](const auto& p) { return vjtest::input_kind_name(p.param); });

TEST(JpgParser, RefusesANullObjectAndOtherImages) {
  JpegInfo info{};
  EXPECT_EQ(KOLVAVETA_JpgParser(nullptr, &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, 1);
  const Bytes png{0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A, 0, 0, 0, 13, 'I', 'H', 'D', 'R',
                  0, 0, 0, 16, 0, 0, 0, 16, 8, 2, 0, 0, 0};
  InputHolder in(InputKind::kMemory, png);
  EXPECT_EQ(KOLVAVETA_JpgParser(in.object(), &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, 5);
  EXPECT_EQ(in.object()->image_width, 0);
}

// ---------------------------------------------------------------------------
// The fixture corpus

// The summary words a caller sees, in one comparable record.
std::vector<int32_t> words(const JpegInfo& info) {
  std::vector<int32_t> w(13);
  std::memcpy(w.data(), &info, sizeof info);
  return w;
}

class CorpusSummary : public ::testing::TestWithParam<std::string> {};

TEST_P(CorpusSummary, AgreesWithTheOracleOnEveryInputKind) {
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
  if (refused) {
    EXPECT_EQ(gKOLVAVETA_Error, 5);
  }
#if VETAJ_HAVE_LIBJPEG
  vjtest::OracleHeader o;
  if (ok == 1) {
    ASSERT_TRUE(vjtest::oracle_header(bytes, &o));
    EXPECT_EQ(reference.width, o.width);
    EXPECT_EQ(reference.height, o.height);
    EXPECT_EQ(reference.progressive, o.progressive);
    EXPECT_EQ(reference.restart_interval, o.restart_interval);
    // The summary gives the sampling factors of sequential frames only.
    EXPECT_EQ(reference.max_h_samp, o.progressive ? 0 : o.max_h);
    EXPECT_EQ(reference.max_v_samp, o.progressive ? 0 : o.max_v);
  }
#endif
  for (InputKind kind : kAllKinds) {
    InputHolder in(kind, bytes);
    ASSERT_NE(in.object(), nullptr);
    JpegInfo info{};
    EXPECT_EQ(KOLVAVETA_JpgParser(in.object(), &info), ok) << vjtest::input_kind_name(kind);
    EXPECT_EQ(words(info), words(reference)) << vjtest::input_kind_name(kind);
  }
}

TEST_P(CorpusSummary, EndOffsetIsWhereTheJpegDataEnds) {
  const std::string name = GetParam();
  const Bytes bytes = vjtest::read_fixture(name);
  const vjtest::ManifestEntry* entry = vjtest::manifest_entry(name);
  ASSERT_NE(entry, nullptr);
  uint32_t expected = static_cast<uint32_t>(bytes.size());
  if (name.find("12bit") != std::string::npos) expected = 0;  // not an 8-bit frame
  if (entry->fields.count("patch") != 0 && entry->fields.at("patch") == "300_bytes_after_EOI")
    expected -= 300;
  for (InputKind kind : {InputKind::kMemory, InputKind::kStream, InputKind::kPath}) {
    InputHolder in(kind, bytes);
    JpegInfo info{};
    EXPECT_EQ(VETAJ_GetEOIOffset(in.object()->stream, &info), expected)
        << vjtest::input_kind_name(kind);
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, CorpusSummary,
                         ::testing::ValuesIn(vjtest::list_fixtures(".jpg")),
                         [](const auto& p) { return vjtest::fixture_test_name(p.param); });

TEST(CorpusContainers, JpegInsideTiffIsReadAtItsOffset) {
  const auto names = vjtest::list_fixtures(".tif");
  ASSERT_FALSE(names.empty());
  for (const std::string& name : names) {
    const Bytes bytes = vjtest::read_fixture(name);
    const vjtest::ManifestEntry* entry = vjtest::manifest_entry(name);
    ASSERT_NE(entry, nullptr) << name;
    const uint32_t offset = static_cast<uint32_t>(entry->number("jpeg_offset"));
    const uint32_t length = static_cast<uint32_t>(entry->number("jpeg_length"));
    ASSERT_GT(offset, 0u);
    InputHolder in(InputKind::kMemory, bytes);
    JpegInfo info{};
    info.jpeg_offset = offset;
    ASSERT_EQ(VETAJ_GetHInfo(in.object()->stream, &info), 1) << name;
    EXPECT_EQ(info.width, 64);
    EXPECT_EQ(info.height, 48);
    EXPECT_EQ(info.max_h_samp, 2);
    JpegInfo end{};
    end.jpeg_offset = offset;
    EXPECT_EQ(VETAJ_GetEOIOffset(in.object()->stream, &end), offset + length) << name;
  }
}

// Truncated copies of every fixture: never a crash, and a summary or end
// offset only when it is the whole file's.
TEST(CorpusTruncation, SummariesOfTruncatedCopiesAreAllOrNothing) {
  for (const std::string& name : vjtest::list_fixtures(".jpg")) {
    const Bytes full = vjtest::read_fixture(name);
    InputHolder whole(InputKind::kMemory, full);
    JpegInfo expected{};
    const int32_t full_ok = KOLVAVETA_JpgParser(whole.object(), &expected);
    JpegInfo end_info{};
    const uint32_t full_end = VETAJ_GetEOIOffset(whole.object()->stream, &end_info);
    size_t i = 0;
    for (size_t n : vjtest::cut_lengths(full.size(), 400, 40)) {
      const Bytes cut(full.begin(), full.begin() + static_cast<long>(n));
      const InputKind kind = (i++ % 5 == 0) ? InputKind::kStream : InputKind::kMemory;
      InputHolder in(kind, cut);
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
