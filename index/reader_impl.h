#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "index/codec.h"
#include "index/compile.h"
#include "index/engine.h"
#include "index/fields.h"
#include "index/fragments.h"
#include "index/library.h"
#include "index/reader.h"

namespace maru::index {

/// A Reader on handles borrowed from a Library.
class EngineReader : public Reader, private Sources {
 public:
  using GiveBack = std::function<void(std::unique_ptr<OpenIndices>)>;

  EngineReader(std::unique_ptr<OpenIndices> indices, GiveBack give_back)
      : indices_(std::move(indices)), give_back_(std::move(give_back)) {}
  ~EngineReader() override;

  void SetEyes(const Identity& who) override;
  SearchResult Search(const Query& query, const SearchOptions& options) override;
  std::vector<std::uint64_t> Count(const Query& query, const std::vector<Query>& filters,
                                   const std::function<bool()>& cancelled) override;
  std::vector<Fragment> Fragments(std::size_t share, DocumentId document, const Query& query,
                                  const FragmentOptions& options) override;
  std::optional<Hit> Find(std::size_t share, DocumentId document) override;
  std::optional<Hit> Find(std::size_t share, std::string_view path) override;
  std::vector<std::string> Complete(const std::string& field, const std::string& prefix,
                                    std::size_t limit) override;
  std::vector<std::string> Correct(const std::string& word, std::size_t limit) override;
  std::uint64_t Documents() const override;

 private:
  /// How often a search begins again because the writer overtook it.
  static constexpr int kTries = 5;

  /// Runs `work` on one state of the indices; begins again on a newer one when the writer overtook
  /// it.
  template <class Work>
  auto OnOneState(const char* doing, Work&& work) -> decltype(work());

  Xapian::Query Under(const std::string& full_path) override;
  Xapian::Query Phrase(const std::vector<std::string>& words) override;

  /// The query as these eyes may ask it.
  Xapian::Query Gated(const Xapian::Query& query);
  Plan Compile(const Query& query, const SearchOptions& options);
  Xapian::Enquire Enquire(const Plan& plan, const SearchOptions& options);
  /// Throws Cancelled when nobody waits any more.
  void LookUp() const;

  /// A result: its id in all databases together.
  struct Weighed {
    std::size_t share;
    DocumentId document;
    double weight;
  };
  /// The best matches, best first, and how many there are in all.
  struct Found {
    std::vector<Weighed> best;
    std::uint64_t total = 0;
  };
  /// Of a plan of terms, by weight.
  Found Best(const Plan& plan, const SearchOptions& options) const;
  /// Of any plan, in the order that the options ask for.
  Found Enquired(const Plan& plan, const SearchOptions& options);
  /// Calls `use(share, block, word of the block, those of its documents that these eyes see)` for
  /// the matches of a plan of terms.
  template <class Use>
  void ForEachSeen(const Plan& plan, const Weighing* weighing, Use&& use) const;
  std::uint64_t CountOf(const Plan& plan) const;
  KindCounts KindsOf(const Plan& plan) const;
  bool Sees(std::size_t share, const Place& place) const;
  bool SomeDocumentSeen(const std::string& term) const;
  Hit HitOf(std::size_t share, DocumentId id, Stored stored) const;
  std::vector<Hit> HitsOf(const std::vector<Weighed>& matches);
  FragmentFinder& FinderOf(const Query& query, const std::string& field);
  PresentWords InDocument(std::size_t share, DocumentId document,
                          const FragmentFinder& finder) const;
  std::optional<Stored> Read(std::size_t share, DocumentId document) const;

  std::unique_ptr<OpenIndices> indices_;
  GiveBack give_back_;
  Identity who_;
  /// One per share; empty until SetEyes. A null: sees everything.
  std::vector<std::shared_ptr<const Eyes>> eyes_;
  bool blind_ = true;
  /// By field, for one query.
  std::map<std::string, FragmentFinder> finders_;
  Query finders_query_;
  StoredText text_;
  /// What the engine has of the hits, whose fragments are asked for next.
  std::map<std::pair<std::size_t, DocumentId>, std::string> found_;
  /// Of the search under way.
  std::function<bool()> cancelled_;
};

template <class Work>
auto EngineReader::OnOneState(const char* doing, Work&& work) -> decltype(work()) {
  return WithEngine(doing, [&] {
    for (int left = kTries; left > 1; --left) {
      try {
        return work();
      } catch (const Xapian::DatabaseModifiedError&) {
        indices_->Refresh();
        if (!blind_) SetEyes(who_);
        finders_.clear();
        found_.clear();
      }
    }
    return work();
  });
}

}  // namespace maru::index
