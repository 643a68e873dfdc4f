#include "indexer/extract/sandbox.h"

#include <cap-ng.h>
#include <seccomp.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>

#include <array>
#include <cerrno>

namespace maru::extract {
namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif

constexpr std::size_t kMaxDescriptors = 16;

constexpr std::array kAllowed = {
    SCMP_SYS(read),         SCMP_SYS(pread64),
    SCMP_SYS(write),        SCMP_SYS(writev),
    SCMP_SYS(recvmsg),      SCMP_SYS(sendmsg),
    SCMP_SYS(recvfrom),     SCMP_SYS(sendto),
    SCMP_SYS(poll),         SCMP_SYS(close),
    SCMP_SYS(fstat),        SCMP_SYS(lseek),
    SCMP_SYS(munmap),       SCMP_SYS(mremap),
    SCMP_SYS(madvise),      SCMP_SYS(brk),
    SCMP_SYS(futex),        SCMP_SYS(clock_gettime),
    SCMP_SYS(rt_sigreturn), SCMP_SYS(rt_sigprocmask),
    SCMP_SYS(getrandom),    SCMP_SYS(restart_syscall),
    SCMP_SYS(gettid),       SCMP_SYS(getpid),
    SCMP_SYS(exit),         SCMP_SYS(exit_group),
};

bool Limit(__rlimit_resource resource, rlim_t value) {
  const rlimit limit{value, value};
  return setrlimit(resource, &limit) == 0;
}

bool FilterSystemCalls() {
  scmp_filter_ctx filter = seccomp_init(SCMP_ACT_ERRNO(EPERM));
  if (!filter) return false;
  bool good = true;
  for (const int call : kAllowed) {
    good = good && seccomp_rule_add(filter, SCMP_ACT_ALLOW, call, 0) == 0;
  }
  // No new code.
  for (const int call : {SCMP_SYS(mmap), SCMP_SYS(mprotect)}) {
    good = good && seccomp_rule_add(filter, SCMP_ACT_ALLOW, call, 1,
                                    SCMP_A2(SCMP_CMP_MASKED_EQ, PROT_EXEC, 0)) == 0;
  }
  good = good && seccomp_load(filter) == 0;
  seccomp_release(filter);
  return good;
}

}  // namespace

bool DropCapabilities() {
  capng_clear(CAPNG_SELECT_BOTH);
  return capng_apply(CAPNG_SELECT_CAPS) == 0;
}

bool EnterSandbox(std::size_t max_memory) {
  prctl(PR_SET_DUMPABLE, 0);
  if (!DropCapabilities()) return false;
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return false;
  const bool limited = Limit(RLIMIT_NOFILE, kMaxDescriptors) && Limit(RLIMIT_CORE, 0) &&
                       Limit(RLIMIT_FSIZE, 0) && (kSanitized || Limit(RLIMIT_AS, max_memory));
  return limited && FilterSystemCalls();
}

}  // namespace maru::extract
