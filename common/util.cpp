#include "common/util.h"

#include <errno.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <memory>

#include "common/common.h"
#include "common/sdk/user.h"
#include "platform/acl.h"
#include "platform/file.h"

namespace maruseeker {
namespace {

/// As many links in a row as the kernel follows.
constexpr int kMaxLinks = 40;

bool IsSpace(unsigned char c) {
  return std::isspace(c) != 0;
}

bool CopyFile(const std::string& source, const std::string& destination, bool remove_source) {
  const MARUCOPYARG options = {true, remove_source};
  return MARUFileCopy(source.c_str(), destination.c_str(), &options, 1) == 0;
}

}  // namespace

bool IsFileExist(const std::string& path) {
  struct stat status;
  return lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

bool IsDirExist(const std::string& path, bool follow_link) {
  std::string place = path;
  for (int links = 0; links <= kMaxLinks; ++links) {
    struct stat status;
    if (lstat(place.c_str(), &status) != 0) return false;
    if (S_ISDIR(status.st_mode)) return true;
    if (!S_ISLNK(status.st_mode) || !follow_link) return false;
    char target[PATH_MAX];
    const ssize_t length = readlink(place.c_str(), target, sizeof(target));
    if (length < 0) return false;
    place.assign(target, static_cast<std::size_t>(length));
  }
  return false;
}

bool IsDirentDir(const dirent* entry, const std::string&) {
  return entry->d_type == DT_DIR;
}

bool CheckACLPerm(const std::string& path, int mask) {
  auto bits = static_cast<unsigned int>(mask);
  return MARUACLPermGet(path.c_str(), &bits) >= 0 && bits != 0;
}

bool IsMountPoint(const std::string& path) {
  return MARUFSDirIsMntPoint(path.c_str()) > 0;
}

bool StringStartWith(const std::string& text, const std::string& prefix) {
  return text.starts_with(prefix);
}

std::string Basename(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

std::string Dirname(const std::string& path) {
  return path.substr(0, path.rfind('/'));
}

std::string GetFileExtension(const std::string& path, bool to_lower) {
  const std::string name = Basename(path);
  const std::size_t dot = name.rfind('.');
  if (dot == std::string::npos) return {};
  const std::string extension = name.substr(dot + 1);
  return to_lower ? ToLower(extension) : extension;
}

std::string RealPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&free)> resolved(realpath(path.c_str(), nullptr), &free);
  return resolved ? resolved.get() : "";
}

bool Unlink(const std::string& path) {
  return unlink(path.c_str()) == 0 || errno == ENOENT;
}

bool CPFile(const std::string& source, const std::string& destination) {
  return CopyFile(source, destination, false);
}

bool MVFile(const std::string& source, const std::string& destination) {
  return CopyFile(source, destination, true);
}

bool ChownMaruSeeker(const std::string& path) {
  const sdk::User service(kServiceAccount);
  return chown(path.c_str(), service.uid, service.gid) == 0;
}

std::string LTrim(const std::string& text) {
  return {std::find_if_not(text.begin(), text.end(), IsSpace), text.end()};
}

std::string RTrim(const std::string& text) {
  return {text.begin(), std::find_if_not(text.rbegin(), text.rend(), IsSpace).base()};
}

std::string Trim(const std::string& text) {
  return LTrim(RTrim(text));
}

std::string ToLower(const std::string& text) {
  std::string result = text;
  std::transform(result.begin(), result.end(), result.begin(),
                 [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
  return result;
}

}  // namespace maruseeker
