#include "system/samba.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>

#include <array>
#include <chrono>
#include <map>
#include <optional>
#include <stdexcept>

#include "system/text.h"
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

/// What a child writes to its standard output and standard error, both bounded: output beyond its
/// bound is a failure, complaints beyond theirs are dropped.
class Testparm {
 public:
  explicit Testparm(const std::string& path) { Start(path); }
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
    if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) throw std::runtime_error(Complaint());
    return std::move(text_);
  }

 private:
  void Start(const std::string& path) {
    posix_spawn_file_actions_t files;
    posix_spawnattr_t attributes;
    sigset_t signals;
    posix_spawn_file_actions_init(&files);
    posix_spawn_file_actions_addopen(&files, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
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

/// "name = value" of a line of settings; a name may be spelt with any capitals and spaces.
std::optional<std::pair<std::string, std::string>> Assignment(std::string_view line) {
  const std::size_t equals = line.find('=');
  if (equals == line.npos) return std::nullopt;
  std::string name = Lowered(line.substr(0, equals));
  std::erase_if(name, [](char c) { return c == ' ' || c == '\t'; });
  return std::pair(name, std::string(Trimmed(line.substr(equals + 1))));
}

/// By section: what it includes that is another file for each client. testparm shows these with the
/// variables as they are for itself.
class Includes {
 public:
  void Read(const std::string& path, int depth = 0) {
    std::string text;
    if (depth > kMaxIncludes || !ReadWholeFile(path, kMaxOutput, text, Link::kFollow)) return;
    for (std::string_view rest = text; !rest.empty();) {
      std::string line = TakeLine(rest);
      if (line.starts_with('#') || line.starts_with(';')) continue;
      if (line.starts_with('[')) section_ = Lowered(Trimmed(line.substr(1, line.find(']') - 1)));
      if (const auto set = Assignment(line)) Take(set->first, set->second, depth);
    }
  }

  std::map<std::string, std::string> varying;

 private:
  static constexpr int kMaxIncludes = 100;

  /// The next line, with those that it goes on in.
  static std::string TakeLine(std::string_view& rest) {
    std::string line;
    bool goes_on = true;
    while (goes_on && !rest.empty()) {
      const std::size_t end = std::min(rest.find('\n'), rest.size());
      line += Trimmed(rest.substr(0, end));
      rest.remove_prefix(std::min(end + 1, rest.size()));
      goes_on = line.ends_with('\\');
      if (goes_on) line.pop_back();
    }
    return line;
  }

  void Take(const std::string& name, const std::string& value, int depth) {
    if (name == "copy" && varying.contains(Lowered(value))) {
      varying[section_] = varying[Lowered(value)];
    }
    if (name != "include") return;
    if (value.find('%') != value.npos) {
      varying[section_] = value;
    } else {
      Read(value, depth + 1);
    }
  }

  std::string section_ = "global";
};

/// The canonical text with these includes in the place of testparm's own.
std::string Restored(std::string_view text, const std::map<std::string, std::string>& varying) {
  std::string restored;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(line.size() + 1, text.size()));
    const std::string_view words = Trimmed(line);
    if (words.starts_with("include =")) continue;
    restored.append(line).append("\n");
    if (!words.starts_with('[') || !words.ends_with(']')) continue;
    const auto include = varying.find(Lowered(words.substr(1, words.size() - 2)));
    if (include != varying.end()) restored.append("\tinclude = " + include->second + "\n");
  }
  return restored;
}

}  // namespace

std::string CanonicalSamba(const std::string& path) {
  // testparm itself does not say why it cannot read a file.
  if (!UniqueFd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC))) {
    ThrowErrno(path);
  }
  const std::string text = Testparm(path).Result();
  Includes includes;
  includes.Read(path);
  return Restored(text, includes.varying);
}

}  // namespace maru
