#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <stdexcept>
#include <string>

#include "daemon/core/capability.h"
#include "daemon/core/core.h"
#include "daemon/history.h"
#include "daemon/socket/listener.h"
#include "daemon/socket/server.h"
#include "program/program.h"
#include "system/config.h"
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
Identity FutureIdentity(const std::string& account) {
  Identity identity;
  const bool known =
      geteuid() == 0 ? IdentityOfUser(account, identity) : IdentityOfUID(geteuid(), identity);
  if (!known && geteuid() == 0) throw std::runtime_error("There is no account " + account);
  if (!known) identity.uid = geteuid();
  return identity;
}

int Serve(const Config& config) {
  umask(077);
  RaiseDescriptorLimit();
  const Identity identity = FutureIdentity(config.service_account);
  const Listener listener(config.daemon_socket, identity);
  DropPrivileges(config.service_account);
  if (!HoldsReadSearch()) {
    MARU_LOG("Running without CAP_DAC_READ_SEARCH: only files that user %u can reach are shown",
             geteuid());
  }
  LibraryIndices indices(config.state_dir + "/index");
  UsageStore usage(config.state_dir + "/usage.db");
  Core core{.indices = indices, .usage = usage};
  core.history = EarlierSearches;
  Server server(core, listener.Socket(), identity.uid, {});
  running = &server;
  for (const int signal : {SIGTERM, SIGINT}) std::signal(signal, OnSignal);
  std::signal(SIGPIPE, SIG_IGN);
  server.Run();
  for (const int signal : {SIGTERM, SIGINT}) std::signal(signal, SIG_IGN);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return RunProgram({{.name = "maruelasticd",
                      .help = "The search daemon of MaruSeeker.",
                      .run = [] { return Serve(Config::Get()); }}},
                    argc, argv);
}
