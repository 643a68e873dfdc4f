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
#include "indexer/counts.h"
#include "indexer/extract/processes.h"
#include "system/unique_fd.h"

/// Reading, extracting and preparing on all cores, beside the one thread that writes an index.
namespace maru::indexer {

struct Folder;

/// A file on its way into the index.
struct Job {
  Folder* folder = nullptr;
  index::Document document;
  index::Stamp stamp;
  /// Empty: only the name is indexed.
  UniqueFd file;
};

struct Result {
  Folder* folder = nullptr;
  std::string name;
  index::Stamp stamp;
  index::Prepared prepared;
  /// It has text, but that could not be got.
  bool failed = false;
  std::uint64_t bytes_read = 0;
  /// What the job counted towards its lane's bound.
  std::size_t cost = 0;
};

class Lane;

/// The threads; one extractor process each. Shared by all lanes.
class Workers {
 public:
  Workers(extract::Processes& processes, std::size_t max_text);
  /// Lanes are gone by then.
  ~Workers();
  Workers(const Workers&) = delete;
  Workers& operator=(const Workers&) = delete;

 private:
  friend class Lane;
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

/// One writer's way to the workers and back. What is under way is bounded, so that no queue grows:
/// submit only while there is room, else take results first. One thread.
class Lane {
 public:
  explicit Lane(Workers& workers) : workers_(workers) {}
  /// Waits for what is under way and drops it.
  ~Lane();
  Lane(const Lane&) = delete;
  Lane& operator=(const Lane&) = delete;

  /// Whether one more job fits.
  bool HasRoom() const;
  void Submit(Job job);
  /// A finished one, in no order; with `wait` it waits for one while any is under way.
  std::optional<Result> Take(bool wait);

 private:
  friend class Workers;
  std::size_t Cost(const Job& job) const;
  void Finish(Result result);

  Workers& workers_;
  std::size_t under_way_ = 0;
  std::size_t cost_ = 0;
  std::mutex mutex_;
  std::condition_variable finished_;
  std::deque<Result> results_;
};

}  // namespace maru::indexer
