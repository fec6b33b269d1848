#include "support/files.h"

#include <dirent.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace vjtest {

TempFile::TempFile(const std::vector<uint8_t>& contents) {
  const char* tmp = std::getenv("TMPDIR");
  std::string tmpl = std::string(tmp != nullptr ? tmp : "/tmp") + "/vetajXXXXXX";
  std::vector<char> buf(tmpl.begin(), tmpl.end());
  buf.push_back('\0');
  const int fd = mkstemp(buf.data());
  path_ = buf.data();
  if (fd >= 0) {
    size_t off = 0;
    while (off < contents.size()) {
      const ssize_t n = write(fd, contents.data() + off, contents.size() - off);
      if (n <= 0) break;
      off += static_cast<size_t>(n);
    }
    close(fd);
  }
}

TempFile::~TempFile() { unlink(path_.c_str()); }

std::string data_dir() {
  const char* env = std::getenv("VETAJ_TEST_DATA");
  if (env != nullptr && *env != '\0') return env;
#ifdef VETAJ_TEST_DATA
  return VETAJ_TEST_DATA;
#else
  return "tests/data";
#endif
}

std::vector<uint8_t> read_file(const std::string& path) {
  std::vector<uint8_t> out;
  FILE* f = std::fopen(path.c_str(), "rb");
  if (f == nullptr) return out;
  uint8_t buf[65536];
  size_t n;
  while ((n = std::fread(buf, 1, sizeof buf, f)) > 0) out.insert(out.end(), buf, buf + n);
  std::fclose(f);
  return out;
}

std::vector<uint8_t> read_fixture(const std::string& name) {
  return read_file(data_dir() + "/" + name);
}

std::vector<std::string> list_fixtures(const std::string& suffix) {
  std::vector<std::string> names;
  DIR* d = opendir(data_dir().c_str());
  if (d == nullptr) return names;
  while (dirent* e = readdir(d)) {
    std::string n = e->d_name;
    if (n.size() >= suffix.size() && n.compare(n.size() - suffix.size(), suffix.size(), suffix) == 0)
      names.push_back(n);
  }
  closedir(d);
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
