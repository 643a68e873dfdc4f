#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <string>

#include "server/host/host.h"
#include "system/config.h"
#include "system/log.h"

namespace {

bool IsSocket(int fd) {
  struct stat status;
  return fstat(fd, &status) == 0 && S_ISSOCK(status.st_mode);
}

}  // namespace

int main(int argc, char** argv) {
  std::string path;
  bool foreground = false;
  int control = -1;
  int lifeline = -1;
  CLI::App app("The host of MaruSeeker's web server. maruwebd starts it; nobody else should.",
               "maruweb-host");
  app.add_option("--config", path, "Configuration file")->type_name("FILE");
  app.add_flag("--foreground", foreground, "Copy the log to standard error");
  app.add_option("control", control, "Socket that leads to the front")->required();
  app.add_option("lifeline", lifeline, "Socket that leads to the supervisor")->required();
  app.set_version_flag("--version", "maruweb-host " MARU_VERSION);
  CLI11_PARSE(app, argc, argv);
  maru::OpenLog("maruwebd", foreground);
  try {
    if (!IsSocket(control) || !IsSocket(lifeline)) {
      fprintf(stderr, "maruweb-host: only maruwebd can start it\n");
      return 1;
    }
    maru::Config config = path.empty() ? maru::Config::Get() : maru::Config::Load(path);
    if (config.plugin.empty()) config.plugin = MARU_PLUGIN;
    return maru::server::RunHost(config, maru::UniqueFd(control), maru::UniqueFd(lifeline));
  } catch (const std::exception& exception) {
    MARU_LOG("The host cannot start: %s", exception.what());
    return 1;
  }
}
