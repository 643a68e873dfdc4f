#include "daemon/history.h"

#include <exception>
#include <mutex>

#include "platform/history_journal.h"
#include "platform/marudbquery.h"
#include "system/log.h"

namespace maru::daemon {

std::vector<std::string> EarlierSearches(uid_t uid) {
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  std::vector<std::string> keywords;
  for (const auto& entry : maruseeker::db::HistoryJournal::OfService().Entries()) {
    if (entry.uid == uid) keywords.insert(keywords.begin(), entry.keyword);
  }
  try {
    const long long user = uid;
    std::string keyword;
    soci::statement rows = (maruseeker::db::DBSession::Instance()->Open().prepare
                                << "SELECT keyword FROM search_history WHERE uid = :u "
                                   "ORDER BY create_time DESC, id DESC LIMIT " +
                                       std::to_string(kMaxEarlierSearches),
                            soci::use(user), soci::into(keyword));
    rows.execute();
    while (rows.fetch()) keywords.push_back(keyword);
  } catch (const std::exception& error) {
    MARU_LOG("Cannot read the search history: %s", error.what());
  }
  return keywords;
}

}  // namespace maru::daemon
