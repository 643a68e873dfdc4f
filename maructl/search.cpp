#include <unistd.h>

#include <cstdio>

#include "maructl/commands.h"
#include "maructl/daemon.h"
#include "maructl/print.h"
#include "system/json.h"

namespace maru::control {
namespace {

constexpr const char* kPathField = "MARUMDPath";

Json::Value Request(const SearchWish& wish) {
  std::string keyword;
  for (const std::string& word : wish.words) keyword += (keyword.empty() ? "" : " ") + word;
  Json::Value data;
  data["pre_query"]["keyword"] = keyword;
  data["size"] = wish.limit;
  data["fields"].append(kPathField);
  return data;
}

void PrintPath(const std::string& path, const SearchWish& wish) {
  if (wish.null_ended) {
    std::fwrite(path.c_str(), 1, path.size() + 1, stdout);
  } else {
    std::printf("%s\n", isatty(STDOUT_FILENO) ? Printable(path).c_str() : path.c_str());
  }
}

}  // namespace

int Search(const SearchWish& wish) {
  Daemon daemon;
  daemon.Ask("search", Request(wish));
  int found = 0;
  for (Json::Value message = daemon.Next();; message = daemon.Next()) {
    if (message.isMember("total")) continue;
    if (message.isMember("success")) {
      Daemon::Judge(message);
      return found > 0 ? kGood : kNo;
    }
    PrintPath(json::StringMember(message, kPathField), wish);
    ++found;
  }
}

}  // namespace maru::control
