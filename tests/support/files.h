// Test helpers: temporary files and fixture loading.
#ifndef VETAJ_TESTS_SUPPORT_FILES_H
#define VETAJ_TESTS_SUPPORT_FILES_H

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

namespace vjtest {

// A file in the temporary directory holding the given bytes; removed when
// the object goes out of scope.
class TempFile {
 public:
  explicit TempFile(const std::vector<uint8_t>& contents);
  ~TempFile();
  TempFile(const TempFile&) = delete;
  TempFile& operator=(const TempFile&) = delete;
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// Bytes of a fixture (empty when it does not exist).
std::vector<uint8_t> read_fixture(const std::string& name);
// Names of the fixtures whose names end with `suffix` (sorted).
std::vector<std::string> list_fixtures(const std::string& suffix = ".jpg");

// Test-name form of a fixture name: letters and digits, the rest '_'.
std::string fixture_test_name(const ::testing::TestParamInfo<std::string>& info);

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_FILES_H
