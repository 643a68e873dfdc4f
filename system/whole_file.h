#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "system/unique_fd.h"

/// Small files, read and written whole.
namespace maru {

/// Whether a symbolic link in the last component is followed: only where no user can plant one.
enum class Link { kRefuse, kFollow };

/// Reads a regular file of at most `limit` bytes. False with errno (ELOOP: a link, EINVAL: no
/// regular file, EFBIG); `text` is then unchanged.
bool ReadWholeFile(const std::string& path, std::size_t limit, std::string& text,
                   Link link = Link::kRefuse);

/// The same of an open file, from where it stands.
bool ReadToEnd(const UniqueFd& file, std::size_t limit, std::string& text);

/// False with errno; a part may then be written.
bool WriteAll(const UniqueFd& file, std::string_view text);

/// A new empty file of `mode` less the umask in the folder of `path`, under a short name of its
/// own, to be renamed to it; `temporary` is its path. False with errno.
UniqueFd NewFileBeside(const std::string& path, mode_t mode, std::string& temporary);

/// Writes a file so that a reader sees the old text or the new one, never a part. The file gets
/// `mode` less the umask, and `owner` unless that is -1. False with errno; the old file then
/// stands.
bool WriteWholeFile(const std::string& path, std::string_view text, mode_t mode,
                    uid_t owner = static_cast<uid_t>(-1));

}  // namespace maru
