#include "common/db/search_history.h"

#include <errno.h>
#include <string.h>

#include "history/database.h"
#include "history/journal.h"
#include "history/taking.h"
#include "system/utf8.h"

namespace maruseeker::db {
namespace {

using maru::history::Journal;
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

int SearchHistoryTable::Count(const Condition& cond) {
  Settle();
  return TableBase::Count(cond);
}

bool SearchHistoryTable::GetAll(std::vector<SearchHistory>& recs, const Condition& cond,
                                const SelectParam& param) {
  Settle();
  return TableBase::GetAll(recs, cond, param);
}

bool SearchHistoryTable::Delete(const Condition& cond) {
  return maru::history::TakeJournal(error_) && TableBase::Delete(cond);
}

bool SearchHistoryTable::UpdateWithTime(SearchHistory& rec, int max) {
  settled_ = false;
  // A database may refuse what is no text: the caller is told.
  if (!maru::IsUTF8(rec.keyword) || rec.keyword.find('\0') != std::string::npos) {
    return maru::history::TakeJournal(error_) && maru::history::TakeNow(rec, max, error_);
  }
  bool long_enough = false;
  if (!Journal::OfService().Add({rec.uid, rec.keyword, rec.create_time, max}, long_enough)) {
    error_ = std::string("history.journal: ") + strerror(errno);
    return false;
  }
  return !long_enough || maru::history::TakeJournal(error_);
}

/// Once for all that is read: what cannot be taken over now does not keep from reading the rest.
void SearchHistoryTable::Settle() {
  std::string ignored;
  if (!settled_) maru::history::TakeJournal(ignored);
  settled_ = true;
}

}  // namespace maruseeker::db
