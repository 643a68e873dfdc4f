#include <sys/stat.h>

#include <stdexcept>

#include "program/program.h"
#include "server/host/host.h"
#include "system/config.h"

namespace {

maru::UniqueFd Socket(int fd) {
  struct stat status;
  if (fstat(fd, &status) != 0 || !S_ISSOCK(status.st_mode)) {
    throw std::runtime_error("only maruwebd can start it");
  }
  return maru::server::Descriptor(fd);
}

}  // namespace

int main(int argc, char** argv) {
  int control = -1;
  int lifeline = -1;
  const auto serve = [&] {
    maru::Config config = maru::Config::Get();
    if (config.plugin.empty()) config.plugin = MARU_PLUGIN;
    return maru::server::RunHost(config, Socket(control), Socket(lifeline));
  };
  return maru::RunProgram(
      {.command =
           {.name = "maruweb-host",
            .help = "The host of MaruSeeker's web server. maruwebd starts it; nobody else should.",
            .arguments = {{"control", "Socket that leads to the front", &control, true},
                          {"lifeline", "Socket that leads to the supervisor", &lifeline, true}},
            .run = serve},
       .log_name = "maruwebd"},
      argc, argv);
}
