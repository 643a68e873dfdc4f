#include "indexer/tree/listing.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <time.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>

namespace maru::indexer {
namespace {

constexpr std::size_t kBuffer = 64u << 10;
constexpr std::int64_t kNanoseconds = 1'000'000'000;

constexpr std::array<std::string_view, 6> kLeftOut = {"#recycle",  ".recycle",   "lost+found",
                                                      ".snapshot", ".snapshots", ".zfs"};

std::int64_t Nanoseconds(std::int64_t seconds, std::int64_t nanoseconds) {
  return seconds * kNanoseconds + nanoseconds;
}

/// The clock that stamps files: it stands still between two ticks.
std::int64_t FileClock() {
  timespec now{};
  clock_gettime(CLOCK_REALTIME_COARSE, &now);
  return Nanoseconds(now.tv_sec, now.tv_nsec);
}

index::Stamp StampOf(const struct statx& status) {
  index::Stamp stamp;
  stamp.ctime_ns = Nanoseconds(status.stx_ctime.tv_sec, status.stx_ctime.tv_nsec);
  stamp.mtime_ns = Nanoseconds(status.stx_mtime.tv_sec, status.stx_mtime.tv_nsec);
  stamp.size = status.stx_size;
  stamp.inode = status.stx_ino;
  if (status.stx_mask & STATX_BTIME) {
    stamp.born_ns = Nanoseconds(status.stx_btime.tv_sec, status.stx_btime.tv_nsec);
  }
  return stamp;
}

bool MayBeIndexed(const dirent64& entry) {
  const std::string_view name = entry.d_name;
  if (name == "." || name == "..") return false;
  const bool known = entry.d_type != DT_UNKNOWN;
  return !known || entry.d_type == DT_REG || (entry.d_type == DT_DIR && !LeftOut(name));
}

}  // namespace

std::int64_t Found::ModTime() const {
  const std::int64_t rest = stamp.mtime_ns % kNanoseconds;
  return stamp.mtime_ns / kNanoseconds - (rest < 0 ? 1 : 0);
}

std::optional<Found> Look(int dir_fd, const char* name) {
  struct statx status {};
  constexpr unsigned kWanted =
      STATX_TYPE | STATX_NLINK | STATX_INO | STATX_SIZE | STATX_MTIME | STATX_CTIME | STATX_BTIME;
  constexpr int kFlags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_EMPTY_PATH;
  const std::int64_t now = FileClock();
  if (statx(dir_fd, name, kFlags, kWanted, &status) != 0) return std::nullopt;
  errno = 0;
  const bool is_folder = S_ISDIR(status.stx_mode);
  if (is_folder ? LeftOut(name) : !S_ISREG(status.stx_mode)) return std::nullopt;
  const index::Stamp stamp = StampOf(status);
  const bool mounted = status.stx_attributes & STATX_ATTR_MOUNT_ROOT;
  return Found{.name = name,
               .type = is_folder ? FileType::kFolder : FileType::kFile,
               .is_racy = stamp.ctime_ns >= now,
               .is_elsewhere = !is_folder && (status.stx_nlink > 1 || mounted),
               .stamp = stamp};
}

bool Listing::ReadNames(int dir_fd) {
  if (!buffer_) buffer_ = std::make_unique<char[]>(kBuffer);
  names_.clear();
  if (lseek(dir_fd, 0, SEEK_SET) != 0) return false;
  while (true) {
    const ssize_t got = getdents64(dir_fd, buffer_.get(), kBuffer);
    if (got < 0) return false;
    if (got == 0) return true;
    for (ssize_t at = 0; at < got;) {
      const auto* entry = reinterpret_cast<const dirent64*>(buffer_.get() + at);
      at += entry->d_reclen;
      if (MayBeIndexed(*entry)) names_.append(entry->d_name, std::strlen(entry->d_name) + 1);
    }
  }
}

void Listing::Add(int dir_fd, const char* name) {
  if (const std::optional<Found> found = Look(dir_fd, name)) {
    entries_.push_back(*found);
  } else if (errno != 0 && !HasVanished(errno)) {
    entries_.push_back({.name = name});
  }
}

bool Listing::Read(int dir_fd) {
  entries_.clear();
  if (!ReadNames(dir_fd)) return false;
  for (std::size_t at = 0; at < names_.size(); at = names_.find('\0', at) + 1) {
    Add(dir_fd, &names_[at]);
    if (errno == EACCES) return false;
  }
  std::sort(entries_.begin(), entries_.end(),
            [](const Found& a, const Found& b) { return a.name < b.name; });
  return true;
}

void Listing::LookAt(int dir_fd, const std::vector<std::string>& names) {
  entries_.clear();
  for (const std::string& name : names) Add(dir_fd, name.c_str());
}

bool HasVanished(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP || error == ENXIO || error == ESTALE;
}

bool LeftOut(std::string_view folder_name) {
  return std::find(kLeftOut.begin(), kLeftOut.end(), folder_name) != kLeftOut.end();
}

UniqueFd OpenFolder(int parent_fd, const char* name) {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK;
  return UniqueFd(openat(parent_fd, name, kFlags));
}

UniqueFd OpenTop(const std::string& path) {
  return UniqueFd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

FileId IdOf(int descriptor) {
  struct stat status {};
  return fstat(descriptor, &status) == 0 ? maru::IdOf(status) : FileId{};
}

}  // namespace maru::indexer
