#include <filesystem>
#include <string>
#include <vector>

#include "program/program.h"
#include "server/supervisor.h"
#include "system/config.h"

namespace {

/// How the host is started: the program beside this one, with the same arguments.
std::vector<std::string> HostCommand(int argc, char** argv) {
  std::vector<std::string> words(argv, argv + argc);
  words[0] = std::filesystem::read_symlink("/proc/self/exe").replace_filename("maruweb-host");
  return words;
}

}  // namespace

int main(int argc, char** argv) {
  const auto serve = [&] {
    maru::Config config = maru::Config::Get();
    if (config.page_dir.empty()) config.page_dir = MARU_PAGE_DIR;
    return maru::server::RunSupervisor(config, HostCommand(argc, argv));
  };
  return maru::RunProgram({{.name = "maruwebd", .help = "MaruSeeker's web server.", .run = serve}},
                          argc, argv);
}
