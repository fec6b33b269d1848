// The fixture manifest: how each file of the corpus was made.
#ifndef VETAJ_TESTS_SUPPORT_MANIFEST_H
#define VETAJ_TESTS_SUPPORT_MANIFEST_H

#include <cstddef>
#include <map>
#include <string>

namespace vjtest {

struct ManifestEntry {
  size_t size = 0;
  std::map<std::string, std::string> fields;  // the key=value words of the line
  // A numeric field, or `fallback` when it is absent.
  long number(const std::string& key, long fallback = 0) const;
};

// The entry of a fixture, or null when it is not listed.
const ManifestEntry* manifest_entry(const std::string& name);

// True when a fixture's name begins with a kind prefix such as "bad_".
inline bool has_kind(const std::string& name, const char* prefix) {
  return name.rfind(prefix, 0) == 0;
}

// A fixture's name made fit for a test name: the extension dropped, every
// character other than a letter or digit turned into '_'.
std::string fixture_test_name(const std::string& file);

}  // namespace vjtest

#endif  // VETAJ_TESTS_SUPPORT_MANIFEST_H
