#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "index/search/eyes.h"
#include "index/search/reader.h"

namespace maru::index {

/// Documents, and words in all of them.
struct Collection {
  std::uint64_t documents = 0;
  std::uint64_t words = 0;
};

/// One share at one commit as one identity sees it: a reader, through eyes. What is counted here is
/// counted among the documents that they see, so that no count, and no score made of counts, tells
/// of others. One thread.
class Sight {
 public:
  /// Without eyes everything is seen. `poll` is called now and then on long ways and may throw.
  Sight(Reader reader, std::shared_ptr<const Eyes> eyes, std::function<void()> poll)
      : reader_(std::move(reader)), eyes_(std::move(eyes)), poll_(std::move(poll)) {}

  Reader& Source() { return reader_; }
  const Reader& Source() const { return reader_; }
  const Snapshot& State() const { return reader_.State(); }
  void Poll() const { poll_(); }
  const std::function<void()>& Poller() const { return poll_; }

  bool Sees(const Place& place) const { return !eyes_ || eyes_->Sees(place); }
  /// Takes what is not seen out of the documents of the block from `first` on.
  void Screen(DocumentId first, BlockSet& documents) {
    if (eyes_ && !SeesAll()) eyes_->Screen(reader_, first, documents);
  }

  /// All that is seen.
  const Collection& Seen();
  /// How many of it have a term, or one that begins with `term` when that is a prefix.
  std::uint64_t FrequencyOf(const std::string& term, bool is_prefix);
  /// The documents seen that have a term beginning with `prefix`, when they are `most` or fewer.
  std::optional<std::vector<DocumentId>> FewBeginning(const std::string& prefix, std::size_t most);
  /// The documents that have one of the terms beginning with `prefix`, and how often they have one.
  std::shared_ptr<const Postings> Beginning(const std::string& prefix) {
    return reader_.Beginning(prefix, poll_);
  }

 private:
  bool SeesAll() { return Seen().documents == State().Documents(); }
  Collection SeenIn(DocumentId first);
  std::uint64_t CountFew(const std::string& term);
  std::uint64_t CountKept(const std::string& name, const Postings& postings);

  Reader reader_;
  std::shared_ptr<const Eyes> eyes_;
  std::function<void()> poll_;
  Collection seen_;
  bool counted_ = false;
};

}  // namespace maru::index
