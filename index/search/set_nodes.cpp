#include <algorithm>

#include "index/search/node.h"

namespace maru::index {
namespace {

constexpr std::size_t kPartsBetweenPolls = 64;

class OrNode : public Node {
 public:
  OrNode(std::vector<NodePtr> parts, std::vector<NodePtr> mixed)
      : parts_(std::move(parts)), mixed_(std::move(mixed)) {
    if (!mixed_.empty()) own_ = std::make_unique<MatchBlock>();
  }

  DocumentId Bound() const override {
    DocumentId bound = kNoDocument;
    for (const auto* list : {&parts_, &mixed_}) {
      for (const NodePtr& part : *list) bound = std::min(bound, part->Bound());
    }
    return bound;
  }
  std::uint64_t Most() const override {
    std::uint64_t most = 0;
    for (const auto* list : {&parts_, &mixed_}) {
      for (const NodePtr& part : *list) most += part->Most();
    }
    return most;
  }
  void Add(const Target& target, const CountedSet* within, BlockSet& set) override {
    for (std::size_t i = 0; i < parts_.size(); ++i) {
      if (i % kPartsBetweenPolls == kPartsBetweenPolls - 1) target.poll();
      parts_[i]->Add(target, within, set);
    }
    // Weights of documents that such a part does not match must not count: it gets a block of its
    // own, from which those of its matches are taken.
    for (const NodePtr& part : mixed_) {
      own_->Begin(target.block.first);
      part->Add({*own_, target.scorer, target.lengths, target.against, target.poll}, within,
                own_->matches);
      ForEachBit(own_->matches, [&](DocumentId offset) {
        SetBit(set, offset);
        target.block.weights[offset] += own_->weights[offset];
      });
    }
  }

 private:
  std::vector<NodePtr> parts_, mixed_;
  std::unique_ptr<MatchBlock> own_;
};

class AndNode : public Node {
 public:
  /// The rarest first, so that the others are asked about little.
  explicit AndNode(std::vector<NodePtr> parts) : parts_(std::move(parts)) {
    std::stable_sort(parts_.begin(), parts_.end(),
                     [](const NodePtr& a, const NodePtr& b) { return a->Most() < b->Most(); });
  }

  DocumentId Bound() const override {
    DocumentId bound = 0;
    for (const NodePtr& part : parts_) bound = std::max(bound, part->Bound());
    return bound;
  }
  std::uint64_t Most() const override { return parts_.front()->Most(); }
  void Add(const Target& target, const CountedSet* within, BlockSet& set) override {
    CountedSet so_far;
    BlockSet next;
    for (const NodePtr& part : parts_) {
      next.fill(0);
      part->Add(target, within, next);
      so_far.set = next;
      so_far.Count();
      within = &so_far;
      if (so_far.count == 0) return;
    }
    for (std::size_t word = 0; word < kBlockWords; ++word) set[word] |= so_far.set[word];
  }

 private:
  std::vector<NodePtr> parts_;
};

class AndNotNode : public Node {
 public:
  AndNotNode(NodePtr wanted, NodePtr unwanted)
      : wanted_(std::move(wanted)), unwanted_(std::move(unwanted)) {}

  DocumentId Bound() const override { return wanted_->Bound(); }
  std::uint64_t Most() const override { return wanted_->Most(); }
  void Add(const Target& target, const CountedSet* within, BlockSet& set) override {
    CountedSet wanted;
    BlockSet unwanted{};
    wanted_->Add(target, within, wanted.set);
    wanted.Count();
    unwanted_->Add(target, &wanted, unwanted);
    for (std::size_t word = 0; word < kBlockWords; ++word) {
      set[word] |= wanted.set[word] & ~unwanted[word];
    }
  }

 private:
  NodePtr wanted_, unwanted_;
};

}  // namespace

NodePtr MakeOr(std::vector<NodePtr> parts, std::vector<NodePtr> mixed) {
  return std::make_unique<OrNode>(std::move(parts), std::move(mixed));
}

NodePtr MakeAnd(std::vector<NodePtr> parts) {
  return std::make_unique<AndNode>(std::move(parts));
}

NodePtr MakeAndNot(NodePtr wanted, NodePtr unwanted) {
  return std::make_unique<AndNotNode>(std::move(wanted), std::move(unwanted));
}

}  // namespace maru::index
