// The fixture corpus itself: every file is listed once in the manifest with
// its size (the corpus tests read their expectations from it).
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include "support/files.h"
#include "support/manifest.h"

namespace vjtest {
namespace {

TEST(FixtureManifest, ListsEveryFileWithItsSize) {
  const std::vector<uint8_t> text = read_fixture("MANIFEST.txt");
  std::istringstream manifest(std::string(text.begin(), text.end()));
  size_t lines = 0, files = 0;
  for (std::string line; std::getline(manifest, line);) lines += !line.empty() && line[0] != '#';
  for (const std::string& name : list_fixtures("")) {
    if (name == "MANIFEST.txt") continue;
    ++files;
    const ManifestEntry* entry = manifest_entry(name);
    ASSERT_NE(entry, nullptr) << "not in MANIFEST.txt: " << name;
    EXPECT_EQ(entry->size, read_fixture(name).size()) << name;
  }
  EXPECT_EQ(lines, files) << "files listed twice or missing";
}

}  // namespace
}  // namespace vjtest
