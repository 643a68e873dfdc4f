#include "server/kernel/signals.h"

#include <signal.h>
#include <sys/signalfd.h>

#include "system/throw_errno.h"

namespace maru::server {

UniqueFd OpenSignals(std::initializer_list<int> signals) {
  sigset_t set;
  sigemptyset(&set);
  for (const int signal : signals) sigaddset(&set, signal);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  UniqueFd descriptor(signalfd(-1, &set, SFD_NONBLOCK | SFD_CLOEXEC));
  CheckErrno(descriptor.Get() >= 0, "signalfd");
  return descriptor;
}

int NextSignal(const UniqueFd& signals) {
  signalfd_siginfo info;
  const bool came = read(signals.Get(), &info, sizeof(info)) == sizeof(info);
  return came ? static_cast<int>(info.ssi_signo) : 0;
}

void UnblockSignals() {
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

}  // namespace maru::server
