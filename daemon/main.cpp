#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <stdexcept>
#include <string>

#include "daemon/core/capability.h"
#include "daemon/core/core.h"
#include "daemon/socket/listener.h"
#include "daemon/socket/server.h"
#include "history/newest.h"
#include "program/program.h"
#include "system/accounts.h"
#include "system/config.h"
#include "system/daemon_connection.h"
#include "system/indexed_shares.h"
#include "system/log.h"
#include "system/service_identity.h"

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

int Serve(const Config& config) {
  umask(077);
  RaiseDescriptorLimit();
  const Identity identity = FutureIdentity();
  const Listener listener(kDaemonSocket, identity);
  BecomeDaemon(kServiceAccount);
  if (!HoldsReadSearch()) {
    MARU_LOG("Running without CAP_DAC_READ_SEARCH: only files that user %u can reach are shown",
             geteuid());
  }
  LibraryIndices indices(IndexHome());
  UsageStore usage(config.state_dir + "/usage.db");
  Core core{.indices = indices, .usage = usage};
  core.history = history::NewestSearches;
  // Samba's own ACLs of shares are for root to read.
  core.shares = [] {
    const RaisedReadSearch raised;
    return ShareTable::Current();
  };
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
