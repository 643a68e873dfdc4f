#include "daemon/core/capability.h"

#include <sys/wait.h>

#include <thread>

#include "daemon/core/page_check.h"
#include "tests/daemon/fixture.h"

namespace maru::daemon::test {
namespace {

/// Runs `work` in a process of its own; its result.
int InChild(const std::function<int()>& work) {
  const pid_t child = fork();
  if (child == 0) _exit(work());
  int status = 0;
  waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST_F(DaemonTest, TheServiceCanExamineAllFilesAndOpenNone) {
  File("photo/shut/secret.txt", "word", 0600, games_.uid);
  ASSERT_EQ(chmod((root_ + "/photo/shut").c_str(), 0700), 0);
  ASSERT_EQ(chown((root_ + "/photo/shut").c_str(), games_.uid, 0), 0);
  const index::Hit hit = HitAt("photo", "/shut/secret.txt");
  const Scope scope{
      {games_, "games"}, {{"fileindex_photo", table_->Find("photo"), games_}}, table_};
  const std::string secret = root_ + "/photo/shut/secret.txt";
  const int result = InChild([&] {
    BecomeDaemon("bin");
    if (!HoldsReadSearch() || geteuid() != bin_.uid || open(secret.c_str(), O_RDONLY) >= 0)
      return 1;
    // As in the daemon: in a thread, again and again.
    int fault = 0;
    std::thread([&] {
      for (int i = 0; i < 3 && fault == 0; ++i) {
        if (!ReadableNow(scope, {hit})[0]) fault = 2;
        if (open(secret.c_str(), O_RDONLY) >= 0) fault = 3;
      }
    }).join();
    return fault ? fault : setuid(0) == 0 ? 4 : 0;
  });
  EXPECT_EQ(result, 0);
}

}  // namespace
}  // namespace maru::daemon::test
