#include "system/samba.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>

#include <array>
#include <chrono>
#include <span>
#include <stdexcept>
#include <vector>

#include "system/samba_text.h"
#include "system/share_table.h"
#include "system/throw_errno.h"
#include "system/unique_fd.h"
#include "system/whole_file.h"

namespace maru {
namespace {

using Clock = std::chrono::steady_clock;

constexpr const char* kTestparm = "/usr/bin/testparm";
constexpr std::chrono::seconds kTimeLimit{20};
// Ten thousand shares print about 10 MB.
constexpr std::size_t kMaxOutput = 64u << 20;
constexpr std::size_t kMaxComplaint = 4096;

/// A pipe whose reading end does not block.
struct Pipe {
  Pipe() {
    int ends[2];
    CheckErrno(pipe2(ends, O_CLOEXEC) == 0, "testparm: pipe");
    reading = UniqueFd(ends[0]);
    writing = UniqueFd(ends[1]);
    fcntl(ends[0], F_SETFL, O_NONBLOCK);
  }
  UniqueFd reading, writing;
};

/// testparm's own, as opposed to what keeps it from running at all.
class TestparmRefusal : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

/// What a child writes to its standard output and standard error, both bounded: output beyond its
/// bound is a failure, complaints beyond theirs are dropped.
class Testparm {
 public:
  /// `input`, unless it is empty, is its standard input.
  explicit Testparm(const std::string& path, const UniqueFd& input = UniqueFd()) {
    Start(path, input);
  }
  ~Testparm() {
    if (child_ <= 0) return;
    kill(child_, SIGKILL);
    waitpid(child_, nullptr, 0);
  }
  Testparm(const Testparm&) = delete;
  Testparm& operator=(const Testparm&) = delete;

  std::string Result() {
    while (output_.reading || complaint_.reading) ReadSome();
    const int status = Wait();
    if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) throw TestparmRefusal(Complaint());
    return std::move(text_);
  }

 private:
  void Start(const std::string& path, const UniqueFd& input) {
    posix_spawn_file_actions_t files;
    posix_spawnattr_t attributes;
    sigset_t signals;
    posix_spawn_file_actions_init(&files);
    if (input) {
      posix_spawn_file_actions_adddup2(&files, input.Get(), STDIN_FILENO);
    } else {
      posix_spawn_file_actions_addopen(&files, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    }
    posix_spawn_file_actions_adddup2(&files, output_.writing.Get(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&files, complaint_.writing.Get(), STDERR_FILENO);
    posix_spawn_file_actions_addclosefrom_np(&files, STDERR_FILENO + 1);
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
    sigemptyset(&signals);
    posix_spawnattr_setsigmask(&attributes, &signals);
    sigfillset(&signals);
    posix_spawnattr_setsigdefault(&attributes, &signals);
    const char* const arguments[] = {kTestparm, "-s", "-v", path.c_str(), nullptr};
    const char* const environment[] = {"PATH=/usr/bin:/bin", "LC_ALL=C.UTF-8", nullptr};
    const int error = posix_spawn(&child_, kTestparm, &files, &attributes,
                                  const_cast<char**>(arguments), const_cast<char**>(environment));
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&files);
    if (error != 0) {
      child_ = 0;
      ThrowErrno(std::string("testparm: ") + kTestparm, error);
    }
    output_.writing = UniqueFd();
    complaint_.writing = UniqueFd();
  }

  void ReadSome() {
    std::array<pollfd, 2> ends{
        {{output_.reading.Get(), POLLIN, 0}, {complaint_.reading.Get(), POLLIN, 0}}};
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline_ - Clock::now());
    const int ready =
        left.count() > 0 ? poll(ends.data(), ends.size(), static_cast<int>(left.count())) : 0;
    if (ready == 0) ThrowErrno("testparm: no answer", ETIMEDOUT);
    if (ready < 0 && errno == EINTR) return;
    CheckErrno(ready > 0, "testparm: poll");
    if (ends[0].revents) Take(output_, text_, kMaxOutput);
    if (text_.size() > kMaxOutput) ThrowErrno("testparm: output", EFBIG);
    if (ends[1].revents) Take(complaint_, complaint_text_, kMaxComplaint);
  }

  static void Take(Pipe& from, std::string& text, std::size_t limit) {
    std::array<char, 65'536> buffer;
    const ssize_t count = read(from.reading.Get(), buffer.data(), buffer.size());
    if (count < 0 && (errno == EINTR || errno == EAGAIN)) return;
    if (count <= 0) {
      from.reading = UniqueFd();
    } else if (text.size() <= limit) {
      text.append(buffer.data(), static_cast<std::size_t>(count));
    }
  }

  int Wait() {
    int status = -1;
    while (waitpid(child_, &status, 0) < 0) {
      CheckErrno(errno == EINTR, "testparm: lost");
    }
    child_ = 0;
    return status;
  }

  std::string Complaint() const {
    std::string text = "testparm refused the settings: " + complaint_text_.substr(0, kMaxComplaint);
    while (text.ends_with('\n')) text.pop_back();
    for (char& c : text) {
      if (c == '\n') c = ';';
    }
    return text;
  }

  const Clock::time_point deadline_ = Clock::now() + kTimeLimit;
  Pipe output_, complaint_;
  std::string text_, complaint_text_;
  pid_t child_ = 0;
};

std::string CanonicalText(const std::string& text) {
  UniqueFd file(memfd_create("smb.conf", MFD_CLOEXEC));
  CheckErrno(file && WriteAll(file, text), "testparm: memory");
  return Testparm("/proc/self/fd/0", file).Result();
}

/// Which sections testparm takes, with those of `base`: found by halves.
void Sift(const std::string& base, std::span<const SambaSection> sections, std::string& good,
          std::vector<WithheldShare>& bad) {
  if (sections.empty()) return;
  std::string text = base;
  for (const SambaSection& section : sections) text += section.text;
  try {
    CanonicalText(text);
    good += text.substr(base.size());
  } catch (const TestparmRefusal& refusal) {
    if (sections.size() == 1) return bad.push_back({sections[0].name, refusal.what()});
    const std::size_t half = sections.size() / 2;
    Sift(base, sections.first(half), good, bad);
    Sift(base, sections.subspan(half), good, bad);
  }
}

/// The canonical form without the sections that testparm refuses; these say so themselves. Throws
/// what testparm says when it refuses the rest too.
std::string WithoutRefused(const std::string& path) {
  std::string text;
  if (!ReadWholeFile(path, kMaxOutput, text, Link::kFollow)) ThrowErrno(path);
  std::string base;
  const std::vector<SambaSection> sections = SectionsOf(text, base);
  CanonicalText(base);
  std::string good;
  std::vector<WithheldShare> bad;
  Sift(base, sections, good, bad);
  std::string canonical = CanonicalText(base + good);
  for (const WithheldShare& share : bad) {
    canonical += "[" + share.name + "]\n\tmaruseeker:refused = " + share.reason + "\n";
  }
  return canonical;
}

}  // namespace

std::string CanonicalSamba(const std::string& path) {
  // testparm itself does not say why it cannot read a file.
  if (!UniqueFd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC))) {
    ThrowErrno(path);
  }
  std::string text;
  try {
    text = Testparm(path).Result();
  } catch (const TestparmRefusal&) {
    text = WithoutRefused(path);
  }
  return WithIncludes(text, VaryingIncludes(path));
}

}  // namespace maru
