#pragma once

#include "platform/string_list.h"
#include "system/rights.h"

/// File rights by the kernel's rules: owner, group, mode, POSIX access ACL with its mask, and every
/// directory on the way.

/// Which of the permission bits in `*bits` (4 read, 2 write, 1 execute) the current effective user
/// has on the path, as the kernel judges now. In a share also as Samba judges: with the rights of
/// whom its settings put in the user's place, and with none outside of what it serves the user. 0
/// with `*bits` set to those, or -1 with errno (no such path, or not reachable).
int MARUACLPermGet(const char* path, unsigned int* bits);

/// Permission bits of any user, computed from owners, modes and ACLs of the path and, for the way
/// there, of every directory from "/" down; no right on the way means no bits. They are of whom the
/// share's settings put in the user's place, and none outside of what it serves the user; whether
/// it admits the user is not asked. `groups` is that user's list of MLIBGroupInfoListGet. Members
/// of the administrators' group have all bits. 0, or -1 with errno when the path cannot be
/// examined; a path that the *calling* identity cannot reach gives 0 bits.
int MARUACLPermCalc(const char* user_name, const MLIBCSzList* groups, const char* path, int* bits);
