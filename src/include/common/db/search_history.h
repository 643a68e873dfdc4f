#pragma once

#include <cstdint>
#include <string>

#include "common/db/base_record.h"
#include "common/db/table_base.h"

namespace maruseeker::db {

/// One query that a user ran: a row of "search_history".
class SearchHistory : public BaseRecord {
 public:
  /// The row's own id, given by the table; 0 for a record not stored yet.
  std::int32_t id = 0;
  std::uint32_t uid = 0;
  std::string keyword;
  /// Seconds since the epoch.
  std::int64_t create_time = 0;

  marudbquery::Values UpdateValues() const override;
  marudbquery::Values InsertValues() const override;
  marudbquery::Condition NotNewer() const override;
  marudbquery::Condition SameOwner() const override;
  void FromValues(const soci::values& values) override;
  marudbquery::Condition SameContent() const override;
};

class SearchHistoryTable : public TableBase<SearchHistory> {
 public:
  SearchHistoryTable();

  /// Records a query: a keyword that the user has in the table already becomes the newest one under
  /// its old id, any other is added; `rec.id` is then the row's. Of the user's rows the newest
  /// `max` stay, this one always among them; 0 or less: all stay. All of it happens or nothing
  /// does, and then the result is false.
  bool UpdateWithTime(SearchHistory& rec, int max);

 private:
  bool Record(SearchHistory& rec);
  bool Prune(const SearchHistory& newest, int max);
};

}  // namespace maruseeker::db

template <>
struct soci::type_conversion<maruseeker::db::SearchHistory> {
  using base_type = soci::values;
  static void from_base(const soci::values& values, soci::indicator,
                        maruseeker::db::SearchHistory& record) {
    record.FromValues(values);
  }
};
