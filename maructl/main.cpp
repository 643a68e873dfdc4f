#include <CLI/CLI.hpp>

#include <cstdio>
#include <exception>
#include <functional>
#include <string>

#include "maructl/commands.h"
#include "system/config.h"
#include "system/log.h"

namespace {

using namespace maru::control;

/// The options of all subcommands, and what to run.
struct Call {
  std::string config;
  SearchWish search;
  std::string user, key, value;
  std::function<int()> run;
};

CLI::App* Add(CLI::App& app, Call& call, const char* name, const char* help,
              std::function<int()> run) {
  CLI::App* command = app.add_subcommand(name, help);
  command->callback([&call, run = std::move(run)] { call.run = run; });
  return command;
}

void DescribePreferences(CLI::App& app, Call& call) {
  CLI::App* preference = app.add_subcommand("preference", "A user's preferences");
  preference->require_subcommand(1);
  CLI::App* get = Add(*preference, call, "get", "Print one",
                      [&call] { return GetPreference(call.user, call.key); });
  CLI::App* set = Add(*preference, call, "set", "Change one",
                      [&call] { return SetPreference(call.user, call.key, call.value); });
  for (CLI::App* command : {get, set}) {
    command->add_option("user", call.user, "Name of the user")->required();
    command->add_option("key", call.key, "Name of the preference")->required();
  }
  set->add_option("value", call.value, "yes, no, or a number")->required();
}

void Describe(CLI::App& app, Call& call) {
  app.set_version_flag("--version", MARU_VERSION);
  app.add_option("--config", call.config, "Configuration file");
  app.require_subcommand(1);
  Add(app, call, "status", "Which services answer, and what is indexed", ShowStatus);
  Add(app, call, "shares", "The shared folders as MaruSeeker understands them", ShowShares);
  Add(app, call, "config", "All settings with their values", ShowConfig);
  CLI::App* search = Add(app, call, "search", "Print the paths of matching files, as this user",
                         [&call] { return Search(call.search); });
  search->add_option("words", call.search.words, "What to look for")->required();
  search->add_option("--limit", call.search.limit, "Paths at most")
      ->check(CLI::Range(1, 10'000))
      ->capture_default_str();
  search->add_flag("-0,--null", call.search.null_ended, "End paths with a NUL byte");
  DescribePreferences(app, call);
}

}  // namespace

int main(int argc, char** argv) {
  Call call;
  CLI::App app("Looks after MaruSeeker.", "maructl");
  Describe(app, call);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? kGood : kUsage;
  }
  try {
    maru::OpenLog("maructl", false);
    if (!call.config.empty()) maru::Config::Load(call.config);
    return call.run();
  } catch (const std::exception& error) {
    std::fprintf(stderr, "maructl: %s\n", error.what());
    return kFailed;
  }
}
