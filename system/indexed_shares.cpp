#include "system/indexed_shares.h"

#include <errno.h>
#include <sys/stat.h>
#include <unistd.h>

#include "system/config.h"
#include "system/index_id.h"
#include "system/keep_errno.h"
#include "system/share_table.h"
#include "system/throw_errno.h"
#include "system/whole_file.h"

namespace maru {
namespace {

constexpr const char* kTermsFile = "/terms";
constexpr std::size_t kMaxTerms = 16u << 20;

}  // namespace

std::string IndexHome() {
  return Config::Get().state_dir + "/index";
}

std::set<std::string> IndexedShares() {
  const KeepErrno keep;
  std::set<std::string> names;
  const auto table = ShareTable::Current();
  for (const ShareSettings& share : table->Shares()) {
    struct stat status;
    const std::string folder = IndexHome() + "/" + IndexIdOf(share.name);
    if (stat(folder.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) names.insert(share.name);
  }
  return names;
}

std::string CrawlTermsOf(const ShareSettings& share) {
  std::string terms;
  if (share.personal) {
    const PersonalFolders& personal = *share.personal;
    terms += "personal " + share.path + "\n" + (personal.by_home ? "by home\n" : "") +
             (personal.own_only ? "own only\n" : "") + "inside " + personal.inside + "\n" +
             "group " + share.force_group + "\n";
  }
  if (share.veto.patterns.empty()) return terms;
  if (share.veto.case_sensitive) terms += "case sensitive\n";
  for (const std::string& pattern : share.veto.patterns) terms += "veto " + pattern + "\n";
  return terms;
}

std::string RecordedCrawlTerms(const std::string& index_folder) {
  const KeepErrno keep;
  std::string terms;
  if (ReadWholeFile(index_folder + kTermsFile, kMaxTerms, terms)) return terms;
  return errno == ENOENT ? "" : kUnsettledTerms;
}

void RecordCrawlTerms(const std::string& index_folder, const std::string& terms) {
  const std::string path = index_folder + kTermsFile;
  const bool done = terms.empty() ? unlink(path.c_str()) == 0 || errno == ENOENT
                                  : WriteWholeFile(path, terms, 0600, geteuid());
  CheckErrno(done, path.c_str());
}

}  // namespace maru
