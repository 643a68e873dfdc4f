#include "index/gate.h"

#include <algorithm>

#include "index/reader.h"

namespace maru::index {
namespace {

/// Documents between two looks at whether somebody still waits.
constexpr unsigned kPlacesBetweenLooks = 1024;
constexpr unsigned kTextsBetweenLooks = 32;

}  // namespace

void ChoiceSource::Begin(const Xapian::Database& database, Xapian::doccount estimate) {
  database_ = database;
  value_begun_ = false;
  documents_ = database.get_doccount();
  estimate_ = estimate;
  last_ = database.get_lastdocid();
  at_ = 0;
  const auto share = shares_->find(database.get_uuid());
  share_ = share == shares_->end() ? shares_->size() : share->second;
  set_maxweight(0);
}

std::string ChoiceSource::ValueOf(Xapian::docid document, Xapian::valueno slot) {
  if (!value_begun_) value_ = database_.valuestream_begin(slot);
  value_begun_ = true;
  if (value_ == database_.valuestream_end(slot)) return {};
  value_.skip_to(document);
  if (value_ == database_.valuestream_end(slot) || value_.get_docid() != document) return {};
  return *value_;
}

bool ChoiceSource::AcceptsHere() {
  if (++calls_ % calls_between_looks_ == 0 && cancelled_ && cancelled_()) throw Cancelled{};
  return Accepts(at_);
}

void ChoiceSource::Rest() {
  while (at_ <= last_ && !AcceptsHere()) ++at_;
}

void ChoiceSource::next(double) {
  ++at_;
  Rest();
}

void ChoiceSource::skip_to(Xapian::docid document, double) {
  at_ = std::max(at_, document);
  Rest();
}

bool ChoiceSource::check(Xapian::docid document, double) {
  at_ = std::max(at_, document);
  return at_ > last_ || AcceptsHere();
}

PlaceSource::PlaceSource(std::shared_ptr<const PlaceRule> rule,
                         std::shared_ptr<const ShareNumbers> shares,
                         std::function<bool()> cancelled)
    : ChoiceSource(std::move(shares), std::move(cancelled), kPlacesBetweenLooks),
      rule_(std::move(rule)) {
  place_ = [this] { return Place::Decode(ValueOf(document_, kPlaceSlot)); };
}

void PlaceSource::init(const Xapian::Database& database) {
  const Xapian::doccount documents = database.get_doccount();
  // Before any look into a text.
  Begin(database, documents > 0 ? documents - 1 : 0);
  judges_ = rule_->Judges(share_);
}

bool PlaceSource::Accepts(Xapian::docid document) {
  if (!judges_) return true;
  document_ = document;
  return rule_->Accepts(share_, document, place_);
}

PhraseSource::PhraseSource(std::vector<std::string> words, Texts texts,
                           std::shared_ptr<const ShareNumbers> shares,
                           std::function<bool()> cancelled)
    : ChoiceSource(std::move(shares), std::move(cancelled), kTextsBetweenLooks),
      words_(std::move(words)),
      texts_(std::move(texts)),
      finder_(words_) {}

void PhraseSource::init(const Xapian::Database& database) {
  Begin(database, database.get_doccount());
}

bool PhraseSource::Accepts(Xapian::docid document) {
  if (share_ >= texts_.size()) return false;
  const std::string place = ValueOf(document, kTextSlot);
  return !place.empty() && text_.Open(*texts_[share_], TextPlace::Decode(place)) &&
         finder_.IsIn(text_);
}

void BoostSource::init(const Xapian::Database& database) {
  const auto share = shares_->find(database.get_uuid());
  here_.clear();
  at_ = 0;
  started_ = false;
  double most = 0;
  for (const auto& [place, boost] : *boosts_) {
    if (share == shares_->end() || place.first != share->second || boost <= 0) continue;
    here_.emplace_back(place.second, boost);
    most = std::max(most, boost);
  }
  set_maxweight(most);
}

void BoostSource::next(double) {
  if (started_) ++at_;
  started_ = true;
}

void BoostSource::skip_to(Xapian::docid document, double) {
  started_ = true;
  while (at_ < here_.size() && here_[at_].first < document) ++at_;
}

}  // namespace maru::index
