#include "common/db/search_history.h"

#include <cstring>
#include <map>

#include "platform/guard.h"
#include "platform/history_journal.h"
#include "platform/utf8.h"

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
  return CatchUp() && TableBase::Delete(cond);
}

bool SearchHistoryTable::UpdateWithTime(SearchHistory& rec, int max) {
  settled_ = false;
  // A database may refuse what is no text: the caller is told.
  if (!maru::IsUTF8(rec.keyword) || rec.keyword.find('\0') != std::string::npos) {
    return CatchUp() && TakeNow(rec, max);
  }
  const HistoryJournal journal = HistoryJournal::OfService();
  bool long_enough = false;
  if (!journal.Add({rec.uid, rec.keyword, rec.create_time, max}, long_enough)) {
    error_ = std::string("history.journal: ") + strerror(errno);
    return false;
  }
  return !long_enough || CatchUp();
}

/// Once for all that is read: what cannot be taken over now does not keep from reading the rest.
void SearchHistoryTable::Settle() {
  if (settled_) return;
  const std::string error = error_;
  if (!CatchUp()) error_ = error;
  settled_ = true;
}

bool SearchHistoryTable::TakeNow(SearchHistory& rec, int max) {
  std::string reason;
  if (session_->Transaction([&] { return Record(rec) && Prune(rec, max); }, reason)) return true;
  if (!reason.empty()) error_ = reason;
  return false;
}

bool SearchHistoryTable::CatchUp() {
  const maru::KeepErrno keep;
  std::string reason;
  const bool done = HistoryJournal::OfService().HandOver([&](const auto& entries) {
    return session_->Transaction([&] { return Take(entries); }, reason);
  });
  if (done) return true;
  if (errno != 0) reason = std::string("history.journal: ") + strerror(errno);
  if (!reason.empty()) error_ = reason;
  return false;
}

bool SearchHistoryTable::Take(const std::vector<HistoryJournal::Entry>& entries) {
  // What was asked for again and again is written once.
  std::vector<SearchHistory> records;
  std::map<std::pair<uid_t, std::string>, std::size_t> places;
  std::map<uid_t, std::pair<std::size_t, int>> last;
  for (const HistoryJournal::Entry& entry : entries) {
    const auto [known, added] = places.try_emplace({entry.uid, entry.keyword}, records.size());
    if (added) records.emplace_back();
    SearchHistory& record = records[known->second];
    record.uid = entry.uid;
    record.keyword = entry.keyword;
    record.create_time = entry.create_time;
    last[entry.uid] = {known->second, entry.max};
  }
  std::vector<std::pair<uid_t, std::string>> refused;
  for (SearchHistory& record : records) {
    if (!session_->Attempt([&] { return Record(record); }))
      refused.emplace_back(record.uid, error_);
  }
  // One that the database refuses must not keep back the others. When it takes nothing at all, they
  // may come again.
  if (refused.size() == records.size() && !TakesAny(records.back())) return false;
  for (const auto& [uid, newest] : last) {
    const SearchHistory& record = records[newest.first];
    if (record.id != 0 && !Prune(record, newest.second)) return false;
  }
  for (const auto& [uid, reason] : refused) HistoryJournal::TellRefused(uid, reason);
  return true;
}

/// Whether the database would take a row that nothing speaks against. None is left behind.
bool SearchHistoryTable::TakesAny(SearchHistory row) {
  bool taken = false;
  row.keyword.assign(1, 'a');
  session_->Attempt([&] {
    taken = Record(row);
    return false;
  });
  return taken;
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
  if (!TableBase::GetAll(stored, rec.SameContent(), SelectParam(0, 1, "id", false))) return false;
  if (stored.empty()) return false;
  rec = stored.front();
  return true;
}

bool SearchHistoryTable::Prune(const SearchHistory& newest, int max) {
  if (max <= 0) return true;
  const Condition others =
      newest.SameOwner() && Condition::ConditionFactory<int>("id", "!=", newest.id);
  std::vector<SearchHistory> excess;
  if (!TableBase::GetAll(excess, others, SelectParam(max - 1, 1, "create_time", false)))
    return false;
  if (excess.empty()) return true;
  return TableBase::Delete(others && excess.front().NotNewer());
}

}  // namespace maruseeker::db
