// Timing-statistics records: registration, sorting, merging and queries.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "stats/stats.h"

namespace {

using Record = std::unique_ptr<JpegStatInfo>;

Record fresh() {
  Record r(new JpegStatInfo);
  jpeg_set_stat_info(r.get());
  return r;
}

// Registers the names in order, with the given times and call counts.
struct Entry {
  const char* name;
  int32_t time;
  int32_t calls;
};
void fill(JpegStatInfo* r, const std::vector<Entry>& entries) {
  for (const Entry& e : entries) {
    const int32_t i = jpeg_get_index(r, e.name);
    ASSERT_GE(i, 0);
    r->entries[i].time += e.time;
    r->entries[i].call_times += e.calls;
  }
}

TEST(Stats, EmptyOrResetRecordAnswersNothing) {
  Record r = fresh();
  Record used = fresh();
  fill(used.get(), {{"VETAJ_DecodeMcu", 5, 1}});
  jpeg_set_argument(used.get(), "run", 1, 2, 3, 4, 5);
  EXPECT_EQ(jpeg_set_stat_info(used.get()), used.get());
  EXPECT_EQ(std::memcmp(r.get(), used.get(), sizeof(JpegStatInfo)), 0);
  for (const JpegStatInfo* rec : {r.get(), used.get()}) {
    EXPECT_EQ(get_method_time(rec, "VETAJ_DecodeMcu"), -1);
    EXPECT_EQ(get_method_call_times(rec, "VETAJ_DecodeMcu"), -1);
    EXPECT_EQ(get_method_time(rec, ""), -1);
    EXPECT_EQ(get_method_num_of_prefix(rec, ""), 0);
    EXPECT_EQ(get_method_num_of_postfix(rec, ""), 0);
    EXPECT_EQ(get_method_time_prefix(rec, "", 0), -1);
    EXPECT_EQ(get_method_time_postfix(rec, "", 0), -1);
    EXPECT_EQ(get_method_name_prefix(rec, "", 0), nullptr);
    EXPECT_EQ(get_method_name_postfix(rec, "", 0), nullptr);
  }
}

TEST(Stats, GetIndexRegistersNewNamesAndFindsKnownOnes) {
  Record r = fresh();
  r->entries[1].time = 9;  // a new entry keeps what its slot held
  EXPECT_EQ(jpeg_get_index(r.get(), "a"), 0);
  EXPECT_EQ(jpeg_get_index(r.get(), "b"), 1);
  EXPECT_EQ(r->entry_count, 2);
  EXPECT_EQ(jpeg_get_index(r.get(), "a"), 0);
  EXPECT_EQ(jpeg_get_index(r.get(), "b"), 1);
  EXPECT_EQ(r->entry_count, 2);
  EXPECT_EQ(get_method_time(r.get(), "b"), 9);
  // Exact comparison: neither a prefix nor an extension of a name matches.
  EXPECT_EQ(jpeg_get_index(r.get(), "ab"), 2);
  EXPECT_EQ(get_method_time(r.get(), "abc"), -1);
  EXPECT_EQ(jpeg_get_index(nullptr, "a"), -1);
  EXPECT_EQ(jpeg_get_index(r.get(), nullptr), -1);
}

TEST(Stats, FullTableRefusesANewNameAndKeepsTheOldOnes) {
  Record r = fresh();
  for (int i = 0; i < JPEG_STAT_MAX_ENTRIES; ++i) {
    char name[16];
    std::snprintf(name, sizeof(name), "m%d", i);
    ASSERT_EQ(jpeg_get_index(r.get(), name), i);
  }
  const Record before(new JpegStatInfo(*r));
  EXPECT_EQ(jpeg_get_index(r.get(), "one too many"), -1);
  EXPECT_EQ(std::memcmp(r.get(), before.get(), sizeof(JpegStatInfo)), 0);
  EXPECT_EQ(jpeg_get_index(r.get(), "m1023"), 1023);
  // A count outside the table is never used as a write position.
  r->entry_count = -3;
  EXPECT_EQ(jpeg_get_index(r.get(), "x"), -1);
  r->entry_count = 5000;
  EXPECT_EQ(jpeg_get_index(r.get(), "x"), -1);
  EXPECT_EQ(get_method_num_of_prefix(r.get(), "m"), JPEG_STAT_MAX_ENTRIES);
}

TEST(Stats, LongNamesAreTruncatedAndFoundAgain) {
  Record r = fresh();
  const std::string long_name(300, 'n');
  EXPECT_EQ(jpeg_get_index(r.get(), long_name.c_str()), 0);
  EXPECT_EQ(std::strlen(r->entries[0].name), JPEG_STAT_NAME_SIZE - 1u);
  EXPECT_EQ(jpeg_get_index(r.get(), long_name.c_str()), 0);
  EXPECT_EQ(jpeg_get_index(r.get(), long_name.substr(0, 127).c_str()), 0);
  EXPECT_EQ(jpeg_get_index(r.get(), long_name.substr(0, 126).c_str()), 1);
  r->entries[0].call_times = 4;
  EXPECT_EQ(get_method_call_times(r.get(), long_name.c_str()), 4);
  // Suffix matching sees the stored (cut) name.
  EXPECT_EQ(get_method_num_of_postfix(r.get(), long_name.substr(0, 127).c_str()), 1);
  EXPECT_EQ(get_method_num_of_postfix(r.get(), long_name.c_str()), 0);
}

TEST(Stats, ArgumentTextIsTruncatedAndValuesStored) {
  Record r = fresh();
  const std::string text(700, 't');
  EXPECT_EQ(jpeg_set_argument(r.get(), text.c_str(), 1, -2, 3, -4, 5), r.get());
  EXPECT_EQ(std::string(r->argument), text.substr(0, JPEG_STAT_ARGUMENT_SIZE - 1));
  const int32_t expected[5] = {1, -2, 3, -4, 5};
  EXPECT_EQ(std::memcmp(r->argument_values, expected, sizeof(expected)), 0);
  jpeg_set_argument(r.get(), nullptr, 0, 0, 0, 0, 0);
  EXPECT_STREQ(r->argument, "");
  EXPECT_EQ(jpeg_set_argument(nullptr, "x", 0, 0, 0, 0, 0), nullptr);
}

TEST(Stats, MergeCopiesIntoAnEmptyRecordThenAdds) {
  Record src = fresh();
  jpeg_set_argument(src.get(), "first run", 7, 0, 0, 0, 0);
  fill(src.get(), {{"a", 10, 1}, {"b", 20, 2}});
  Record dst = fresh();
  EXPECT_EQ(accumulate_stat_info(dst.get(), src.get()), 0);
  EXPECT_EQ(std::memcmp(dst.get(), src.get(), sizeof(JpegStatInfo)), 0);

  jpeg_set_argument(src.get(), "second run", 8, 0, 0, 0, 0);
  EXPECT_EQ(accumulate_stat_info(dst.get(), src.get()), 1);
  EXPECT_EQ(get_method_time(dst.get(), "a"), 20);
  EXPECT_EQ(get_method_call_times(dst.get(), "b"), 4);
  EXPECT_STREQ(dst->argument, "first run");
  EXPECT_EQ(dst->argument_values[0], 7);
}

TEST(Stats, MergeRefusesDifferentCountsOrNamesAndChangesNothing) {
  Record dst = fresh();
  fill(dst.get(), {{"a", 1, 1}, {"b", 2, 1}});
  const Record before(new JpegStatInfo(*dst));
  Record fewer = fresh();
  fill(fewer.get(), {{"a", 1, 1}});
  Record reordered = fresh();
  fill(reordered.get(), {{"b", 1, 1}, {"a", 1, 1}});
  EXPECT_EQ(accumulate_stat_info(dst.get(), fewer.get()), -1);
  EXPECT_EQ(accumulate_stat_info(dst.get(), reordered.get()), -1);
  EXPECT_EQ(accumulate_stat_info(dst.get(), nullptr), -1);
  EXPECT_EQ(std::memcmp(dst.get(), before.get(), sizeof(JpegStatInfo)), 0);
}

TEST(Stats, MergeSaturatesInsteadOfWrapping) {
  Record dst = fresh();
  fill(dst.get(), {{"a", INT32_MAX - 1, INT32_MIN + 1}});
  Record src = fresh();
  fill(src.get(), {{"a", 5, -5}});
  EXPECT_EQ(accumulate_stat_info(dst.get(), src.get()), 1);
  EXPECT_EQ(dst->entries[0].time, INT32_MAX);
  EXPECT_EQ(dst->entries[0].call_times, INT32_MIN);
}

TEST(Stats, GlobalRecordFormsActOnJsInfo) {
  EXPECT_EQ(stat_set_info(), &jsInfo);
  stat_set_argument("global", 1, 2, 3, 4, 5);
  fill(&jsInfo, {{"x", 3, 1}});
  Record acc = fresh();
  EXPECT_EQ(stat_accumulate(acc.get()), 0);
  EXPECT_EQ(stat_accumulate(acc.get()), 1);
  EXPECT_EQ(get_method_time(acc.get(), "x"), 6);
  EXPECT_STREQ(acc->argument, "global");
  stat_set_info();
  EXPECT_EQ(jsInfo.entry_count, 0);
  EXPECT_EQ(stat_print_argument(-77), -77);
}

TEST(Stats, SortOrdersByTimeAndQueriesFollowTheSortedOrder) {
  Record r = fresh();
  fill(r.get(), {{"VETAJ_DoIdct4By4", 5, 1},
                 {"VETAJ_DecodeMcu", 50, 1},
                 {"KOLVAVETA_DecodeJPEG", 100, 1},
                 {"VETAJ_DoIdct8By8", 30, 1},
                 {"VETAJ_DecodeMcu_8to1", 40, 1}});
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", 0), 5);
  jpeg_stat_sort(r.get());
  for (int i = 1; i < r->entry_count; ++i) {
    EXPECT_GE(r->entries[i - 1].time, r->entries[i].time);
  }
  EXPECT_STREQ(r->entries[0].name, "KOLVAVETA_DecodeJPEG");
  EXPECT_EQ(get_method_num_of_prefix(r.get(), "VETAJ_"), 4);
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", 0), 30);
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", 1), 5);
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", 2), -1);
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", -1), -1);
  const char* name = get_method_name_prefix(r.get(), "VETAJ_Dec", 1);
  EXPECT_STREQ(name, "VETAJ_DecodeMcu_8to1");
  EXPECT_EQ(name, r->entries[2].name);  // points into the record
  EXPECT_EQ(get_method_num_of_postfix(r.get(), "By4"), 1);
  EXPECT_EQ(get_method_time_postfix(r.get(), "JPEG", 0), 100);
  EXPECT_STREQ(get_method_name_postfix(r.get(), "Mcu", 0), "VETAJ_DecodeMcu");
  EXPECT_EQ(get_method_name_postfix(r.get(), "Mcu", 1), nullptr);
}

TEST(Stats, SortFuncPutsLargerTimesFirst) {
  MethodStat a{}, b{};
  a.time = 3;
  b.time = 2;
  EXPECT_EQ(sort_func(&a, &b), -1);
  EXPECT_EQ(sort_func(&b, &a), 1);
  EXPECT_EQ(sort_func(&a, &a), 0);
  a.time = INT32_MIN;
  b.time = INT32_MAX;  // no subtraction overflow
  EXPECT_EQ(sort_func(&a, &b), 1);
}

TEST(Stats, SuffixMatchesWholeNameButNeverALongerSuffix) {
  Record r = fresh();
  fill(r.get(), {{"Mcu", 1, 1}, {"DecodeMcu", 2, 1}});
  EXPECT_EQ(get_method_num_of_postfix(r.get(), "Mcu"), 2);
  EXPECT_EQ(get_method_num_of_postfix(r.get(), "DecodeMcu"), 1);
  EXPECT_EQ(get_method_num_of_postfix(r.get(), "xDecodeMcu"), 0);
  EXPECT_EQ(get_method_num_of_postfix(r.get(), ""), 2);
  EXPECT_EQ(get_method_num_of_prefix(r.get(), "Mcux"), 0);
  const std::string huge(2000, 'u');  // longer than any scratch space
  EXPECT_EQ(get_method_num_of_postfix(r.get(), huge.c_str()), 0);
  EXPECT_EQ(get_method_num_of_prefix(r.get(), huge.c_str()), 0);
  EXPECT_EQ(get_method_num_of_postfix(r.get(), nullptr), 0);
}

TEST(Stats, UnterminatedNamesAndOversizedCountsStayInsideTheRecord) {
  // Allocated to the exact size so that any read past the last entry is
  // caught by the address sanitizer.
  auto* r = static_cast<JpegStatInfo*>(std::malloc(sizeof(JpegStatInfo)));
  ASSERT_NE(r, nullptr);
  std::memset(r, 'z', sizeof(JpegStatInfo));
  r->entry_count = 1 << 30;
  const std::string full(JPEG_STAT_NAME_SIZE, 'z');
  EXPECT_EQ(get_method_num_of_postfix(r, full.c_str()), JPEG_STAT_MAX_ENTRIES);
  EXPECT_EQ(get_method_num_of_prefix(r, (full + "z").c_str()), 0);
  EXPECT_EQ(get_method_time(r, full.c_str()), r->entries[0].time);
  EXPECT_EQ(jpeg_get_index(r, "new"), -1);
  jpeg_stat_sort(r);
  jpeg_print_veta_info(r);
  std::free(r);
}

struct ReverseCase {
  const char* in;
  const char* out;
};
void PrintTo(const ReverseCase& c, std::ostream* os) { *os << '"' << c.in << '"'; }
class StatsReverse : public ::testing::TestWithParam<ReverseCase> {};

TEST_P(StatsReverse, ReversesInPlace) {
  std::string s = GetParam().in;
  EXPECT_EQ(reverse_string(s.data()), s.data());
  EXPECT_EQ(s, GetParam().out);
}
INSTANTIATE_TEST_SUITE_P(Lengths, StatsReverse,
                         ::testing::Values(ReverseCase{"", ""}, ReverseCase{"a", "a"},
                                           ReverseCase{"ab", "ba"}, ReverseCase{"abc", "cba"},
                                           ReverseCase{"abcd", "dcba"}));

TEST(Stats, ReportVisitsCalledMethodsInReportOrderWithTheTotal) {
  Record r = fresh();
  fill(r.get(), {{"VETAJ_DoIdct8By8", 30, 3},
                 {"not_in_the_report", 1, 1},
                 {"VETAJ_ParseFileHeader", 0, 0},
                 {"KOLVAVETA_DecodeJPEG", 100, 1}});
  std::vector<vj::stats::ReportLine> lines;
  auto collect = [](const vj::stats::ReportLine& line, void* context) {
    static_cast<std::vector<vj::stats::ReportLine>*>(context)->push_back(line);
  };
  EXPECT_EQ(vj::stats::visit_report(r.get(), collect, &lines), 2);
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_STREQ(lines[0].name, "KOLVAVETA_DecodeJPEG");
  EXPECT_STREQ(lines[1].name, "VETAJ_DoIdct8By8");
  EXPECT_EQ(lines[1].call_times, 3);
  EXPECT_EQ(lines[1].time, 30);
  EXPECT_EQ(lines[1].total_time, 100);
  Record empty = fresh();
  EXPECT_EQ(vj::stats::visit_report(empty.get(), collect, &lines), 0);

  std::vector<std::string> names;
  for (int i = 0; i < vj::stats::kReportNameCount; ++i) names.push_back(vj::stats::report_name(i));
  std::sort(names.begin(), names.end());
  EXPECT_EQ(std::unique(names.begin(), names.end()), names.end());
  EXPECT_EQ(vj::stats::report_name(vj::stats::kReportNameCount), nullptr);
}

}  // namespace
