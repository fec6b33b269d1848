// Internal side of the timing-statistics records: the report figures that
// the print operations read, exposed so that they can be checked.
#ifndef VETAJ_STATS_STATS_H
#define VETAJ_STATS_STATS_H

#include <cstdint>

#include "VetaJpegDecoder.h"

namespace vj::stats {

// Number of method names in the report list.
constexpr int kReportNameCount = 74;

// Name of the report list at `index` (0 .. kReportNameCount - 1), else null.
const char* report_name(int index);

// One line of the report: a method that was called at least once, its
// figures and the time of the whole decode that its share is measured by
// (-1 when the record has no "KOLVAVETA_DecodeJPEG" entry).
struct ReportLine {
  const char* name;
  int32_t call_times;
  int32_t time;
  int32_t total_time;
};

using ReportVisitor = void (*)(const ReportLine& line, void* context);

// Walks the report list in order and hands each method whose call times are
// above 0 to `visit`. Nothing is visited when the record has no entries.
// Returns the number of lines visited.
int32_t visit_report(const JpegStatInfo* record, ReportVisitor visit, void* context);

}  // namespace vj::stats

#endif  // VETAJ_STATS_STATS_H
