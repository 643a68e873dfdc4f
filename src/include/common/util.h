#pragma once

#include <dirent.h>

#include <string>

/// Small functions on files, paths and strings. None changes its arguments; only ChownMaruSeeker
/// throws.
namespace maruseeker {

/// Whether it is a regular file, and no symbolic link.
bool IsFileExist(const std::string& path);

/// A directory. With `follow_link` a symbolic link counts when the text it holds, taken as a path
/// of its own (a relative one from the current directory), is a directory in the same sense; chains
/// longer than the kernel's own limit do not.
bool IsDirExist(const std::string& path, bool follow_link);

/// Whether a directory entry says of itself that it is a directory. Where the entry does
/// not tell, the answer is no: the file at `path` is not asked.
bool IsDirentDir(const dirent* entry, const std::string& path);

/// Whether the effective user has any of the bits of `mask` (4 read, 2 write, 1 execute) on the
/// path; false when that cannot be told.
bool CheckACLPerm(const std::string& path, int mask);

bool IsMountPoint(const std::string& path);

bool StringStartWith(const std::string& text, const std::string& prefix);

/// What stands after the last "/"; the whole path where there is none.
std::string Basename(const std::string& path);

/// What stands before the last "/": empty for an entry of the root, and the whole path (not ".")
/// when it has none.
std::string Dirname(const std::string& path);

/// What stands after the last "." of the last component, ".profile" giving "profile"; empty when
/// there is none.
std::string GetFileExtension(const std::string& path, bool to_lower);

/// The path without links and dots; nothing when there is no such place.
std::string RealPath(const std::string& path);

/// Removes a file. One that is already gone is no failure.
bool Unlink(const std::string& path);

/// Copies or moves a regular file over `destination`.
bool CPFile(const std::string& source, const std::string& destination);
bool MVFile(const std::string& source, const std::string& destination);

/// Gives the file to the service's own account. False when the system refuses; throws Error 801
/// when there is no such account.
bool ChownMaruSeeker(const std::string& path);

std::string LTrim(const std::string& text);
std::string RTrim(const std::string& text);
std::string Trim(const std::string& text);
std::string ToLower(const std::string& text);

}  // namespace maruseeker
