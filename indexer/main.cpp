#include <fcntl.h>
#include <signal.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "indexer/crawl/once.h"
#include "indexer/extract/processes.h"
#include "indexer/privileges.h"
#include "indexer/service.h"
#include "program/program.h"
#include "system/config.h"
#include "system/indexed_shares.h"
#include "system/log.h"
#include "system/throw_errno.h"

namespace maru::indexer {
namespace {

constexpr const char* kProgram = "maruindexd";
constexpr int kExitFailed = 1;
/// As a shell tells of a process that a signal ended.
constexpr int kExitSignal = 128;
/// What the crawling thread sends the waiting one.
constexpr int kCrawlEnded = SIGUSR1;

struct Options {
  bool once = false;
  bool full = false;
  bool quiet = false;
  std::vector<std::string> shares;
  int crawl_hours = 24;
};

std::vector<Argument> Arguments(Options& options) {
  constexpr const char* kOnce = "--once";
  return {
      {.names = kOnce, .help = "Crawl once, with progress, and end", .value = &options.once},
      {.names = "--share",
       .help = "With --once: only this share; may be repeated",
       .value = &options.shares,
       .needs = kOnce},
      {.names = "--full",
       .help = "With --once: forget the index and crawl anew",
       .value = &options.full,
       .needs = kOnce},
      {.names = "--quiet",
       .help = "With --once: no progress and no summary",
       .value = &options.quiet,
       .needs = kOnce},
      {.names = "--crawl-hours",
       .help = "Hours between two comparing crawls",
       .value = &options.crawl_hours,
       .minimum = 1,
       .maximum = 24 * 30},
  };
}

void BlockSignals(sigset_t& signals) {
  sigemptyset(&signals);
  for (const int signal : {SIGTERM, SIGINT, SIGHUP, kCrawlEnded}) sigaddset(&signals, signal);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  signal(SIGPIPE, SIG_IGN);
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
  if (options.once) OpenLog(kProgram, true);
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
  return maru::RunProgram({{.name = kProgram,
                            .help = "Keeps the index of the shared folders up to date.",
                            .arguments = Arguments(options),
                            .run = [&] { return Run(options); }}},
                          argc, argv);
}
