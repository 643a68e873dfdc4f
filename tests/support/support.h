#pragma once

#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <string>

#include "system/config.h"

/// A folder of its own for one test, which every user may enter.
class TempFolder {
 public:
  TempFolder() {
    char name[] = "/tmp/platform.XXXXXX";
    path_ = mkdtemp(name);
    chmod(path_.c_str(), 0755);
  }
  ~TempFolder() { std::filesystem::remove_all(path_); }
  TempFolder(const TempFolder&) = delete;
  TempFolder& operator=(const TempFolder&) = delete;

  std::string operator/(const std::string& name) const { return path_ + "/" + name; }
  std::string Write(const std::string& name, const std::string& text) const {
    std::ofstream(*this / name, std::ios::binary) << text;
    return *this / name;
  }

 private:
  std::string path_;
};

inline std::string FileText(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// Makes a folder of the test the state folder, and its file smb.conf the settings of the shares.
inline void Configure(const TempFolder& folder, const std::string& more = "") {
  maru::Config::Load(folder.Write("maruseeker.conf",
                                  "state_dir = " + (folder / "state") +
                                      "\nsamba_config = " + (folder / "smb.conf") + "\n" + more));
  mkdir((folder / "state").c_str(), 0711);
}

/// The child's exit status as a wait tells it; a failed expectation in it gives 1. It prints its
/// failures itself.
inline int StatusOfChild(const std::function<void()>& work) {
  std::cout.flush();
  const pid_t child = fork();
  if (child == 0) {
    work();
    _exit(testing::Test::HasFailure() ? 1 : 0);
  }
  int status = -1;
  waitpid(child, &status, 0);
  return status;
}

inline bool HasAccount(const char* name) {
  return getpwnam(name) != nullptr;
}

/// For tests that become other users.
#define NEEDS_ACCOUNTS()                                                                     \
  if (geteuid() != 0 || !HasAccount("alice") || !HasAccount("bob") || setgroups(0, nullptr)) \
  GTEST_SKIP() << "needs root and the sandbox's accounts"
