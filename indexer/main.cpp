#include <CLI/CLI.hpp>

#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "indexer/crawl/once.h"
#include "indexer/extract/processes.h"
#include "indexer/privileges.h"
#include "indexer/service.h"
#include "system/config.h"
#include "system/log.h"
#include "system/throw_errno.h"

namespace maru::indexer {
namespace {

constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;
/// As a shell tells of a process that a signal ended.
constexpr int kExitSignal = 128;
/// What the crawling thread sends the waiting one.
constexpr int kCrawlEnded = SIGUSR1;

struct Options {
  bool once = false;
  bool full = false;
  bool quiet = false;
  bool foreground = false;
  std::vector<std::string> shares;
  std::string config;
  int crawl_hours = 24;
};

void Describe(CLI::App& app, Options& options) {
  app.set_version_flag("--version", MARU_VERSION);
  app.add_flag("--once", options.once, "Crawl once, with progress, and end");
  app.add_option("--share", options.shares, "With --once: only this share; may be repeated")
      ->needs("--once");
  app.add_flag("--full", options.full, "With --once: forget the index and crawl anew")
      ->needs("--once");
  app.add_flag("--quiet", options.quiet, "With --once: no progress and no summary")
      ->needs("--once");
  app.add_flag("--foreground", options.foreground, "Copy the log to standard error");
  app.add_option("--crawl-hours", options.crawl_hours, "Hours between two comparing crawls")
      ->check(CLI::Range(1, 24 * 30))
      ->capture_default_str();
  app.add_option("--config", options.config, "Configuration file");
}

void BlockSignals(sigset_t& signals) {
  sigemptyset(&signals);
  for (const int signal : {SIGTERM, SIGINT, SIGHUP, kCrawlEnded}) sigaddset(&signals, signal);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  signal(SIGPIPE, SIG_IGN);
}

void RaiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

/// One indexer a state folder. Held as long as the process lives.
UniqueFd LockState() {
  const std::string path = IndexHome() + "/.lock";
  UniqueFd lock(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock) ThrowErrno("Cannot open " + path);
  struct flock whole {};
  whole.l_type = F_WRLCK;
  if (fcntl(lock.Get(), F_OFD_SETLK, &whole) != 0) {
    throw std::runtime_error("Another maruindexd is at work here (" + path + ")");
  }
  return lock;
}

std::vector<Target> ChooseTargets(const Options& options) {
  const std::shared_ptr<const ShareTable> table = ShareTable::Current();
  if (!table->Error().empty()) MARU_LOG("Shares: %s", table->Error().c_str());
  Targets targets = FindTargets(*table);
  const auto wanted = [&](const std::string& share) {
    return options.shares.empty() ||
           std::find(options.shares.begin(), options.shares.end(), share) != options.shares.end();
  };
  for (const std::string& share : options.shares) {
    const ShareSettings* settings = table->Find(share);
    if (!settings || !settings->index) throw std::runtime_error("No share " + share + " to index");
  }
  for (const std::string& share : targets.missing) {
    errno = 0;
    if (wanted(share)) MARU_LOG("Share %s: its folder is not there", share.c_str());
  }
  std::erase_if(targets.present, [&](const Target& target) { return !wanted(target.share); });
  if (options.shares.empty()) RemoveForeignIndices(*table, {});
  return targets.present;
}

int RunOnce(const Options& options, Workers& workers, const sigset_t& signals) {
  const std::vector<Target> targets = ChooseTargets(options);
  Progress progress(options.quiet);
  std::atomic<bool> stop{false};
  bool good = false;
  std::thread crawl([&] {
    good = CrawlOnce(targets, workers, {options.full}, progress, stop);
    kill(getpid(), kCrawlEnded);
  });
  int ended_by = 0;
  sigwait(&signals, &ended_by);
  stop = true;
  crawl.join();
  if (ended_by != kCrawlEnded) return kExitSignal + ended_by;
  return good ? 0 : kExitFailed;
}

int Run(const Options& options) {
  if (!options.config.empty()) Config::Load(options.config);
  OpenLog("maruindexd", options.foreground || options.once);
  const Sight sight = DropPrivileges();
  sigset_t signals;
  BlockSignals(signals);
  RaiseDescriptorLimit();
  // Before the lock, the index and the threads: what is forked keeps what was open.
  extract::Processes processes(std::max(1u, std::thread::hardware_concurrency()));
  const UniqueFd lock = LockState();
  errno = 0;
  if (sight == Sight::kOwn) {
    MARU_LOG("Without the right to read every file: what this account cannot read is not indexed");
  }
  Workers workers(processes, static_cast<std::size_t>(Config::Get().max_text_kib) << 10);
  if (options.once) return RunOnce(options, workers, signals);
  Keeper::Settings settings;
  settings.crawl_interval = std::chrono::hours(options.crawl_hours);
  Serve(workers, settings);
  return 0;
}

}  // namespace
}  // namespace maru::indexer

int main(int argc, char** argv) {
  using namespace maru::indexer;
  Options options;
  CLI::App app("Keeps the index of the shared folders up to date.", "maruindexd");
  Describe(app, options);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : kExitUsage;
  }
  try {
    return Run(options);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "maruindexd: %s\n", error.what());
    return kExitFailed;
  }
}
