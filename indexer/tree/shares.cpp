#include "indexer/tree/shares.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>

#include "system/index_id.h"
#include "system/indexed_shares.h"
#include "system/log.h"

namespace maru::indexer {

namespace fs = std::filesystem;

Targets FindTargets(const ShareTable& table) {
  Targets targets;
  for (const ShareSettings& share : table.Shares()) {
    if (!share.index) continue;
    struct stat status {};
    if (stat(share.path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) {
      targets.missing.push_back(share.name);
      continue;
    }
    const std::string id = IndexIdOf(share.name);
    targets.present.push_back({share.name,
                               share.path,
                               IndexHome() + "/" + id,
                               {status.st_dev, status.st_ino},
                               CrawlTermsOf(share),
                               Selection(share)});
  }
  return targets;
}

void RemoveIndex(const std::string& index_folder) {
  std::error_code error;
  fs::remove_all(index_folder, error);
  if (error) MARU_LOG("Cannot remove %s: %s", index_folder.c_str(), error.message().c_str());
}

void RemoveForeignIndices(const ShareTable& table, const std::vector<std::string>& used) {
  if (!table.Error().empty()) return;
  std::error_code error;
  std::vector<std::string> foreign;
  for (const fs::directory_entry& entry : fs::directory_iterator(IndexHome(), error)) {
    const std::string name = entry.path().filename();
    if (!name.starts_with(kIndexPrefix)) continue;
    const std::string of = name.substr(kIndexPrefix.size());
    const ShareSettings* share = table.Find(of);
    const bool wanted = share ? share->index : table.IsWithheld(of);
    const bool in_use = std::find(used.begin(), used.end(), entry.path()) != used.end();
    const bool is_folder = entry.symlink_status(error).type() == fs::file_type::directory;
    if (!wanted && !in_use && is_folder) foreign.push_back(entry.path());
  }
  for (const std::string& folder : foreign) {
    errno = 0;
    MARU_LOG("Removing %s: its share is no longer indexed", folder.c_str());
    RemoveIndex(folder);
  }
}

}  // namespace maru::indexer
