#include <pwd.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <csignal>
#include <exception>
#include <iostream>
#include <stdexcept>
#include <string>

#include "daemon/core.h"
#include "daemon/listener.h"
#include "daemon/privilege.h"
#include "daemon/server.h"
#include "history/newest.h"
#include "system/accounts.h"
#include "system/config.h"
#include "system/daemon_connection.h"
#include "system/log.h"

namespace {

using namespace maru;
using namespace maru::daemon;

Server* running = nullptr;

void OnSignal(int) {
  const int error = errno;
  running->Stop();
  errno = error;
}

/// Whom the process will be: the service account for root, else who it is.
Identity FutureIdentity() {
  const bool root = geteuid() == 0;
  const auto identity = root ? IdentityOfUser(kServiceAccount) : IdentityOfUID(geteuid());
  if (!identity && root) {
    throw std::runtime_error(std::string("There is no account ") + kServiceAccount);
  }
  return identity.value_or(Identity{geteuid(), {}});
}

void RaiseDescriptorLimit() {
  rlimit limit;
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

void Serve(const Config& config) {
  umask(077);
  RaiseDescriptorLimit();
  const Identity identity = FutureIdentity();
  const Listener listener(kDaemonSocket, identity);
  DropPrivileges(kServiceAccount);
  if (!MayExamineAllFiles()) {
    MARU_LOG("Running without CAP_DAC_READ_SEARCH: only files that user %u can reach are shown",
             geteuid());
  }
  LibraryIndices indices(config.state_dir + "/index");
  UsageStore usage(config.state_dir + "/usage.db");
  Core core{.indices = indices, .usage = usage};
  core.history = history::NewestSearches;
  Server server(core, listener.Socket(), identity.uid, {});
  running = &server;
  for (const int signal : {SIGTERM, SIGINT}) std::signal(signal, OnSignal);
  std::signal(SIGPIPE, SIG_IGN);
  server.Run();
  for (const int signal : {SIGTERM, SIGINT}) std::signal(signal, SIG_IGN);
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app("The search daemon of MaruSeeker.", "maruelasticd");
  std::string config_file = Config::kDefaultPath;
  bool foreground = false;
  app.add_option("--config", config_file, "Configuration file")->type_name("FILE");
  app.add_flag("--foreground", foreground, "Log to standard error, too");
  app.set_version_flag("--version", MARUSEEKER_VERSION);
  CLI11_PARSE(app, argc, argv);
  OpenLog("maruelasticd", foreground);
  try {
    Serve(app.count("--config") ? Config::Load(config_file) : Config::Get());
    return 0;
  } catch (const std::exception& error) {
    errno = 0;
    MARU_LOG("%s", error.what());
    if (!foreground) std::cerr << "maruelasticd: " << error.what() << "\n";
    return 1;
  }
}
