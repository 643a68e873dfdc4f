#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <optional>
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
  /// Without file and document.
  Job job;
  std::string name;
  index::Prepared prepared;
  /// It has text, but that could not be got.
  bool failed = false;
  std::uint64_t bytes_read = 0;
};

/// The threads; one extractor process each. Shared by all lanes, which are gone before it.
class Workers {
 public:
  /// `max_text`: bytes of text that are indexed of a file.
  Workers(extract::Processes& processes, std::size_t max_text);

  std::size_t MaxText() const { return max_text_; }
  /// The lane gets the result.
  void Submit(Lane& lane, Job job);

 private:
  struct Item {
    Lane* lane;
    Job job;
  };

  void Run(const std::stop_token& closing, unsigned slot);
  Result Work(unsigned slot, Job job);
  bool TakeText(unsigned slot, Job& job, std::uint64_t& bytes_read);

  extract::Processes& processes_;
  const std::size_t max_text_;
  std::mutex mutex_;
  std::condition_variable_any work_;
  std::deque<Item> queue_;
  std::vector<std::jthread> threads_;
};

/// One tree's way to the workers and back. What is under way is bounded, so that no queue grows.
/// One thread, but for Deliver; throws as the tree does.
class Lane {
 public:
  Lane(Workers& workers, Tree& tree) : workers_(workers), tree_(tree) {}
  /// Waits for what is under way and drops it.
  ~Lane();
  Lane(const Lane&) = delete;
  Lane& operator=(const Lane&) = delete;

  /// Waits until there is room. A file must not be submitted again while it is under way.
  void Submit(Job job);
  /// Puts what is finished into the tree.
  void Collect();
  /// The same with all that is under way.
  void Finish();

  /// Hands over a result; any thread.
  void Deliver(Result result);

 private:
  bool HasRoom() const;
  std::optional<Result> Take(bool wait);
  void Put(Result result);

  Workers& workers_;
  Tree& tree_;
  std::size_t under_way_ = 0;
  std::size_t cost_ = 0;
  std::mutex mutex_;
  std::condition_variable finished_;
  std::deque<Result> results_;
};

}  // namespace maru::indexer
