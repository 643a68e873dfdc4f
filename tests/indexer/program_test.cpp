#include <signal.h>
#include <sys/wait.h>

#include "fixture.h"
#include "system/accounts.h"

namespace maru::indexer::test {
namespace {

/// maruindexd as it is run.
class ProgramTest : public ShareTest {
 protected:
  ProgramTest() {
    Settings("[share]\n\tpath = " + Share() + "\n");
    std::ofstream(root_ + "/maru.conf")
        << "samba_config = " << root_ << "/smb.conf\nsamba_config_canonical = yes\n"
        << "state_dir = " << root_ << "/state\n";
    fs::remove(root_ + "/index");
    fs::create_directory_symlink("state/index", root_ + "/index");
  }
  void SetUp() override {
    if (geteuid() != 0) return;
    if (!service_) GTEST_SKIP() << "needs the account " << kServiceAccount;
    fs::create_directory(root_ + "/state");
    ASSERT_EQ(0, chown((root_ + "/state").c_str(), service_->uid, service_->gid));
  }
  ~ProgramTest() override {
    if (process_ > 0) End(SIGKILL);
  }

  void Settings(const std::string& text) {
    std::ofstream(root_ + "/smb.conf.new") << text;
    fs::rename(root_ + "/smb.conf.new", root_ + "/smb.conf");
  }

