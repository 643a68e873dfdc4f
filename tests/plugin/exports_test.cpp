#include <stdio.h>

#include <map>
#include <vector>

#include "plugin/plugin.h"

namespace {

TEST(Exports, FourSymbolsAndNoMore) {
  FILE* names = popen("nm -D --defined-only --format=posix '" MARU_PLUGIN "'", "r");
  ASSERT_NE(names, nullptr);
  std::map<std::string, char> found;
  char name[256];
  char type;
  while (fscanf(names, "%255s %c%*[^\n]", name, &type) == 2) found[name] = type;
  ASSERT_EQ(pclose(names), 0);
  // The tables are writable data.
  const std::map<std::string, char> expected = {
      {"GetAPICheckTable", 'T'}, {"GetAPITable", 'T'}, {"gCheckTable", 'D'}, {"gTable", 'D'}};
  EXPECT_EQ(found, expected);
}

TEST(Exports, RowsInTheirOrder) {
  std::vector<std::string> rows;
  for (const MARU::APIRow* row = Rows(); row->api; ++row) {
    EXPECT_EQ(row->version, 1u);
    EXPECT_NE(row->entry, nullptr);
    rows.push_back(std::string(row->api) + " " + row->method);
  }
  const std::string api = "MARU.Seeker.Elastic.";
  EXPECT_EQ(rows, (std::vector{api + "Search search", api + "Highlight highlight",
                               api + "Term suggest", api + "Term list_avail_db",
                               api + "Spotlight boost", api + "Indicate indicate",
                               api + "SearchHistory get", api + "SearchHistory delete"}));
  rows.clear();
  for (const MARU::APICheckRow* row = CheckRows(); row->api; ++row) {
    EXPECT_EQ(row->version, 1u);
    EXPECT_NE(row->check, nullptr);
    EXPECT_EQ(row->reserved[0] | row->reserved[1], 0u);
    rows.push_back(std::string(row->api) + " " + row->method);
  }
  EXPECT_EQ(rows, (std::vector{api + "SearchHistory get", api + "SearchHistory delete",
                               api + "Indicate indicate", api + "Spotlight boost",
                               api + "Term suggest", api + "Term list_avail_db",
                               api + "Highlight highlight", api + "Search search"}));
  static_assert(sizeof(MARU::APIRow) == 4 * sizeof(void*));
  static_assert(sizeof(MARU::APICheckRow) == 6 * sizeof(void*));
}

}  // namespace
