#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

/// Small files, read and written whole. For this room.
namespace maru {

/// Reads a regular file of at most `limit` bytes without following a symbolic link in the last
/// component. False with errno (ELOOP: a link, EINVAL: no regular file, EFBIG); `text` is then
/// unchanged.
bool ReadWholeFile(const std::string& path, std::size_t limit, std::string& text);

/// Writes a file so that a reader sees the old text or the new one, never a part. The file gets
/// `mode` less the umask, and `owner` unless that is -1. False with errno; the old file then
/// stands.
bool WriteWholeFile(const std::string& path, std::string_view text, mode_t mode,
                    uid_t owner = static_cast<uid_t>(-1));

}  // namespace maru
