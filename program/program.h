#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <variant>
#include <vector>

namespace maru {

/// One argument of a command line, and where its value goes: untouched unless it is given.
struct Argument {
  /// As people type them, "--limit" or "-0,--null"; without a dash it is known by its place.
  const char* names;
  const char* help;
  /// Truth: a flag. A list: may be repeated.
  std::variant<bool*, int*, std::uint32_t*, std::string*, std::vector<std::string>*> value;
  bool required = false;
  /// Bounds of a number; both 0: none.
  int minimum = 0, maximum = 0;
  /// Another option of the command, without which this one must not be given.
  const char* needs = nullptr;
};

/// What a program does, or one of the commands that it has.
struct Command {
  const char* name;
  const char* help;
  std::vector<Argument> arguments = {};
  /// If there are any, one of them is asked for, and `run` is theirs.
  std::vector<Command> commands = {};
  /// Returns the exit status; may throw std::exception. Config::Get() is the configuration that was
  /// asked for, and the log is open.
  std::function<int()> run = {};
};

struct Program {
  Command command;
  /// Has --foreground, which copies the log to standard error, and logs an exception that ends it.
  bool is_service = true;
  /// Whom the log's lines are from; nothing: the program's name.
  const char* log_name = nullptr;
  /// The exit status when an exception has ended it.
  int failed = 1;
};

/// The exit status after a wrong command line.
inline constexpr int kUsageStatus = 2;

/// A program's whole life, from its command line to its exit status. Takes --help, --version and
/// --config beside the program's own arguments. An exception's text goes to standard error.
int RunProgram(const Program& program, int argc, char** argv);

}  // namespace maru
