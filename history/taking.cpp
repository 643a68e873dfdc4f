#include "history/taking.h"

#include <errno.h>
#include <string.h>

#include <map>

#include "history/database.h"
#include "history/journal.h"
#include "system/keep_errno.h"
#include "system/log.h"

namespace maru::history {
namespace {

using marudbquery::Condition;
using maruseeker::db::SearchHistory;
using maruseeker::db::SelectParam;

/// The history's table, as it takes searches in.
class Table : public maruseeker::db::TableBase<SearchHistory> {
 public:
  Table() : TableBase(maruseeker::db::DBSession::Instance(), "search_history") {}

  bool TakeOne(SearchHistory& record, int max) {
    return Transaction([&] { return Record(record) && Prune(record, max); });
  }
  bool TakeAll(const std::vector<Journal::Entry>& entries) {
    return Transaction([&] { return Take(entries); });
  }

 private:
  bool Transaction(const std::function<bool()>& work);
  bool Take(const std::vector<Journal::Entry>& entries);
  bool TakesAny(SearchHistory row);
  bool Record(SearchHistory& rec);
  bool Prune(const SearchHistory& newest, int max);
};

bool Table::Transaction(const std::function<bool()>& work) {
  std::string reason;
  if (session_->Transaction(work, reason)) return true;
  if (!reason.empty()) error_ = reason;
  return false;
}

bool Table::Take(const std::vector<Journal::Entry>& entries) {
  // What was asked for again and again is written once.
  std::vector<SearchHistory> records;
  std::map<std::pair<uid_t, std::string>, std::size_t> places;
  std::map<uid_t, std::pair<std::size_t, int>> last;
  for (const Journal::Entry& entry : entries) {
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
  for (const auto& [uid, reason] : refused) {
    MARU_LOG("A search of user %u cannot be recorded: %s", uid, reason.c_str());
  }
  return true;
}

/// Whether the database would take a row that nothing speaks against. None is left behind.
bool Table::TakesAny(SearchHistory row) {
  bool taken = false;
  row.keyword.assign(1, 'a');
  session_->Attempt([&] {
    taken = Record(row);
    return false;
  });
  return taken;
}

bool Table::Record(SearchHistory& rec) {
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

bool Table::Prune(const SearchHistory& newest, int max) {
  if (max <= 0) return true;
  const Condition others =
      newest.SameOwner() && Condition::ConditionFactory<int>("id", "!=", newest.id);
  std::vector<SearchHistory> excess;
  if (!GetAll(excess, others, SelectParam(max - 1, 1, "create_time", false))) return false;
  if (excess.empty()) return true;
  return Delete(others && excess.front().NotNewer());
}

}  // namespace

bool TakeNow(SearchHistory& record, int max, std::string& error) {
  Table table;
  if (table.TakeOne(record, max)) return true;
  error = table.GetLastError();
  return false;
}

bool TakeJournal(std::string& error) {
  const KeepErrno keep;
  Table table;
  const auto take = [&](const auto& entries) { return table.TakeAll(entries); };
  if (Journal::OfService().HandOver(take)) return true;
  error = errno == 0 ? table.GetLastError() : std::string("history.journal: ") + strerror(errno);
  return false;
}

}  // namespace maru::history
