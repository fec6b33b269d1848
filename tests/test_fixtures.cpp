// The fixture corpus itself: every file is listed in the manifest, the good
// files decode with the oracle and their names tell their kind, the bad ones
// are what they claim to be.
#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "support/files.h"
#include "support/oracle.h"

#if VETAJ_HAVE_LIBJPEG
#include <cstdio>

#include <jpeglib.h>
#endif

namespace vjtest {
namespace {

bool has_prefix(const std::string& s, const std::string& prefix) { return s.compare(0, prefix.size(), prefix) == 0; }

TEST(FixtureManifest, ListsEveryFileWithItsSize) {
  const std::vector<uint8_t> text = read_fixture("MANIFEST.txt");
  std::istringstream manifest(std::string(text.begin(), text.end()));
  std::map<std::string, size_t> listed;
  std::string line;
  while (std::getline(manifest, line)) {
    if (line.empty() || line[0] == '#') continue;
    std::istringstream fields(line);
    std::string name;
    size_t size = 0;
    ASSERT_TRUE(fields >> name >> size) << line;
    EXPECT_TRUE(listed.emplace(name, size).second) << "listed twice: " << name;
  }
  std::vector<std::string> files;
  for (const std::string& name : list_fixtures(""))
    if (name != "." && name != ".." && name != "MANIFEST.txt") files.push_back(name);
  ASSERT_FALSE(files.empty());
  for (const std::string& name : files) {
    auto it = listed.find(name);
    if (it == listed.end()) {
      ADD_FAILURE() << "not in MANIFEST.txt: " << name;
      continue;
    }
    EXPECT_EQ(it->second, read_fixture(name).size()) << name;
    listed.erase(it);
  }
  for (const auto& entry : listed) ADD_FAILURE() << "listed but missing: " << entry.first;
}

#if VETAJ_HAVE_LIBJPEG

// Frame header of a stream: marker code and sample precision, or {0, 0}
// when a scan or the end comes first.
struct Frame {
  int marker = 0, precision = 0;
};

Frame find_frame(const std::vector<uint8_t>& b) {
  size_t i = 0;
  while (i + 1 < b.size() && !(b[i] == 0xFF && b[i + 1] == 0xD8)) ++i;
  i += 2;
  while (i + 4 < b.size()) {
    const int code = b[i + 1];
    if (b[i] != 0xFF || code == 0xFF) {
      ++i;
      continue;
    }
    if (code == 0xDA || code == 0xD9) break;
    const bool is_frame = code >= 0xC0 && code <= 0xCF && code != 0xC4 && code != 0xC8 && code != 0xCC;
    if (is_frame) return Frame{code, b[i + 4]};
    i += 2 + (size_t(b[i + 2]) << 8 | b[i + 3]);
  }
  return Frame{};
}

std::vector<std::string> jpeg_fixtures(bool bad) {
  std::vector<std::string> out;
  for (const std::string& name : list_fixtures(".jpg"))
    if (has_prefix(name, "bad_") == bad) out.push_back(name);
  return out;
}

// The library decodes only 8-bit SOF0 and SOF2 frames: each bad file has
// another frame type, or a precision that libjpeg (8-bit) refuses too.
class BadFixture : public ::testing::TestWithParam<std::string> {};

TEST_P(BadFixture, HasAFrameTheDecoderMustReject) {
  const std::vector<uint8_t> bytes = read_fixture(GetParam());
  ASSERT_FALSE(bytes.empty());
  const Frame f = find_frame(bytes);
  OracleHeader h;
  if (f.precision != 8) {
    EXPECT_FALSE(oracle_header(bytes, &h));
  } else {
    EXPECT_NE(f.marker, 0xC0);
    EXPECT_NE(f.marker, 0xC2);
    EXPECT_NE(f.marker, 0);
  }
}

INSTANTIATE_TEST_SUITE_P(Corpus, BadFixture, ::testing::ValuesIn(jpeg_fixtures(true)), fixture_test_name);

TEST(FixtureCorpus, TiffContainersHoldADecodableStream) {
  const std::vector<std::string> names = list_fixtures(".tif");
  ASSERT_FALSE(names.empty());
  for (const std::string& name : names) {
    const std::vector<uint8_t> bytes = read_fixture(name);
    ASSERT_GE(bytes.size(), 8u) << name;
    const bool le = bytes[0] == 'I' && bytes[1] == 'I' && bytes[2] == 42 && bytes[3] == 0;
    const bool be = bytes[0] == 'M' && bytes[1] == 'M' && bytes[2] == 0 && bytes[3] == 42;
    EXPECT_TRUE(le || be) << name;
    OracleHeader h;
    EXPECT_TRUE(oracle_header(bytes, &h)) << name;
    EXPECT_EQ(h.width, 64) << name;
  }
}

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


// The coefficients and quantisation values come back in natural order: a
// straightforward floating-point inverse DCT of them reproduces the oracle's
// own samples of a grey picture.
TEST(Oracle, CoefficientsAndQuantisationAreInNaturalOrder) {
  const std::vector<uint8_t> bytes = read_fixture("grey_q90_64x48.jpg");
  std::vector<OracleComponent> comps;
  OraclePlanes planes;
  ASSERT_TRUE(oracle_coefficients(bytes, &comps));
  ASSERT_TRUE(oracle_planes(bytes, 1, &planes));
  ASSERT_EQ(comps.size(), 1u);
  const OracleComponent& c = comps[0];
  const double pi = 3.14159265358979323846;
  int worst = 0;
  for (int by = 0; by < c.height_in_blocks; ++by) {
    for (int bx = 0; bx < c.width_in_blocks; ++bx) {
      const int16_t* blk = c.block(by, bx);
      for (int y = 0; y < 8; ++y) {
        for (int x = 0; x < 8; ++x) {
          double sum = 0;
          for (int v = 0; v < 8; ++v) {
            for (int u = 0; u < 8; ++u) {
              const double cu = u ? 1.0 : std::sqrt(0.5), cv = v ? 1.0 : std::sqrt(0.5);
              sum += cu * cv * blk[v * 8 + u] * c.quant[v * 8 + u] * std::cos((2 * x + 1) * u * pi / 16) *
                     std::cos((2 * y + 1) * v * pi / 16);
            }
          }
          const int sample = std::clamp(static_cast<int>(std::lround(sum / 4 + 128)), 0, 255);
          const int diff = std::abs(sample - planes.at(bx * 8 + x, by * 8 + y, 0));
          worst = std::max(worst, diff);
        }
      }
    }
  }
  EXPECT_LE(worst, 1);
}

#endif  // VETAJ_HAVE_LIBJPEG

}  // namespace
}  // namespace vjtest
