#include "system/whole_file.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>

namespace maru {

bool ReadWholeFile(const std::string& path, std::size_t limit, std::string& text, Link link) {
  // Without O_NONBLOCK a planted FIFO would hold the process here.
  const int no_link = link == Link::kRefuse ? O_NOFOLLOW : 0;
  const UniqueFd file(open(path.c_str(), O_RDONLY | no_link | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  return file && ReadToEnd(file, limit, text);
}

bool ReadToEnd(const UniqueFd& file, std::size_t limit, std::string& text) {
  struct stat status;
  if (fstat(file.Get(), &status) != 0) return false;
  if (!S_ISREG(status.st_mode)) {
    errno = EINVAL;
    return false;
  }
  std::string content;
  std::size_t size = 0;
  for (;;) {
    content.resize(
        std::min(limit + 1, std::max(size + 4096, static_cast<std::size_t>(status.st_size) + 1)));
    const ssize_t count = read(file.Get(), content.data() + size, content.size() - size);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    if (count == 0) break;
    size += static_cast<std::size_t>(count);
    if (size > limit) {
      errno = EFBIG;
      return false;
    }
  }
  content.resize(size);
  text = std::move(content);
  return true;
}

bool WriteAll(const UniqueFd& file, std::string_view text) {
  while (!text.empty()) {
    const ssize_t written = write(file.Get(), text.data(), text.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return false;
    text.remove_prefix(static_cast<std::size_t>(written));
  }
  return true;
}

UniqueFd NewFileBeside(const std::string& path, mode_t mode, std::string& temporary) {
  const std::size_t slash = path.rfind('/');
  const std::string folder = slash == std::string::npos ? "" : path.substr(0, slash + 1);
  UniqueFd file;
  do {
    temporary = folder + ".maru." + std::to_string(arc4random());
    // The kernel applies the umask, which only a process of one thread could ask for.
    file = UniqueFd(open(temporary.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, mode));
  } while (!file && errno == EEXIST);
  return file;
}

bool WriteWholeFile(const std::string& path, std::string_view text, mode_t mode, uid_t owner) {
  std::string temporary;
  const UniqueFd file = NewFileBeside(path, mode, temporary);
  if (!file) return false;
  const bool written =
      WriteAll(file, text) &&
      (owner == static_cast<uid_t>(-1) || fchown(file.Get(), owner, static_cast<gid_t>(-1)) == 0) &&
      rename(temporary.c_str(), path.c_str()) == 0;
  if (written) return true;
  const int error = errno;
  unlink(temporary.c_str());
  errno = error;
  return false;
}

}  // namespace maru
