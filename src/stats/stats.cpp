// Timing-statistics records for a measuring harness: a fixed table of named
// entries (accumulated time and call count) with registration, sorting,
// merging and queries by exact name, name prefix or name suffix.
//
// The record is caller memory that the caller may also fill by hand, so
// every operation bounds itself: an entry count outside 0..1024 is clamped
// when entries are scanned, stored names are read at most to the end of
// their 128-byte field, and nothing is ever written past the last entry.
#include "stats/stats.h"

#include <cstdlib>
#include <cstring>

namespace {

constexpr int32_t kMaxEntries = JPEG_STAT_MAX_ENTRIES;
constexpr size_t kNameSize = JPEG_STAT_NAME_SIZE;
constexpr size_t kNameChars = kNameSize - 1;  // longest name that is stored
constexpr size_t kArgumentChars = JPEG_STAT_ARGUMENT_SIZE - 1;

// Entries in use, as far as the table holds them.
int32_t used_entries(const JpegStatInfo* record) {
  const int32_t count = record->entry_count;
  if (count < 0) return 0;
  return count > kMaxEntries ? kMaxEntries : count;
}

// Length of a stored name; a field without a terminator counts as full.
size_t stored_length(const MethodStat& entry) { return strnlen(entry.name, kNameSize); }

// Names are stored cut to kNameChars characters, so a lookup compares no
// more than that: a name that was too long finds its entry again.
bool same_name(const MethodStat& entry, const char* name) {
  return std::strncmp(entry.name, name, kNameChars) == 0;
}

// Copies up to `limit` characters of `text` into `field` of `size` bytes and
// zero-fills the rest, so the field is always terminated.
void copy_truncated(char* field, size_t size, const char* text, size_t limit) {
  const size_t length = text != nullptr ? strnlen(text, limit) : 0;
  if (length > 0) std::memcpy(field, text, length);
  std::memset(field + length, 0, size - length);
}

int32_t saturating_add(int32_t a, int32_t b) {
  const int64_t sum = static_cast<int64_t>(a) + b;
  if (sum > INT32_MAX) return INT32_MAX;
  if (sum < INT32_MIN) return INT32_MIN;
  return static_cast<int32_t>(sum);
}

const MethodStat* find_name(const JpegStatInfo* record, const char* name) {
  if (record == nullptr || name == nullptr) return nullptr;
  const int32_t count = used_entries(record);
  for (int32_t i = 0; i < count; ++i) {
    if (same_name(record->entries[i], name)) return &record->entries[i];
  }
  return nullptr;
}

// Name-pattern policies for the prefix and suffix queries. A name shorter
// than the pattern never matches; an empty pattern matches every name.
struct PrefixMatch {
  static bool matches(const MethodStat& entry, const char* pattern, size_t length) {
    return length <= stored_length(entry) && std::memcmp(entry.name, pattern, length) == 0;
  }
};

struct SuffixMatch {
  static bool matches(const MethodStat& entry, const char* pattern, size_t length) {
    const size_t name_length = stored_length(entry);
    return length <= name_length &&
           std::memcmp(entry.name + name_length - length, pattern, length) == 0;
  }
};

// The n-th entry (from 0, in the current order) whose name matches.
template <class Match>
const MethodStat* nth_match(const JpegStatInfo* record, const char* pattern, int32_t n) {
  if (record == nullptr || pattern == nullptr || n < 0) return nullptr;
  const size_t length = std::strlen(pattern);
  const int32_t count = used_entries(record);
  for (int32_t i = 0; i < count; ++i) {
    if (Match::matches(record->entries[i], pattern, length) && n-- == 0) {
      return &record->entries[i];
    }
  }
  return nullptr;
}

template <class Match>
int32_t count_matches(const JpegStatInfo* record, const char* pattern) {
  if (record == nullptr || pattern == nullptr) return 0;
  const size_t length = std::strlen(pattern);
  const int32_t count = used_entries(record);
  int32_t matches = 0;
  for (int32_t i = 0; i < count; ++i) {
    if (Match::matches(record->entries[i], pattern, length)) ++matches;
  }
  return matches;
}

int32_t time_of(const MethodStat* entry) { return entry != nullptr ? entry->time : -1; }
int32_t calls_of(const MethodStat* entry) { return entry != nullptr ? entry->call_times : -1; }
const char* name_of(const MethodStat* entry) { return entry != nullptr ? entry->name : nullptr; }

// The methods of the library that a report lists, in report order. The three
// names ending in "_odd" stand for the odd-width paths of the YCbCr writers.
constexpr const char* kReportNames[vj::stats::kReportNameCount] = {
    "KOLVAVETA_DecodeJPEG",
    "VETAJ_CreateRegionMap",
    "VETAJ_CreatExifInfo",
    "VETAJ_ParseFileHeader",
    "VETAJ_DecodeFrame",
    "VETAJ_DecodeImage",
    "VETAJ_GetJpegRegionInfo",
    "VETAJ_Initialize",
    "VETAJ_PreInitialize",
    "VETAJ_PostInitialize",
    "VETAJ_StartDecompression",
    "VETAJ_InitUpsampler",
    "VETAJ_InitDecBeforeScan",
    "VETAJ_SetupScan",
    "VETAJ_PrepareDerivedTbl",
    "VETAJ_P_PrepareDerivedTbl",
    "VETAJ_SetupiMcu",
    "VETAJ_ProcessData",
    "VETAJ_DecodeSingleiMcu",
    "VETAJ_DecodeMcu",
    "VETAJ_ProcessRestartMarker",
    "VETAJ_DoIdct8By8",
    "VETAJ_DoIdct1By1",
    "VETAJ_DoIdct2By1",
    "VETAJ_DoIdct2By2",
    "VETAJ_DoIdct1By2",
    "VETAJ_DoIdct2By2All",
    "VETAJ_DoIdct3By3",
    "VETAJ_DoIdct4By4",
    "VETAJ_ProcessData_resize",
    "VETAJ_DecodeSingleiMcu_resize",
    "VETAJ_DecodeMcu_8to3",
    "VETAJ_DecodeMcu_8to1",
    "VETAJ_DecodeMcu_4to1",
    "VETAJ_DecodeMcu_2to1",
    "VETAJ_DoIdct_8to3",
    "VETAJ_DoIdct_4to1",
    "VETAJ_DoIdct4x4For4x4",
    "VETAJ_DoIdct1x1For4x4",
    "VETAJ_DoIdct2x1For4x4",
    "VETAJ_DoIdct2x2For4x4",
    "VETAJ_DoIdct1x2For4x4",
    "VETAJ_DoIdct2x2AllFor4x4",
    "VETAJ_DoIdct3x3For4x4",
    "VETAJ_SetupUpsample",
    "VETAJ_DoFullsizeUpsample",
    "VETAJ_DoH2V1Upsample",
    "VETAJ_DoH2V2Upsample",
    "VETAJ_YcbcrWriteOutput1to1_YUV420",
    "VETAJ_YcbcrWriteOutput1to1_YUV422",
    "VETAJ_YcbcrWriteOutput1to1_YUV444",
    "VETAJ_YcbcrWriteOutput1to1_YUV420_odd",
    "VETAJ_YcbcrWriteOutput1to1_YUV422_odd",
    "VETAJ_YcbcrWriteOutput1to1_YUV444_odd",
    "VETAJ_DoYcbcrToRgb",
    "VETAJ_DoYcbcrToUpscaleRgb",
    "VETAJ_DoYcbcrToRgb_Partial",
    "VETAJ_DoFastYcbcrToRgb",
    "VETAJ_DoFastYcbcrToUpscaleRgb",
    "VETAJ_DoFastYcbcrToRgb_Partial",
    "VETAJ_YcbcrWriteOutput1to1",
    "VETAJ_YcbcrWriteOutput",
    "VETAJ_FastYcbcrWriteOutput",
    "VETAJ_FastYcbcrUpscaleWriteOutput",
    "VETAJ_DoGrayConvert",
    "VETAJ_DoGrayUpscaleConvert",
    "VETAJ_DoGrayConvert_Partial",
    "VETAJ_GrayWriteOutput1to1",
    "VETAJ_GrayWriteOutput",
    "VETAJ_DoRgbConvert",
    "VETAJ_DoRgbUpscaleConvert",
    "VETAJ_DoRgbConvert_Partial",
    "VETAJ_RGBWriteOutput1to1",
    "VETAJ_RGBWriteOutput",
};

void ignore_line(const vj::stats::ReportLine&, void*) {}

}  // namespace

