#include "daemon/socket/listener.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <stdexcept>
#include <system_error>

namespace maru::daemon {
namespace {

constexpr int kBacklog = 512;
constexpr int kWanted = kACLWrite | kACLExecute;

std::system_error Failed(const std::string& doing) {
  return std::system_error(errno, std::generic_category(), doing);
}

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
  if (!made) throw Failed("Cannot make a socket");
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
  if (errno != ECONNREFUSED && errno != ENOENT) throw Failed("Cannot tell who serves " + path);
}

std::string FolderOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

/// By the kernel's rules, which know no service.
bool MayWrite(Identity who, const std::string& folder) {
  who.unrestricted = who.uid == 0;
  FileRights rights;
  if (!ReadFileRights(AT_FDCWD, (folder + "/.").c_str(), rights)) return false;
  return (RightsOf(who, rights) & kWanted) == kWanted;
}

}  // namespace

Listener::Listener(const std::string& path, const Identity& owner) : place_(path) {
  RefuseWhenServed(path);
  const std::string folder = FolderOf(path);
  if (geteuid() != 0 || MayWrite(owner, folder)) {
    Bind(owner);
    return;
  }
  MakeFolder(folder + "/maruelasticd", owner);
  place_ = folder + "/maruelasticd/socket";
  Bind(owner);
  Link(path);
}

/// A folder of the owner's where only root can make one, so nobody else's can be in its place.
void Listener::MakeFolder(const std::string& folder, const Identity& owner) {
  if (mkdir(folder.c_str(), 0755) != 0 && errno != EEXIST) throw Failed("Cannot make " + folder);
  const UniqueFd opened(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!opened || fchown(opened.Get(), owner.uid, static_cast<gid_t>(-1)) != 0 ||
      fchmod(opened.Get(), 0755) != 0) {
    throw Failed("Cannot prepare " + folder);
  }
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
    throw Failed("Cannot listen on " + fresh);
  }
  struct stat status;
  if (lstat(fresh.c_str(), &status) != 0 || rename(fresh.c_str(), place_.c_str()) != 0) {
    throw Failed("Cannot listen on " + place_);
  }
  device_ = status.st_dev;
  inode_ = status.st_ino;
}

void Listener::Link(const std::string& path) {
  const std::string fresh = path + ".new";
  unlink(fresh.c_str());
  if (symlink("maruelasticd/socket", fresh.c_str()) != 0 ||
      rename(fresh.c_str(), path.c_str()) != 0) {
    throw Failed("Cannot link " + path);
  }
}

Listener::~Listener() {
  struct stat status;
  if (socket_ && lstat(place_.c_str(), &status) == 0 && status.st_dev == device_ &&
      status.st_ino == inode_) {
    unlink(place_.c_str());
  }
}

}  // namespace maru::daemon
