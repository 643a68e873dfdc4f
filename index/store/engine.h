#pragma once

#include <xapian.h>

#include <string>

#include "common/error.h"

/// The wall where the engine's exceptions become ours. Only the index's rooms include this.
namespace maru::index {

/// Runs `work`; an exception of the engine leaves as Error (121) with `doing` before its text.
template <class Work>
auto WithEngine(const char* doing, Work&& work) -> decltype(work()) {
  try {
    return work();
  } catch (const Xapian::Error& error) {
    throw maruseeker::Error(maruseeker::kErrorStorage,
                            std::string(doing) + ": " + error.get_type() + ": " + error.get_msg());
  }
}

/// Names of the metadata beside those of the directory table.
inline constexpr const char* kFormatKey = "format";
inline constexpr const char* kRootKey = "root";
inline constexpr const char* kTextsKey = "texts";
inline constexpr const char* kFormat = "6";
/// The database's folder within an index folder.
inline constexpr const char* kDatabaseFolder = "/db";
/// In it: the file that each commit replaces.
inline constexpr const char* kVersionFile = "/iamglass";
/// During a first crawl: the metadata, and the merged database before it takes its place.
inline constexpr const char* kMetadataPart = "/part.0";
inline constexpr const char* kNewDatabaseFolder = "/db.new";

/// A term of a field, as written by the indexer and asked for by queries.
inline std::string TermOf(std::string_view prefix, std::string_view word) {
  std::string term(prefix);
  term += word;
  return term;
}

}  // namespace maru::index