namespace vj::stats {

const char* report_name(int index) {
  return index >= 0 && index < kReportNameCount ? kReportNames[index] : nullptr;
}

int32_t visit_report(const JpegStatInfo* record, ReportVisitor visit, void* context) {
  if (record == nullptr || record->entry_count < 1) return 0;
  int32_t lines = 0;
  for (const char* name : kReportNames) {
    const MethodStat* entry = find_name(record, name);
    if (calls_of(entry) <= 0) continue;
    const ReportLine line{name, entry->call_times, entry->time,
                          get_method_time(record, "KOLVAVETA_DecodeJPEG")};
    visit(line, context);
    ++lines;
  }
  return lines;
}

}  // namespace vj::stats

extern "C" {

VETAJ_API JpegStatInfo jsInfo;

VETAJ_API JpegStatInfo* jpeg_set_stat_info(JpegStatInfo* record) {
  if (record != nullptr) std::memset(record, 0, sizeof(*record));
  return record;
}

VETAJ_API JpegStatInfo* stat_set_info(void) { return jpeg_set_stat_info(&jsInfo); }

VETAJ_API JpegStatInfo* jpeg_set_argument(JpegStatInfo* record, const char* text, int32_t a1,
                                          int32_t a2, int32_t a3, int32_t a4, int32_t a5) {
  if (record == nullptr) return nullptr;
  copy_truncated(record->argument, sizeof(record->argument), text, kArgumentChars);
  const int32_t values[5] = {a1, a2, a3, a4, a5};
  std::memcpy(record->argument_values, values, sizeof(values));
  return record;
}

VETAJ_API JpegStatInfo* stat_set_argument(const char* text, int32_t a1, int32_t a2, int32_t a3,
                                          int32_t a4, int32_t a5) {
  return jpeg_set_argument(&jsInfo, text, a1, a2, a3, a4, a5);
}

VETAJ_API int32_t jpeg_get_index(JpegStatInfo* record, const char* name) {
  if (record == nullptr || name == nullptr) return -1;
  if (const MethodStat* known = find_name(record, name)) {
    return static_cast<int32_t>(known - record->entries);
  }
  // A new name takes the next entry; a full (or corrupt) table refuses it.
  const int32_t index = record->entry_count;
  if (index < 0 || index >= kMaxEntries) return -1;
  MethodStat& entry = record->entries[index];
  copy_truncated(entry.name, sizeof(entry.name), name, kNameChars);
  record->entry_count = index + 1;
  return index;
}

VETAJ_API int32_t sort_func(const void* a, const void* b) {
  const int32_t first = static_cast<const MethodStat*>(a)->time;
  const int32_t second = static_cast<const MethodStat*>(b)->time;
  if (first > second) return -1;
  return first < second ? 1 : 0;
}

VETAJ_API void jpeg_stat_sort(JpegStatInfo* record) {
  if (record == nullptr) return;
  std::qsort(record->entries, static_cast<size_t>(used_entries(record)), sizeof(MethodStat),
             sort_func);
}

VETAJ_API int32_t accumulate_stat_info(JpegStatInfo* destination, const JpegStatInfo* source) {
  if (destination == nullptr || source == nullptr) return -1;
  if (destination->entry_count == 0) {
    if (destination != source) std::memcpy(destination, source, sizeof(*destination));
    return 0;
  }
  if (destination->entry_count != source->entry_count) return -1;
  const int32_t count = used_entries(destination);
  for (int32_t i = 0; i < count; ++i) {
    if (std::strncmp(destination->entries[i].name, source->entries[i].name, kNameSize) != 0) {
      return -1;
    }
  }
  // Sums stop at the limits of a 32-bit word instead of wrapping round.
  for (int32_t i = 0; i < count; ++i) {
    MethodStat& to = destination->entries[i];
    const MethodStat& from = source->entries[i];
    to.time = saturating_add(to.time, from.time);
    to.call_times = saturating_add(to.call_times, from.call_times);
  }
  return 1;
}

VETAJ_API int32_t stat_accumulate(JpegStatInfo* destination) {
  return accumulate_stat_info(destination, &jsInfo);
}

VETAJ_API char* reverse_string(char* text) {
  if (text == nullptr) return nullptr;
  for (size_t i = 0, j = std::strlen(text); i + 1 < j; ++i) {
    --j;
    const char c = text[i];
    text[i] = text[j];
    text[j] = c;
  }
  return text;
}

VETAJ_API int32_t get_method_time(const JpegStatInfo* record, const char* name) {
  return time_of(find_name(record, name));
}

VETAJ_API int32_t get_method_call_times(const JpegStatInfo* record, const char* name) {
  return calls_of(find_name(record, name));
}

VETAJ_API int32_t get_method_time_prefix(const JpegStatInfo* record, const char* prefix,
                                         int32_t n) {
  return time_of(nth_match<PrefixMatch>(record, prefix, n));
}

VETAJ_API const char* get_method_name_prefix(const JpegStatInfo* record, const char* prefix,
                                             int32_t n) {
  return name_of(nth_match<PrefixMatch>(record, prefix, n));
}

VETAJ_API int32_t get_method_num_of_prefix(const JpegStatInfo* record, const char* prefix) {
  return count_matches<PrefixMatch>(record, prefix);
}

VETAJ_API int32_t get_method_time_postfix(const JpegStatInfo* record, const char* suffix,
                                          int32_t n) {
  return time_of(nth_match<SuffixMatch>(record, suffix, n));
}

VETAJ_API const char* get_method_name_postfix(const JpegStatInfo* record, const char* suffix,
                                              int32_t n) {
  return name_of(nth_match<SuffixMatch>(record, suffix, n));
}

VETAJ_API int32_t get_method_num_of_postfix(const JpegStatInfo* record, const char* suffix) {
  return count_matches<SuffixMatch>(record, suffix);
}

// The reports produce no output; the full report only reads its figures.
VETAJ_API void jpeg_print_stat_simple_info(const JpegStatInfo*) {}
VETAJ_API void jpeg_print_stat_all_info(const JpegStatInfo*) {}
VETAJ_API void jpeg_print_stat_simple_veta_info(const JpegStatInfo*) {}

VETAJ_API void jpeg_print_veta_info(const JpegStatInfo* record) {
  vj::stats::visit_report(record, ignore_line, nullptr);
}

VETAJ_API void stat_print_simple_info(void) { jpeg_print_stat_simple_info(&jsInfo); }
VETAJ_API void stat_acc_print_simple_info(const JpegStatInfo* record) {
  jpeg_print_stat_simple_info(record);
}
VETAJ_API void stat_print_all_info(void) { jpeg_print_stat_all_info(&jsInfo); }
VETAJ_API void stat_acc_print_all_info(const JpegStatInfo* record) {
  jpeg_print_stat_all_info(record);
}
VETAJ_API void stat_print_simple_veta_info(void) { jpeg_print_stat_simple_veta_info(&jsInfo); }
VETAJ_API void stat_acc_print_simple_veta_info(const JpegStatInfo* record) {
  jpeg_print_stat_simple_veta_info(record);
}
VETAJ_API void stat_print_veta_info(void) { jpeg_print_veta_info(&jsInfo); }
VETAJ_API void stat_acc_print_veta_info(const JpegStatInfo* record) {
  jpeg_print_veta_info(record);
}

VETAJ_API int32_t stat_print_argument(int32_t value) { return value; }

}  // extern "C"
