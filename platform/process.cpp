#include "platform/process.h"

#include <errno.h>
#include <sched.h>
#include <sys/resource.h>
#include <unistd.h>

#include "platform/guard.h"
#include "system/log.h"

namespace {

constexpr int kFollowUpNice = 10;

thread_local int last_error = 0;

/// From now on the process has a low priority: nobody waits for it.
void GiveWay() {
  const sched_param none{};
  sched_setscheduler(0, SCHED_BATCH, &none);
  setpriority(PRIO_PROCESS, 0, kFollowUpNice);
}

}  // namespace

int MLIBCProcForkEx(int close_descriptors) {
  const pid_t child = fork();
  if (child < 0) MLIBCErrSet(kErrSystem);
  if (child != 0 || !close_descriptors) return child;
  GiveWay();
  // The log's own socket goes with the rest; its number may soon be another file's.
  maru::ReopenLog();
  close_range(STDERR_FILENO + 1, ~0u, 0);
  errno = 0;
  return 0;
}

int MLIBCErrGet() {
  return last_error;
}

void MLIBCErrSet(int code) {
  last_error = code;
}
