// Timing-statistics records: registration, sorting, merging and queries.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "stats/stats.h"

namespace {

using Record = std::unique_ptr<JpegStatInfo>;

// A reset record holding the given (name, time, calls) entries in order.
struct Entry {
  const char* name;
  int32_t time, calls;
};
Record record(const std::vector<Entry>& entries = {}) {
  Record r(new JpegStatInfo);
  jpeg_set_stat_info(r.get());
  for (const Entry& e : entries) {
    const int32_t i = jpeg_get_index(r.get(), e.name);
    if (i < 0) break;
    r->entries[i].time += e.time;
    r->entries[i].call_times += e.calls;
  }
  return r;
}

bool same(const JpegStatInfo* a, const JpegStatInfo* b) {
  return std::memcmp(a, b, sizeof(JpegStatInfo)) == 0;
}

// Whole names only; a full table, a bad count and long names are never
// written past their room.
TEST(Stats, RegistrationStaysInsideTheTable) {
  Record r = record();
  EXPECT_EQ(jpeg_get_index(r.get(), "a"), 0);
  EXPECT_EQ(jpeg_get_index(r.get(), "ab"), 1);
  EXPECT_EQ(jpeg_get_index(r.get(), "a"), 0);
  const std::string n(300, 'n');
  EXPECT_EQ(jpeg_get_index(r.get(), n.c_str()), 2);
  EXPECT_EQ(std::strlen(r->entries[2].name), JPEG_STAT_NAME_SIZE - 1u);
  EXPECT_EQ(jpeg_get_index(r.get(), n.substr(0, 127).c_str()), 2);
  EXPECT_EQ(jpeg_get_index(r.get(), n.substr(0, 126).c_str()), 3);
  const std::string text(700, 't');
  EXPECT_EQ(jpeg_set_argument(r.get(), text.c_str(), 1, -2, 3, -4, 5), r.get());
  EXPECT_EQ(std::string(r->argument), text.substr(0, JPEG_STAT_ARGUMENT_SIZE - 1));

  for (int i = r->entry_count; i < JPEG_STAT_MAX_ENTRIES; ++i) {
    char name[16];
    std::snprintf(name, sizeof(name), "m%d", i);
    ASSERT_EQ(jpeg_get_index(r.get(), name), i);
  }
  const Record before(new JpegStatInfo(*r));
  EXPECT_EQ(jpeg_get_index(r.get(), "one too many"), -1);
  EXPECT_TRUE(same(r.get(), before.get()));
  for (int32_t count : {-3, 5000}) {
    r->entry_count = count;
    EXPECT_EQ(jpeg_get_index(r.get(), "x"), -1) << count;
  }
}

TEST(Stats, MergeCopiesThenAddsSaturatingAndRefusesOtherTables) {
  Record src = record({{"a", 10, 1}, {"b", INT32_MAX - 1, INT32_MIN + 1}});
  jpeg_set_argument(src.get(), "first run", 7, 0, 0, 0, 0);
  Record dst = record();
  EXPECT_EQ(accumulate_stat_info(dst.get(), src.get()), 0);
  EXPECT_TRUE(same(dst.get(), src.get()));
  jpeg_set_argument(src.get(), "second run", 8, 0, 0, 0, 0);
  EXPECT_EQ(accumulate_stat_info(dst.get(), src.get()), 1);
  EXPECT_EQ(get_method_time(dst.get(), "a"), 20);
  EXPECT_EQ(get_method_time(dst.get(), "b"), INT32_MAX);
  EXPECT_EQ(get_method_call_times(dst.get(), "b"), INT32_MIN);
  EXPECT_STREQ(dst->argument, "first run");
  const Record before(new JpegStatInfo(*dst));
  EXPECT_EQ(accumulate_stat_info(dst.get(), record({{"a", 1, 1}}).get()), -1);
  EXPECT_EQ(accumulate_stat_info(dst.get(), record({{"b", 1, 1}, {"a", 1, 1}}).get()), -1);
  EXPECT_TRUE(same(dst.get(), before.get()));
}

TEST(Stats, SortOrdersByTimeAndQueriesFollowTheSortedOrder) {
  Record r = record({{"VETAJ_DoIdct4By4", 5, 1},
                     {"VETAJ_DecodeMcu", 50, 1},
                     {"KOLVAVETA_DecodeJPEG", INT32_MAX, 1},
                     {"VETAJ_DoIdct8By8", 30, 1},
                     {"VETAJ_DecodeMcu_8to1", INT32_MIN, 1}});
  jpeg_stat_sort(r.get());
  // Extreme times compare without overflow.
  const char* order[] = {"KOLVAVETA_DecodeJPEG", "VETAJ_DecodeMcu", "VETAJ_DoIdct8By8",
                         "VETAJ_DoIdct4By4", "VETAJ_DecodeMcu_8to1"};
  for (int i = 0; i < 5; ++i) EXPECT_STREQ(r->entries[i].name, order[i]);
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", 1), 5);
  EXPECT_EQ(get_method_time_prefix(r.get(), "VETAJ_DoIdct", 2), -1);
  EXPECT_STREQ(get_method_name_postfix(r.get(), "Mcu", 0), "VETAJ_DecodeMcu");
  EXPECT_EQ(get_method_name_postfix(r.get(), "Mcu", 1), nullptr);
  EXPECT_EQ(get_method_num_of_postfix(r.get(), "xVETAJ_DecodeMcu"), 0);
  const std::string huge(2000, 'u');  // longer than any scratch space
  EXPECT_EQ(get_method_num_of_postfix(r.get(), huge.c_str()), 0);
}

TEST(Stats, UnterminatedNamesAndOversizedCountsStayInsideTheRecord) {
  // Exactly sized, so that any read past the last entry is caught by the
  // address sanitizer.
  auto* r = static_cast<JpegStatInfo*>(std::malloc(sizeof(JpegStatInfo)));
  ASSERT_NE(r, nullptr);
  std::memset(r, 'z', sizeof(JpegStatInfo));
  r->entry_count = 1 << 30;
  const std::string full(JPEG_STAT_NAME_SIZE, 'z');
  EXPECT_EQ(get_method_num_of_postfix(r, full.c_str()), JPEG_STAT_MAX_ENTRIES);
  EXPECT_EQ(get_method_num_of_prefix(r, (full + "z").c_str()), 0);
  EXPECT_EQ(jpeg_get_index(r, "new"), -1);
  jpeg_stat_sort(r);
  jpeg_print_veta_info(r);
  std::free(r);
}

TEST(Stats, ReportVisitsCalledMethodsInReportOrderWithTheTotal) {
  Record r = record({{"VETAJ_DoIdct8By8", 30, 3},
                     {"not_in_the_report", 1, 1},
                     {"VETAJ_ParseFileHeader", 0, 0},
                     {"KOLVAVETA_DecodeJPEG", 100, 1}});
  std::vector<vj::stats::ReportLine> lines;
  auto collect = [](const vj::stats::ReportLine& line, void* context) {
    static_cast<std::vector<vj::stats::ReportLine>*>(context)->push_back(line);
  };
  EXPECT_EQ(vj::stats::visit_report(r.get(), collect, &lines), 2);
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_STREQ(lines[1].name, "VETAJ_DoIdct8By8");
  EXPECT_EQ(std::make_pair(lines[1].call_times, lines[1].total_time), std::make_pair(3, 100));
}

}  // namespace
