#pragma once

#include <xapian.h>

#include <condition_variable>
#include <deque>
#include <exception>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "index/store/document.h"

namespace maru::index {

/// Builds a fresh index on several threads: each fills small databases ("parts") of bounded size,
/// which never have to be merged into what is already large; Merge puts all of them together once,
/// in order. Handed documents by one thread. Engine errors of the builders leave from Add and
/// Merge.
class BulkBuilder {
 public:
  /// Parts are made in `folder`, as part.1, part.2, …
  explicit BulkBuilder(std::string folder);
  /// Gives up: parts not merged are of no use any more.
  ~BulkBuilder();
  BulkBuilder(const BulkBuilder&) = delete;
  BulkBuilder& operator=(const BulkBuilder&) = delete;

  /// Gives the document an id and hands it on; waits while the builders are behind.
  DocumentId Add(Xapian::Document document, std::size_t size);

  std::uint32_t Documents() const { return documents_; }

  /// Finishes all parts and writes one database of `metadata` (a finished database without
  /// documents) and all parts to `target`.
  void Merge(const std::string& metadata, const std::string& target);

 private:
  struct Item {
    DocumentId id = 0;
    Xapian::Document document;
    std::size_t size = 0;
    /// Not empty: a new part begins here, in this folder.
    std::string part;
  };
  /// One builder's thread and what waits for it.
  struct Lane {
    std::deque<Item> items;
    std::size_t waiting = 0;
    std::size_t part_size = 0;
    DocumentId next = 0;
    DocumentId end = 0;
    std::thread thread;
  };

  void Build(Lane& lane);
  std::optional<Item> Take(Lane& lane);
  void BeginPart(Lane& lane);
  void Stop();
  void RethrowFailure();
  Lane& LeastBusy();

  const std::string folder_;
  std::vector<std::unique_ptr<Lane>> lanes_;
  std::vector<std::string> parts_;
  DocumentId next_block_ = 1;
  std::uint32_t documents_ = 0;
  std::mutex mutex_;
  std::condition_variable changed_;
  bool stopping_ = false;
  std::exception_ptr failure_;
};

}  // namespace maru::index
