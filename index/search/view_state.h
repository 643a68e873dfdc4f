#pragma once

#include <xapian.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "index/search/matcher.h"
#include "index/search/plan.h"
#include "index/search/share.h"
#include "index/search/sight.h"
#include "index/search/view.h"
#include "index/store/engine.h"

namespace maru::index {

/// Inside of a View: the sight of each share, complete from the beginning.
class View::State {
 public:
  /// `who`: through whose eyes each share is looked at.
  State(std::vector<std::string> ids, std::vector<std::shared_ptr<Share>> shares,
        std::vector<Identity> who, IsCancelled cancelled);
  ~State();
  State(const State&) = delete;
  State& operator=(const State&) = delete;

  std::size_t Shares() const { return shares_.size(); }
  const std::vector<std::string>& Ids() const { return ids_; }
  std::vector<Sight>& Sights() { return sights_; }
  Sight& At(std::size_t share) { return sights_[share]; }
  /// Throws Cancelled when nobody waits any more.
  void PollCancelled() const;

  /// Calls `use(share, block)` for each block of matches, only those that these eyes see in it,
  /// until it returns false.
  template <class Use>
  void ForEachSeen(const Plan& plan, const Scorer* scorer, Use&& use) {
    const auto block = std::make_unique<MatchBlock>();
    for (std::size_t number = 0; number < sights_.size(); ++number) {
      Matcher matcher(sights_[number], number, plan, scorer);
      while (matcher.Next(*block)) {
        sights_[number].Screen(block->first, block->matches);
        if (!use(number, *block)) return;
      }
    }
  }

  /// Runs `work` on one state of the indices, and again on a newer one when the writer overtook it.
  template <class Work>
  auto OnOneState(const char* doing, Work&& work) -> decltype(work()) {
    return WithEngine(doing, [&] {
      for (int left = kTries; left > 1; --left) {
        try {
          return work();
        } catch (const Xapian::DatabaseModifiedError&) {
          Renew();
        }
      }
      return work();
    });
  }

 private:
  static constexpr int kTries = 5;

  void Open();
  void GiveBack();
  void Renew();

  const std::vector<std::string> ids_;
  const std::vector<std::shared_ptr<Share>> shares_;
  const std::vector<Identity> who_;
  const IsCancelled cancelled_;
  std::vector<Share::Handle> handles_;
  std::vector<Sight> sights_;
};

}  // namespace maru::index
