#include "history/journal.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string_view>

#include "system/config.h"
#include "system/json.h"
#include "system/unique_fd.h"
#include "system/whole_file.h"

namespace maru::history {
namespace {

// A hundred or two searches: taken over in a few milliseconds.
constexpr off_t kLongEnough = off_t{16} << 10;
constexpr off_t kMost = off_t{4} << 20;
/// With the longest line behind it.
constexpr std::size_t kMostRead = 64u << 20;
constexpr int kHow = O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;

/// Waits until nobody else has the file locked. False with errno.
bool Lock(const UniqueFd& file, struct stat& status) {
  while (flock(file.Get(), LOCK_EX) != 0) {
    if (errno != EINTR) return false;
  }
  return fstat(file.Get(), &status) == 0;
}

std::string LineOf(const Journal::Entry& entry) {
  Json::Value line(Json::objectValue);
  line["uid"] = entry.uid;
  line["keyword"] = entry.keyword;
  line["create_time"] = static_cast<Json::Int64>(entry.create_time);
  line["max"] = entry.max;
  return json::ToString(line) + "\n";
}

bool ReadLine(const std::string& text, Journal::Entry& entry) {
  Json::Value line;
  if (!json::FromString(text, line) || !line.isObject()) return false;
  const Json::Value& uid = line["uid"];
  const Json::Value& time = line["create_time"];
  if (!uid.isUInt() || !line["keyword"].isString() || !time.isInt64() || !line["max"].isInt()) {
    return false;
  }
  entry = {uid.asUInt(), line["keyword"].asString(), time.asInt64(), line["max"].asInt()};
  return true;
}

std::vector<Journal::Entry> EntriesOf(std::string_view text) {
  std::vector<Journal::Entry> entries;
  Journal::Entry entry;
  while (!text.empty()) {
    const std::string line(text.substr(0, text.find('\n')));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    if (ReadLine(line, entry)) entries.push_back(entry);
  }
  return entries;
}

}  // namespace

Journal Journal::OfService() {
  return Journal(Config::Get().state_dir + "/history.journal");
}

bool Journal::Add(const Entry& entry, bool& long_enough) const {
  const std::string line = LineOf(entry);
  UniqueFd file;
  struct stat status;
  struct stat here;
  do {
    file = UniqueFd(open(path_.c_str(), kHow | O_CREAT | O_APPEND, 0600));
    if (!file || !Lock(file, status)) return false;
    // It may have been set aside meanwhile.
  } while (lstat(path_.c_str(), &here) != 0 || here.st_ino != status.st_ino);
  if (status.st_size > kMost) {
    errno = EFBIG;
    return false;
  }
  const ssize_t written = write(file.Get(), line.data(), line.size());
  if (written == static_cast<ssize_t>(line.size())) {
    long_enough = status.st_size + written > kLongEnough;
    return true;
  }
  // Half a line would spoil the next one.
  const int error = written < 0 ? errno : ENOSPC;
  static_cast<void>(!ftruncate(file.Get(), status.st_size));
  errno = error;
  return false;
}

std::vector<Journal::Entry> Journal::Entries() const {
  // What is set aside in between is seen twice, not never.
  std::string newer, older;
  ReadWholeFile(path_, kMostRead, newer);
  ReadWholeFile(aside_, kMostRead, older);
  return EntriesOf(older + newer);
}

bool Journal::HandOver(const std::function<bool(const std::vector<Entry>&)>& take) const {
  bool is_aside = false;
  do {
    if (!TakeAside(take)) return false;
    is_aside = SetAside();
    // Another process was sooner, perhaps before what was added last.
  } while (!is_aside && errno == EEXIST);
  return (is_aside || errno == ENOENT) && TakeAside(take);
}

/// False with errno: ENOENT when there is nothing, EEXIST when something stands aside.
bool Journal::SetAside() const {
  const UniqueFd file(open(path_.c_str(), kHow));
  struct stat status;
  if (!file || fstat(file.Get(), &status) != 0) return false;
  if (status.st_size == 0) {
    errno = ENOENT;
    return false;
  }
  // Not every file system can rename without replacing: one process at a time looks and renames.
  const std::string folder = path_.substr(0, path_.rfind('/'));
  const UniqueFd turn(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!turn || !Lock(turn, status)) return false;
  if (lstat(aside_.c_str(), &status) == 0) {
    errno = EEXIST;
    return false;
  }
  return rename(path_.c_str(), aside_.c_str()) == 0;
}

/// Gives what is set aside to `take`, after whoever else does.
bool Journal::TakeAside(const std::function<bool(const std::vector<Entry>&)>& take) const {
  const UniqueFd file(open(aside_.c_str(), kHow));
  if (!file) return errno == ENOENT;
  struct stat status;
  std::string text;
  // Whoever adds a line to it at this moment has it locked.
  if (!Lock(file, status)) return false;
  if (status.st_nlink == 0) return true;
  if (!ReadToEnd(file, kMostRead, text)) return false;
  const std::vector<Entry> entries = EntriesOf(text);
  if (!entries.empty() && !take(entries)) {
    errno = 0;
    return false;
  }
  return unlink(aside_.c_str()) == 0;
}

}  // namespace maru::history
