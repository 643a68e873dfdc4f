#include "program/program.h"

#include <errno.h>
#include <stdio.h>

#include <CLI/CLI.hpp>
#include <exception>

#include "system/config.h"
#include "system/log.h"

namespace maru {
namespace {

void Add(CLI::App& app, const Argument& argument) {
  CLI::Option* option = std::visit(
      [&](auto* value) -> CLI::Option* {
        if constexpr (std::is_same_v<decltype(value), bool*>) {
          return app.add_flag(argument.names, *value, argument.help);
        } else {
          return app.add_option(argument.names, *value, argument.help);
        }
      },
      argument.value);
  option->required(argument.required);
  if (argument.needs) option->needs(app.get_option(argument.needs));
  if (argument.minimum == argument.maximum) return;
  option->check(CLI::Range(argument.minimum, argument.maximum))->capture_default_str();
}

/// `asked` becomes the work of the command that the command line names.
void Describe(CLI::App& app, const Command& command, const std::function<int()>*& asked) {
  for (const Argument& argument : command.arguments) Add(app, argument);
  for (const Command& part : command.commands) {
    Describe(*app.add_subcommand(part.name, part.help), part, asked);
  }
  if (command.commands.empty()) {
    app.callback([&] { asked = &command.run; });
  } else {
    app.require_subcommand(1);
  }
}

/// What ends a program is told once on standard error, without what a line of the log has around
/// it.
void Tell(const Program& program, const char* log_name, const char* what) {
  fprintf(stderr, "%s: %s\n", program.command.name, what);
  if (!program.is_service) return;
  OpenLog(log_name, false);
  errno = 0;
  MARU_LOG("Cannot start: %s", what);
}

}  // namespace

int RunProgram(const Program& program, int argc, char** argv) {
  const Command& command = program.command;
  const char* const log_name = program.log_name ? program.log_name : command.name;
  std::string config;
  bool foreground = false;
  const std::function<int()>* asked = nullptr;
  CLI::App app(command.help, command.name);
  app.add_option("--config", config, "Configuration file")->type_name("FILE");
  if (program.is_service)
    app.add_flag("--foreground", foreground, "Copy the log to standard error");
  app.set_version_flag("--version", std::string(command.name) + " " MARU_VERSION);
  Describe(app, command, asked);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : kUsageStatus;
  }
  try {
    OpenLog(log_name, foreground);
    if (!config.empty()) Config::Load(config);
    return (*asked)();
  } catch (const std::exception& error) {
    Tell(program, log_name, error.what());
    return program.failed;
  }
}

}  // namespace maru
