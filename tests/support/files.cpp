#include "support/files.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

namespace vjtest {
namespace {

// Directory of the fixture corpus: $VETAJ_TEST_DATA, else the build's default.
std::string data_dir() {
  const char* env = std::getenv("VETAJ_TEST_DATA");
  if (env != nullptr && *env != '\0') return env;
#ifdef VETAJ_TEST_DATA
  return VETAJ_TEST_DATA;
#else
  return "tests/data";
#endif
}

}  // namespace

TempFile::TempFile(const std::vector<uint8_t>& contents) {
  const char* tmp = std::getenv("TMPDIR");
  std::string name = std::string(tmp != nullptr ? tmp : "/tmp") + "/vetajXXXXXX";
  const int fd = mkstemp(name.data());
  path_ = name;
  if (FILE* f = fd >= 0 ? fdopen(fd, "wb") : nullptr) {
    std::fwrite(contents.data(), 1, contents.size(), f);
    std::fclose(f);
  }
}

TempFile::~TempFile() { unlink(path_.c_str()); }

std::vector<uint8_t> read_fixture(const std::string& name) {
  std::ifstream in(data_dir() + "/" + name, std::ios::binary);
  return std::vector<uint8_t>(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

std::vector<std::string> list_fixtures(const std::string& suffix) {
  std::vector<std::string> names;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator(data_dir(), error)) {
    const std::string n = entry.path().filename().string();
    if (n.size() >= suffix.size() && n.compare(n.size() - suffix.size(), suffix.size(), suffix) == 0)
      names.push_back(n);
  }
  std::sort(names.begin(), names.end());
  return names;
}

std::string fixture_test_name(const ::testing::TestParamInfo<std::string>& info) {
  std::string n = info.param;
  for (char& c : n)
    if (!isalnum(static_cast<unsigned char>(c))) c = '_';
  return n;
}

}  // namespace vjtest
