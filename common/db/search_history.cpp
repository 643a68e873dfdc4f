#include "common/db/search_history.h"

namespace maruseeker::db {
namespace {

using marudbquery::Condition;

/// A whole number of whatever width the database gives the column.
long long Number(const soci::values& values, const char* column) {
  if (values.get_indicator(column) == soci::i_null) return 0;
  switch (values.get_properties(column).get_data_type()) {
    case soci::dt_integer:
      return values.get<int>(column);
    case soci::dt_unsigned_long_long:
      return static_cast<long long>(values.get<unsigned long long>(column));
    default:
      return values.get<long long>(column);
  }
}

}  // namespace

marudbquery::Values SearchHistory::UpdateValues() const {
  return {{"create_time", create_time}};
}

marudbquery::Values SearchHistory::InsertValues() const {
  return {{"uid", static_cast<long long>(uid)}, {"keyword", keyword}, {"create_time", create_time}};
}

Condition SearchHistory::NotNewer() const {
  const Condition older = Condition::ConditionFactory<long long>("create_time", "<", create_time);
  const Condition equal = Condition::ConditionFactory<long long>("create_time", "=", create_time);
  return older || (equal && Condition::ConditionFactory<int>("id", "<=", id));
}

Condition SearchHistory::SameOwner() const {
  return Condition::ConditionFactory<unsigned int>("uid", "=", uid);
}

Condition SearchHistory::SameContent() const {
  return SameOwner() && Condition::ConditionFactory<std::string>("keyword", "=", keyword);
}

void SearchHistory::FromValues(const soci::values& values) {
  id = static_cast<std::int32_t>(Number(values, "id"));
  uid = static_cast<std::uint32_t>(Number(values, "uid"));
  keyword = values.get<std::string>("keyword", "");
  create_time = Number(values, "create_time");
}

SearchHistoryTable::SearchHistoryTable() : TableBase(DBSession::Instance(), "search_history") {}

bool SearchHistoryTable::UpdateWithTime(SearchHistory& rec, int max) {
  std::string reason;
  if (session_->Transaction([&] { return Record(rec) && Prune(rec, max); }, reason)) return true;
  if (!reason.empty()) error_ = reason;
  return false;
}

bool SearchHistoryTable::Record(SearchHistory& rec) {
  marudbquery::UpdateStatement update(session_, table_);
  update.SetCondition(rec.SameContent());
  long long changed = 0;
  if (!update.Execute(rec, &changed)) {
    error_ = update.GetLastError();
    return false;
  }
  marudbquery::InsertStatement insert(session_, table_);
  if (changed == 0 && !insert.Execute(rec)) {
    error_ = insert.GetLastError();
    return false;
  }
  std::vector<SearchHistory> stored;
  if (!GetAll(stored, rec.SameContent(), SelectParam(0, 1, "id", false))) return false;
  if (stored.empty()) return false;
  rec = stored.front();
  return true;
}

bool SearchHistoryTable::Prune(const SearchHistory& newest, int max) {
  if (max <= 0) return true;
  const Condition others =
      newest.SameOwner() && Condition::ConditionFactory<int>("id", "!=", newest.id);
  std::vector<SearchHistory> excess;
  if (!GetAll(excess, others, SelectParam(max - 1, 1, "create_time", false))) return false;
  if (excess.empty()) return true;
  return Delete(others && excess.front().NotNewer());
}

}  // namespace maruseeker::db
