#include "platform/process.h"

#include <errno.h>
#include <unistd.h>

#include "platform/log.h"

namespace {
thread_local int last_error = 0;
}

int MLIBCProcForkEx(int close_descriptors) {
  const pid_t child = fork();
  if (child < 0) MLIBCErrSet(kErrSystem);
  if (child != 0 || !close_descriptors) return child;
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
