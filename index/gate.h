#pragma once

#include <xapian.h>

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "index/directories.h"
#include "index/matcher.h"
#include "index/texts.h"

/// What the matcher asks about single documents: may these eyes see it, does it lie in that folder,
/// was it opened before. Consulted in the order of document ids, one share at a time.
namespace maru::index {

/// Judges documents by their place. Shared by the copies the matcher makes; immutable while
/// matching.
class PlaceRule {
 public:
  virtual ~PlaceRule() = default;
  /// False: Accepts is the same for every document and need not be asked.
  virtual bool Judges(std::size_t share) const = 0;
  /// `place` tells where the document lies: asked for when it must be.
  using PlaceOf = std::function<Place()>;
  virtual bool Accepts(std::size_t share, DocumentId document, const PlaceOf& place) const = 0;
};

/// Share numbers by the engine's name of each database.
using ShareNumbers = std::map<std::string, std::size_t>;

/// A weightless source of all documents that it accepts; also where a search finds out that nobody
/// waits for it any more (throws Cancelled).
class ChoiceSource : public Xapian::PostingSource {
 public:
  Xapian::doccount get_termfreq_min() const override { return 0; }
  Xapian::doccount get_termfreq_est() const override { return estimate_; }
  Xapian::doccount get_termfreq_max() const override { return documents_; }
  void next(double min_weight) override;
  void skip_to(Xapian::docid document, double min_weight) override;
  bool check(Xapian::docid document, double min_weight) override;
  bool at_end() const override { return at_ > last_; }
  Xapian::docid get_docid() const override { return at_; }

 protected:
  ChoiceSource(std::shared_ptr<const ShareNumbers> shares, std::function<bool()> cancelled,
               unsigned calls_between_looks)
      : shares_(std::move(shares)),
        cancelled_(std::move(cancelled)),
        calls_between_looks_(calls_between_looks) {}

  /// Called with documents in ascending order.
  virtual bool Accepts(Xapian::docid document) = 0;
  /// Begins with a database. The matcher asks the source with the least `estimate` first.
  void Begin(const Xapian::Database& database, Xapian::doccount estimate);
  /// The value of a document in a slot: at `value`, which moves there; empty when it has none.
  std::string ValueOf(Xapian::docid document, Xapian::valueno slot);

  std::shared_ptr<const ShareNumbers> shares_;
  std::function<bool()> cancelled_;
  /// Of the database; the number of shares when it is unknown.
  std::size_t share_ = 0;

 private:
  bool AcceptsHere();
  void Rest();

  unsigned calls_between_looks_;
  unsigned calls_ = 0;
  Xapian::Database database_;
  Xapian::ValueIterator value_;
  bool value_begun_ = false;
  Xapian::docid at_ = 0;
  Xapian::docid last_ = 0;
  Xapian::doccount documents_ = 0;
  Xapian::doccount estimate_ = 0;
};

/// What a rule accepts.
class PlaceSource : public ChoiceSource {
 public:
  PlaceSource(std::shared_ptr<const PlaceRule> rule, std::shared_ptr<const ShareNumbers> shares,
              std::function<bool()> cancelled);
  PlaceSource* clone() const override { return new PlaceSource(rule_, shares_, cancelled_); }
  void init(const Xapian::Database& database) override;

 private:
  bool Accepts(Xapian::docid document) override;

  std::shared_ptr<const PlaceRule> rule_;
  bool judges_ = true;
  Xapian::docid document_ = 0;
  /// Of `document_`.
  PlaceRule::PlaceOf place_;
};

/// Documents with a phrase in their stored text; to be asked about those that have its words.
class PhraseSource : public ChoiceSource {
 public:
  /// The stored texts of each share.
  using Texts = std::vector<TextReader*>;

  PhraseSource(std::vector<std::string> words, Texts texts,
               std::shared_ptr<const ShareNumbers> shares, std::function<bool()> cancelled);
  PhraseSource* clone() const override {
    return new PhraseSource(words_, texts_, shares_, cancelled_);
  }
  void init(const Xapian::Database& database) override;

 private:
  bool Accepts(Xapian::docid document) override;

  std::vector<std::string> words_;
  Texts texts_;
  PhraseFinder finder_;
  StoredText text_;
};

/// Adds to the weight of single documents.
class BoostSource : public Xapian::PostingSource {
 public:
  using Boosts = std::map<std::pair<std::size_t, DocumentId>, double>;
  BoostSource(std::shared_ptr<const Boosts> boosts, std::shared_ptr<const ShareNumbers> shares)
      : boosts_(std::move(boosts)), shares_(std::move(shares)) {}

  Xapian::doccount get_termfreq_min() const override { return 0; }
  Xapian::doccount get_termfreq_est() const override { return here_.size(); }
  Xapian::doccount get_termfreq_max() const override { return here_.size(); }
  double get_weight() const override { return here_[at_].second; }
  void next(double min_weight) override;
  void skip_to(Xapian::docid document, double min_weight) override;
  bool at_end() const override { return at_ >= here_.size(); }
  Xapian::docid get_docid() const override { return here_[at_].first; }
  BoostSource* clone() const override { return new BoostSource(boosts_, shares_); }
  void init(const Xapian::Database& database) override;

 private:
  std::shared_ptr<const Boosts> boosts_;
  std::shared_ptr<const ShareNumbers> shares_;
  std::vector<std::pair<Xapian::docid, double>> here_;
  std::size_t at_ = 0;
  bool started_ = false;
};

}  // namespace maru::index
