#include "server/signals.h"

#include <errno.h>
#include <signal.h>
#include <sys/signalfd.h>

#include <system_error>

namespace maru::server {

Descriptor OpenSignals(std::initializer_list<int> signals) {
  sigset_t set;
  sigemptyset(&set);
  for (const int signal : signals) sigaddset(&set, signal);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  Descriptor descriptor(signalfd(-1, &set, SFD_NONBLOCK | SFD_CLOEXEC));
  if (!descriptor) throw std::system_error(errno, std::generic_category(), "signalfd");
  return descriptor;
}

int NextSignal(const Descriptor& signals) {
  signalfd_siginfo info;
  const bool came = read(signals.Get(), &info, sizeof(info)) == sizeof(info);
  errno = 0;
  return came ? static_cast<int>(info.ssi_signo) : 0;
}

}  // namespace maru::server
