#include <sys/stat.h>

#include <cstdio>

#include "maructl/commands.h"
#include "maructl/print.h"
#include "system/config.h"
#include "system/indexed_shares.h"
#include "system/share_table.h"

namespace maru::control {
namespace {

std::string IndexState(const ShareSettings& share, const std::set<std::string>& indexed) {
  if (!share.index) return "no (maruseeker:index)";
  struct stat status {};
  if (stat(share.path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) return "no such folder";
  return indexed.contains(share.name) ? "yes" : "not yet";
}

std::string Admitted(const ShareSettings& share) {
  if (!share.available) return "nobody (not available)";
  std::string names;
  for (const std::string& name : share.valid_users) names += (names.empty() ? "" : ", ") + name;
  return names.empty() ? "everyone" : names;
}

void ShowWithheld(const ShareTable& table) {
  if (table.Withheld().empty()) return;
  std::vector<std::vector<std::string>> rows{{"WITHHELD", "BECAUSE"}};
  for (const WithheldShare& share : table.Withheld()) rows.push_back({share.name, share.reason});
  std::printf("\n");
  PrintTable(rows);
}

}  // namespace

int ShowShares() {
  const std::shared_ptr<const ShareTable> table = ShareTable::Current();
  const std::set<std::string> indexed = IndexedShares();
  std::vector<std::vector<std::string>> rows{{"SHARE", "FOLDER", "INDEXED", "ADMITS"}};
  for (const ShareSettings& share : table->Shares()) {
    rows.push_back({share.name, share.path, IndexState(share, indexed), Admitted(share)});
  }
  PrintTable(rows);
  ShowWithheld(*table);
  if (table->Error().empty()) return kGood;
  std::printf(
      "\nThe newest settings are not in force; these are the last good ones. The reason: %s\n",
      Printable(table->Error()).c_str());
  return kNo;
}

int ShowConfig() {
  const Config& config = Config::Get();
  std::vector<std::vector<std::string>> rows;
  for (const Setting& setting : Settings()) {
    rows.push_back({setting.name, "=", setting.ValueIn(config), std::string("# ") + setting.help});
  }
  PrintTable(rows);
  return kGood;
}

}  // namespace maru::control
