#pragma once

#include <span>

#include "indexer/extract/extractor.h"

/// The bodies of the helper processes. Each runs in a fresh child of a single-threaded parent and
/// ends the process.
namespace maru::extract {

/// Keeps one process a slot: on each slot number (32 bits) that comes over `socket` it ends that
/// slot's process, forks another, and answers with the process's socket. Ends, with all processes,
/// when the other end closes.
[[noreturn]] void RunForker(int socket, unsigned slots, std::span<const Extractor> table);

}  // namespace maru::extract
