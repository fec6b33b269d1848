// The fixture corpus itself: every file is listed in the manifest, the bad
// files are what they claim to be, and the oracle survives broken input.
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include "support/files.h"
#include "support/manifest.h"
#include "support/oracle.h"

namespace vjtest {
namespace {

TEST(FixtureManifest, ListsEveryFileWithItsSize) {
  const std::vector<uint8_t> text = read_fixture("MANIFEST.txt");
  std::istringstream manifest(std::string(text.begin(), text.end()));
  size_t lines = 0;
  for (std::string line; std::getline(manifest, line);) lines += !line.empty() && line[0] != '#';
  size_t files = 0;
  for (const std::string& name : list_fixtures("")) {
    if (name == "MANIFEST.txt") continue;
    ++files;
    const ManifestEntry* entry = manifest_entry(name);
    ASSERT_NE(entry, nullptr) << "not in MANIFEST.txt: " << name;
    EXPECT_EQ(entry->size, read_fixture(name).size()) << name;
  }
  EXPECT_EQ(lines, files) << "files listed twice or missing";
}

#if VETAJ_HAVE_LIBJPEG

// The library decodes only 8-bit SOF0 and SOF2 frames: each bad file has
// another frame type, or a precision that libjpeg (8-bit) refuses too.
std::vector<std::string> bad_fixtures() {
  std::vector<std::string> out;
  for (const std::string& name : list_fixtures(".jpg"))
    if (has_kind(name, "bad_")) out.push_back(name);
  return out;
}

class BadFixture : public ::testing::TestWithParam<std::string> {};

TEST_P(BadFixture, HasAFrameTheDecoderMustReject) {
  const std::vector<uint8_t> b = read_fixture(GetParam());
  int marker = 0, precision = 0;  // of the first frame header before any scan
  for (size_t i = 2; i + 4 < b.size() && marker == 0;) {
    const int code = b[i + 1];
    if (b[i] != 0xFF || code == 0xFF) {
      ++i;
    } else if (code == 0xDA || code == 0xD9) {
      break;
    } else if (code >= 0xC0 && code <= 0xCF && code != 0xC4 && code != 0xC8 && code != 0xCC) {
      marker = code;
      precision = b[i + 4];
    } else {
      i += 2 + (size_t(b[i + 2]) << 8 | b[i + 3]);
    }
  }
  OracleHeader h;
  if (precision != 8) {
    EXPECT_FALSE(oracle_header(b, &h));
  } else {
    EXPECT_TRUE(marker != 0xC0 && marker != 0xC2) << std::hex << marker;
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, BadFixture, ::testing::ValuesIn(bad_fixtures()),
                         [](const auto& p) { return fixture_test_name(p.param); });

TEST(Oracle, RefusesBrokenInputWithoutEndingTheProcess) {
  const std::vector<uint8_t> good = read_fixture("base_420_q75_64x48.jpg");
  ASSERT_FALSE(good.empty());
  const std::vector<uint8_t> no_scan(good.begin(), good.begin() + 100);  // cut inside the tables
  OracleHeader h;
  std::vector<OracleComponent> comps;
  OraclePlanes p;
  for (const std::vector<uint8_t>& bad : {std::vector<uint8_t>{}, std::vector<uint8_t>{1, 2, 3}, no_scan}) {
    EXPECT_FALSE(oracle_header(bad, &h));
    EXPECT_FALSE(oracle_coefficients(bad, &comps));
    EXPECT_FALSE(oracle_planes(bad, 1, &p));
  }
  EXPECT_TRUE(oracle_planes(good, 1, &p)) << "still usable after failures";
}

#endif  // VETAJ_HAVE_LIBJPEG

}  // namespace
}  // namespace vjtest
