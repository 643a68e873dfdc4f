#pragma once

#include <cstdint>
#include <string>
#include <vector>

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

/// The table, which each operation first brings up to date with what was recorded.
class SearchHistoryTable : public TableBase<SearchHistory> {
 public:
  SearchHistoryTable();

  /// As TableBase has them. The first of those that read takes over the searches that are not in
  /// the table yet, as far as that is possible.
  int Count(const marudbquery::Condition& cond);
  bool GetAll(std::vector<SearchHistory>& recs, const marudbquery::Condition& cond,
              const SelectParam& param);
  bool Delete(const marudbquery::Condition& cond);

  /// Records a query: a keyword that the user has in the table already becomes the newest one under
  /// its old id, any other is added. Of the user's rows the newest `max` stay, this one always
  /// among them; 0 or less: all stay. It is kept in a journal, and a database that fails just now
  /// does not lose it.
  bool UpdateWithTime(SearchHistory& rec, int max);

 private:
  void Settle();

  /// Whether the journal was taken over, or cannot be, since the last record.
  bool settled_ = false;
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
