#pragma once

/// What the host gives up before it meets a request. Each function throws
/// std::system_error when the kernel refuses; the process must then not go on.
namespace maru::server {

/// The host's own view of the file system: what is mounted on the machine and by the supervisor
/// still appears in it, with a /proc of its PID namespace (where the
/// machine permits one) and an empty /tmp that nobody else sees.
void MakePrivateMounts();

/// Removes files in /tmp that nobody has written for a day: the notes of queries that were killed.
/// Only after MakePrivateMounts.
void SweepPrivateTmp();

/// Root without any power but to become users, read their files, end their processes and give files
/// away; also for everything this process will ever start.
void KeepHostCapabilities();

}  // namespace maru::server
