#include "support/manifest.h"

#include <cctype>
#include <cstdlib>
#include <sstream>
#include <vector>

#include "support/files.h"

namespace vjtest {

long ManifestEntry::number(const std::string& key, long fallback) const {
  auto it = fields.find(key);
  return it == fields.end() ? fallback : std::strtol(it->second.c_str(), nullptr, 10);
}

std::string fixture_test_name(const std::string& file) {
  std::string n = file.substr(0, file.rfind('.'));
  for (char& c : n)
    if (!std::isalnum(static_cast<unsigned char>(c))) c = '_';
  return n;
}

const ManifestEntry* manifest_entry(const std::string& name) {
  static const std::map<std::string, ManifestEntry> entries = [] {
    std::map<std::string, ManifestEntry> out;
    const std::vector<uint8_t> text = read_fixture("MANIFEST.txt");
    std::istringstream lines(std::string(text.begin(), text.end()));
    std::string line;
    while (std::getline(lines, line)) {
      if (line.empty() || line[0] == '#') continue;
      std::istringstream words(line);
      std::string file, word;
      ManifestEntry e;
      if (!(words >> file >> e.size)) continue;
      while (words >> word) {
        const size_t eq = word.find('=');
        if (eq != std::string::npos) e.fields.emplace(word.substr(0, eq), word.substr(eq + 1));
      }
      out.emplace(file, e);
    }
    return out;
  }();
  auto it = entries.find(name);
  return it == entries.end() ? nullptr : &it->second;
}

}  // namespace vjtest
