#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <string>
#include <vector>

#include "server/supervisor.h"
#include "system/config.h"
#include "system/log.h"

namespace {

/// How the host is started: the program beside this one, with the same settings.
std::vector<std::string> HostCommand(const std::string& config_file, bool foreground) {
  std::vector<std::string> words = {
      std::filesystem::read_symlink("/proc/self/exe").replace_filename("maruweb-host")};
  if (foreground) words.push_back("--foreground");
  if (!config_file.empty()) words.insert(words.end(), {"--config", config_file});
  return words;
}

}  // namespace

int main(int argc, char** argv) {
  std::string path;
  bool foreground = false;
  CLI::App app("MaruSeeker's web server.", "maruwebd");
  app.add_option("--config", path, "Configuration file")
      ->check(CLI::ExistingFile)
      ->type_name("FILE");
  app.add_flag("--foreground", foreground, "Copy the log to standard error");
  app.set_version_flag("--version", "maruwebd " MARU_VERSION);
  CLI11_PARSE(app, argc, argv);
  maru::OpenLog("maruwebd", foreground);
  try {
    maru::Config config = path.empty() ? maru::Config::Get() : maru::Config::Load(path);
    if (config.page_dir.empty()) config.page_dir = MARU_PAGE_DIR;
    return maru::server::RunSupervisor(config, HostCommand(path, foreground));
  } catch (const std::exception& exception) {
    MARU_LOG("Cannot start: %s", exception.what());
    if (!foreground) fprintf(stderr, "maruwebd: %s\n", exception.what());
    return 1;
  }
}
