#include "history/newest.h"

#include <exception>
#include <mutex>

#include "history/database.h"
#include "history/journal.h"
#include "system/log.h"

namespace maru::history {
namespace {

constexpr const char* kNewestOfUser =
    "SELECT keyword FROM search_history WHERE uid = :u ORDER BY create_time DESC, id DESC "
    "LIMIT 500";

}  // namespace

std::vector<std::string> NewestSearches(uid_t uid) {
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  std::vector<std::string> keywords;
  for (const Journal::Entry& entry : Journal::OfService().Entries()) {
    if (entry.uid == uid) keywords.insert(keywords.begin(), entry.keyword);
  }
  try {
    const long long user = uid;
    std::string keyword;
    soci::session& database = maruseeker::db::DBSession::Instance()->Open();
    soci::statement rows =
        (database.prepare << kNewestOfUser, soci::use(user), soci::into(keyword));
    rows.execute();
    while (rows.fetch()) keywords.push_back(keyword);
  } catch (const std::exception& error) {
    MARU_LOG("Cannot read the search history: %s", error.what());
  }
  return keywords;
}

}  // namespace maru::history
