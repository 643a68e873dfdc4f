#pragma once

#include <string>

namespace maru::daemon {

/// Started as root: becomes `account` for good, with no right of root left but CAP_DAC_READ_SEARCH,
/// which lies unused until ExamineFiles. Started as anybody else: keeps what identity it has.
/// Either way no execve can win rights again. Once, before threads start; throws
/// std::runtime_error, and the process is then to end.
void DropPrivileges(const std::string& account);

/// Whether ExamineFiles makes a difference: the process is root or holds the capability.
bool MayExamineAllFiles();

/// For its lifetime this thread can look at every file's rights (CAP_DAC_READ_SEARCH is effective).
/// Without the capability it does nothing.
class ExamineFiles {
 public:
  ExamineFiles();
  ~ExamineFiles();
  ExamineFiles(const ExamineFiles&) = delete;
  ExamineFiles& operator=(const ExamineFiles&) = delete;
};

}  // namespace maru::daemon
