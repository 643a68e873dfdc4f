#include <string>

#include "maructl/commands.h"
#include "program/program.h"

namespace {

using namespace maru;
using namespace maru::control;

/// What the commands are given.
struct Given {
  SearchWish search;
  std::string user, key, value;
};

Command SearchCommand(SearchWish& wish) {
  return {.name = "search",
          .help = "Print the paths of matching files, as this user",
          .arguments = {{"words", "What to look for", &wish.words, true},
                        {.names = "--limit",
                         .help = "Paths at most",
                         .value = &wish.limit,
                         .minimum = 1,
                         .maximum = 10'000},
                        {"-0,--null", "End paths with a NUL byte", &wish.null_ended}},
          .run = [&wish] { return Search(wish); }};
}

Command PreferenceCommand(Given& given) {
  const Argument user{"user", "Name of the user", &given.user, true};
  const Argument key{"key", "Name of the preference", &given.key, true};
  const Argument value{"value", "yes, no, or a number", &given.value, true};
  return {
      .name = "preference",
      .help = "A user's preferences",
      .commands = {
          {.name = "get",
           .help = "Print one",
           .arguments = {user, key},
           .run = [&given] { return GetPreference(given.user, given.key); }},
          {.name = "set", .help = "Change one", .arguments = {user, key, value}, .run = [&given] {
             return SetPreference(given.user, given.key, given.value);
           }}}};
}

}  // namespace

int main(int argc, char** argv) {
  Given given;
  const Command control{
      .name = "maructl",
      .help = "Looks after MaruSeeker.",
      .commands = {{.name = "status",
                    .help = "Which services answer, and what is indexed",
                    .run = ShowStatus},
                   {.name = "shares",
                    .help = "The shared folders as MaruSeeker understands them",
                    .run = ShowShares},
                   {.name = "config", .help = "All settings with their values", .run = ShowConfig},
                   SearchCommand(given.search),
                   PreferenceCommand(given)}};
  return RunProgram({.command = control, .is_service = false, .failed = kFailed}, argc, argv);
}
