#pragma once

#include <cxxabi.h>
#include <unistd.h>

#include <functional>

#include "common/common.h"
#include "platform/process.h"

namespace maruseeker::sdk {

/// Runs a function somewhere else.
class TaskBase {
 public:
  virtual ~TaskBase() = default;
  virtual void DoTask(std::function<void()> task) = 0;
};

/// Runs it in a child process that nobody waits for: it sees the caller's objects as they were at
/// the fork, tells its failures to the log only, and always ends with status 0 without any
/// destructor.
class ForkTask : public TaskBase {
 public:
  void DoTask(std::function<void()> task) override {
    const pid_t pid = MLIBCProcForkEx(1);
    if (pid == 0) {
      try {
        task();
      } catch (abi::__forced_unwind&) {
        throw;
      } catch (const Error& error) {
        MARU_LOG("Failed to execute, %d %s", error.Code(), error.what());
      } catch (const std::exception& error) {
        MARU_LOG("Failed to execute, %s", error.what());
      } catch (...) {
        MARU_LOG("Failed to execute");
      }
      _exit(0);
    }
    // The request counts as answered all the same.
    if (pid < 0) {
      MARU_LOG("Failed to fork");
    }
  }
};

}  // namespace maruseeker::sdk