  void Start(std::vector<std::string> arguments, bool as_service = false) {
    arguments.insert(arguments.begin(), MARU_INDEXD);
    arguments.insert(arguments.end(), {"--config", root_ + "/maru.conf"});
    std::vector<char*> list;
    for (std::string& argument : arguments) list.push_back(argument.data());
    list.push_back(nullptr);
    const std::string output = root_ + "/output";
    process_ = fork();
    if (process_ != 0) return;
    const int file = open(output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0666);
    dup2(file, STDOUT_FILENO);
    dup2(file, STDERR_FILENO);
    if (as_service && setresuid(service_->uid, service_->uid, service_->uid) != 0) _exit(126);
    execv(MARU_INDEXD, list.data());
    _exit(127);
  }
  int Wait() {
    int status = 0;
    waitpid(process_, &status, 0);
    process_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  }
  int End(int signal) {
    kill(process_, signal);
    return Wait();
  }
  int Run(std::vector<std::string> arguments, bool as_service = false) {
    Start(std::move(arguments), as_service);
    return Wait();
  }
  std::string Output() const {
    std::ifstream file(root_ + "/output");
    return {std::istreambuf_iterator<char>(file), {}};
  }
  bool Within(auto holds) {
    for (int i = 0; i < 600; ++i) {
      if (holds()) return true;
      std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    return false;
  }
  const std::optional<Account> service_ = AccountByName(kServiceAccount);
  pid_t process_ = -1;
};

std::string StatusLine(const std::string& process, const std::string& key) {
  std::ifstream file("/proc/" + process + "/status");
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with(key + ":\t")) return line.substr(key.size() + 2);
  }
  return {};
}

std::vector<std::string> ChildrenOf(const std::string& process) {
  std::ifstream file("/proc/" + process + "/task/" + process + "/children");
  return {std::istream_iterator<std::string>(file), {}};
}

TEST_F(ProgramTest, CrawlsOnceAndSumsUp) {
  Write("a/b.txt", "word");
  LetClockTick();
  EXPECT_EQ(0, Run({"--once"}));
  EXPECT_EQ(0u, Output().find("share: 3 new, 0 changed, 0 unchanged, 0 removed, 0 failed, "))
      << Output();
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
  EXPECT_EQ(0, Run({"--once", "--share", "share"}));
  EXPECT_NE(std::string::npos, Output().find("0 new, 0 changed, 3 unchanged")) << Output();
  EXPECT_EQ(0, Run({"--once", "--full", "--quiet"}));
  EXPECT_EQ(1u, Search("word").size());
  EXPECT_EQ("", Output());
  EXPECT_EQ(1, Run({"--once", "--share", "nosuch"}));
  EXPECT_EQ(2, Run({"--full"}));
  EXPECT_EQ(2, Run({"--frobnicate"}));
  EXPECT_EQ(0, Run({"--help"}));
}

TEST_F(ProgramTest, AKillAtAnyMomentForgetsAndDoublesNothing) {
  std::mt19937 random = Random();
  for (int i = 0; i < 2'000; ++i) {
    Write("d" + std::to_string(i % 40) + "/f" + std::to_string(i), "word" + std::to_string(i));
  }
  for (int round = 0; round < 12; ++round) {
    Start({"--once"});
    std::this_thread::sleep_for(std::chrono::milliseconds(random() % 600));
    kill(process_, round % 3 == 0 ? SIGTERM : SIGKILL);
    Wait();
    for (int i = 0; i < 30; ++i) Mutate(random);
  }
  LetClockTick();
  ASSERT_EQ(0, Run({"--once"})) << Output();
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
  ExpectNothingToDo();
}

TEST_F(ProgramTest, FollowsSettingsAndChangesUntilItIsEnded) {
  Write("a.txt", "first");
  fs::create_directories(root_ + "/second");
  Start({"--foreground"});
  ASSERT_TRUE(Within([&] { return Matches(); })) << Output();
  Write("b.txt", "second");
  EXPECT_TRUE(Within([&] { return Matches(); }));
  EXPECT_EQ(1, Run({"--once"})) << "one indexer at a time";
  EXPECT_NE(std::string::npos, Output().find("Another maruindexd"));
}

TEST_F(ProgramTest, SharesComeAndGoWithTheSettings) {
  fs::create_directory(root_ + "/second");
  Start({});
  ASSERT_TRUE(Within([&] { return Matches(); })) << Output();
  fs::create_directory(root_ + "/state/index/mine");
  Settings("[second]\n\tpath = " + root_ + "/second\n");
  kill(process_, SIGHUP);
  EXPECT_TRUE(
      Within([&] { return library_.Has("fileindex_second") && !library_.Has("fileindex_share"); }));
  EXPECT_TRUE(fs::exists(root_ + "/state/index/mine")) << "only indices are removed";
  Settings("[second\n\tgarbage");
  kill(process_, SIGHUP);
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  EXPECT_TRUE(library_.Has("fileindex_second")) << "settings with an error remove nothing";
  EXPECT_EQ(0, End(SIGTERM));
}

TEST_F(ProgramTest, KeepsNoRightButToRead) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give up";
  Write("secret.txt", "onlyroot");
  Chmod("secret.txt", 0600);
  Start({});
  ASSERT_TRUE(Within([&] { return Matches(); })) << Output();
  EXPECT_EQ(1u, Search("onlyroot").size()) << "reads what the service account may not";
  const std::string main = std::to_string(process_);
  const std::string uid = std::to_string(service_->uid);
  EXPECT_EQ(uid + "\t" + uid + "\t" + uid + "\t" + uid, StatusLine(main, "Uid"));
  EXPECT_EQ("0000000000000004", StatusLine(main, "CapEff")) << "CAP_DAC_READ_SEARCH";
  EXPECT_EQ("1", StatusLine(main, "NoNewPrivs"));
  const auto forkers = ChildrenOf(main);
  ASSERT_EQ(1u, forkers.size());
  const auto workers = ChildrenOf(forkers[0]);
  ASSERT_FALSE(workers.empty());
  for (const std::string& worker : workers) {
    EXPECT_EQ("0000000000000000", StatusLine(worker, "CapPrm"));
    EXPECT_EQ("0000000000000000", StatusLine(worker, "CapBnd"));
    EXPECT_EQ("2", StatusLine(worker, "Seccomp"));
  }
  EXPECT_EQ("0000000000000000", StatusLine(forkers[0], "CapPrm"));
  EXPECT_EQ(0, End(SIGTERM));
  EXPECT_TRUE(Within(
      [&] { return !fs::exists("/proc/" + forkers[0]) && !fs::exists("/proc/" + workers[0]); }));
}

TEST_F(ProgramTest, WithoutRightsItIndexesWhatItCanRead) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to become somebody else";
  Write("open/a.txt", "readable");
  Write("closed/b.txt", "unreachable");
  Write("open/shut.txt", "unreadable");
  Chmod("closed", 0700);
  Chmod("open/shut.txt", 0600);
  EXPECT_EQ(0, Run({"--once"}, true)) << Output();
  EXPECT_NE(std::string::npos, Output().find("Without the right to read every file")) << Output();
  EXPECT_NE(std::string::npos, Output().find("2 failed")) << Output();
  EXPECT_EQ(1u, Search("readable").size());
  const Snapshot indexed = Indexed();
  EXPECT_TRUE(indexed.contains("/open/shut.txt") && indexed.contains("/closed")) << "by name";
  EXPECT_FALSE(indexed.contains("/closed/b.txt"));
}

}  // namespace
}  // namespace maru::indexer::test
