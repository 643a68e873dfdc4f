#include "daemon/socket/listener.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <stdexcept>

#include "system/throw_errno.h"

namespace maru::daemon {
namespace {

constexpr int kBacklog = 512;
constexpr int kWanted = kACLWrite | kACLExecute;

sockaddr_un AddressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.empty() || path.size() >= sizeof address.sun_path) {
    throw std::runtime_error("The socket's path is too long: " + path);
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  return address;
}

UniqueFd NewSocket() {
  UniqueFd made(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  if (!made) ThrowErrno("Cannot make a socket");
  return made;
}

void RefuseWhenServed(const std::string& path) {
  struct stat status;
  if (lstat(path.c_str(), &status) != 0) return;
  if (!S_ISSOCK(status.st_mode) && !S_ISLNK(status.st_mode)) {
    throw std::runtime_error(path + " is in the way and no socket");
  }
  const sockaddr_un address = AddressOf(path);
  const UniqueFd probe = NewSocket();
  if (connect(probe.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ||
      errno == EAGAIN) {
    throw std::runtime_error("Another daemon serves " + path);
  }
  if (errno != ECONNREFUSED && errno != ENOENT) ThrowErrno("Cannot tell who serves " + path);
}

/// By the kernel's rules, which know no service.
bool MayWrite(Identity who, const std::filesystem::path& folder) {
  who.unrestricted = who.uid == 0;
  FileRights rights;
  return ReadFileRights(AT_FDCWD, (folder / ".").c_str(), rights) &&
         (RightsOf(who, rights) & kWanted) == kWanted;
}

/// A folder of the owner's where only root can make one, so nobody else's can be in its place.
void MakeFolder(const std::string& folder, const Identity& owner) {
  if (mkdir(folder.c_str(), 0755) != 0 && errno != EEXIST) ThrowErrno("Cannot make " + folder);
  const UniqueFd opened(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!opened || fchown(opened.Get(), owner.uid, static_cast<gid_t>(-1)) != 0 ||
      fchmod(opened.Get(), 0755) != 0) {
    ThrowErrno("Cannot prepare " + folder);
  }
}

void Link(const std::string& path) {
  const std::string fresh = path + ".new";
  unlink(fresh.c_str());
  if (symlink("maruelasticd/socket", fresh.c_str()) != 0 ||
      rename(fresh.c_str(), path.c_str()) != 0) {
    ThrowErrno("Cannot link " + path);
  }
}

}  // namespace

Listener::Listener(const std::string& path, const Identity& owner) : place_(path) {
  RefuseWhenServed(path);
  const std::filesystem::path folder = std::filesystem::path(path).parent_path();
  const bool apart = geteuid() == 0 && !MayWrite(owner, folder);
  if (apart) {
    MakeFolder(folder / "maruelasticd", owner);
    place_ = folder / "maruelasticd/socket";
  }
  Bind(owner);
  if (apart) Link(path);
}

void Listener::Bind(const Identity& owner) {
  const std::string fresh = place_ + ".new";
  const sockaddr_un address = AddressOf(fresh);
  socket_ = NewSocket();
  unlink(fresh.c_str());
  if (bind(socket_.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      chmod(fresh.c_str(), 0666) != 0 ||
      (geteuid() == 0 && lchown(fresh.c_str(), owner.uid, static_cast<gid_t>(-1)) != 0) ||
      listen(socket_.Get(), kBacklog) != 0) {
    ThrowErrno("Cannot listen on " + fresh);
  }
  struct stat status;
  if (lstat(fresh.c_str(), &status) != 0 || rename(fresh.c_str(), place_.c_str()) != 0) {
    ThrowErrno("Cannot listen on " + place_);
  }
  device_ = status.st_dev;
  inode_ = status.st_ino;
}

Listener::~Listener() {
  struct stat status;
  if (socket_ && lstat(place_.c_str(), &status) == 0 && status.st_dev == device_ &&
      status.st_ino == inode_) {
    unlink(place_.c_str());
  }
}

}  // namespace maru::daemon
