#pragma once

#include "system/reason_to_end.h"

/// Forks. 0 in the child, its process id in the parent, -1 on failure. With `close_descriptors` not
/// zero the child closes everything above standard error, so that it keeps no client, reply or
/// database connection of its parent alive, and it gives way; the system log is opened anew on its
/// first line. The caller has one thread.
int MLIBCProcForkEx(int close_descriptors);

/// The code of the last platform call of this thread that failed: one of those below.
int MLIBCErrGet();
void MLIBCErrSet(int code);

constexpr int kErrNoSpace = 0x2400;
constexpr int kErrOverQuota = 0x2900;
constexpr int kErrNotFound = 0x0700;
constexpr int kErrBadParameter = 0x0d00;
constexpr int kErrSystem = 0x2a00;
