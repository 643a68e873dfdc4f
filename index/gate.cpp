#include "index/gate.h"

#include <algorithm>

#include "index/reader.h"

namespace maru::index {
namespace {

/// Documents between two looks at whether somebody still waits.
constexpr unsigned kCallsBetweenLooks = 1024;

}  // namespace

void PlaceSource::init(const Xapian::Database& database) {
  database_ = database;
  documents_ = database.get_doccount();
  last_ = database.get_lastdocid();
  at_ = 0;
  const auto share = shares_->find(database.get_uuid());
  share_ = share == shares_->end() ? shares_->size() : share->second;
  judges_ = rule_->Judges(share_);
  if (judges_) value_ = database_.valuestream_begin(kPlaceSlot);
  set_maxweight(0);
}

bool PlaceSource::AcceptsHere() {
  if (++calls_ % kCallsBetweenLooks == 0 && cancelled_ && cancelled_()) throw Cancelled{};
  if (!judges_) return true;
  if (value_ == database_.valuestream_end(kPlaceSlot)) return false;
  value_.skip_to(at_);
  if (value_ == database_.valuestream_end(kPlaceSlot) || value_.get_docid() != at_) return false;
  return rule_->Accepts(share_, at_, Place::Decode(*value_));
}

void PlaceSource::Rest() {
  while (at_ <= last_ && !AcceptsHere()) ++at_;
}

void PlaceSource::next(double) {
  ++at_;
  Rest();
}

void PlaceSource::skip_to(Xapian::docid document, double) {
  at_ = std::max(at_, document);
  Rest();
}

bool PlaceSource::check(Xapian::docid document, double) {
  at_ = std::max(at_, document);
  return at_ > last_ || AcceptsHere();
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
