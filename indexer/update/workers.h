#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "index/store/writer.h"
#include "indexer/extract/processes.h"
#include "indexer/tree/tree.h"
#include "system/unique_fd.h"

/// Reading, extracting and preparing on all cores, beside the one thread that writes an index.
namespace maru::indexer {

class Lane;

/// A file on its way into the index.
struct Job {
  FolderHandle folder;
  index::Document document;
  index::Stamp stamp;
  /// Empty: only the name is indexed.
  UniqueFd file;
  /// What it counts towards its lane's bound.
  std::size_t cost = 0;
};

struct Result {
  FolderHandle folder;
  std::string name;
  index::Stamp stamp;
  index::Prepared prepared;
  /// It has text, but that could not be got.
  bool failed = false;
  std::uint64_t bytes_read = 0;
  std::size_t cost = 0;
};

/// The threads; one extractor process each. Shared by all lanes.
class Workers {
 public:
  /// `max_text`: bytes of text that are indexed of a file.
  Workers(extract::Processes& processes, std::size_t max_text);
  /// Lanes are gone by then.
  ~Workers();
  Workers(const Workers&) = delete;
  Workers& operator=(const Workers&) = delete;

  std::size_t MaxText() const { return max_text_; }
  /// The lane gets the result.
  void Submit(Lane& lane, Job job);

 private:
  struct Item {
    Lane* lane;
    Job job;
  };

  void Run(unsigned slot);
  Result Work(unsigned slot, Job job);
  bool TakeText(unsigned slot, Job& job, std::uint64_t& bytes_read);

  extract::Processes& processes_;
  const std::size_t max_text_;
  std::mutex mutex_;
  std::condition_variable work_;
  std::deque<Item> queue_;
  bool closing_ = false;
  std::vector<std::thread> threads_;
};

}  // namespace maru::indexer
