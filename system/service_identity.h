#pragma once

#include <string>

/// What a service does with its own process when it starts.
namespace maru {

/// What a process keeps of root's power when it becomes a service's account.
enum class Keep {
  kNothing,
  /// CAP_DAC_READ_SEARCH, permitted and effective: looks at every file, changes none.
  kReadSearch,
};

/// Turns this process into `account` for good: no root to come back to (verified), no groups but
/// the account's own, no capability but what is kept, none to gain by running a program. The
/// process has one thread and is root, or at least holds what is to be kept. Throws
/// std::runtime_error; the process must then not go on.
void BecomeForGood(const std::string& account, Keep keep);

/// No execve of this process or its children can win rights. Throws std::system_error.
void GiveUpNewPrivileges();

/// Started as root: BecomeForGood. Started as anybody else: the process stays who it is, with what
/// it holds, and gives up new privileges.
void DropPrivileges(const std::string& account, Keep keep);

/// As many open files as the system lets this process have.
void RaiseDescriptorLimit();

}  // namespace maru
