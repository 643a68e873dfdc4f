#pragma once

/// Positive when the path is the root of a mount (bind mounts included), 0 when not, -1 with errno.
/// A symbolic link in the last component is not followed.
int MARUFSDirIsMntPoint(const char* path);

/// Options of MARUFileCopy.
struct MARUCOPYARG {
  /// Replace an existing regular file.
  bool fOverwrite;
  /// Remove the source afterwards (move): by rename where both lie on one file system.
  bool fRemoveSource;
};

/// Copies a regular file with its mode, owner (where allowed), times and extended attributes; the
/// destination appears whole or not at all. 0, or -1 with errno. `flags` is 1.
int MARUFileCopy(const char* source, const char* destination, const MARUCOPYARG* options,
                 int flags);
