// Keeps the best `limit` of a stream of scored items in amortised constant
// time per item: items are buffered up to 2 * limit, then one partial
// selection keeps the best `limit` and raises the entry threshold to the
// worst of them. Ties are kept in no guaranteed order.
//
// Not thread safe. A limit below 1 ends the process through CHECK.
#ifndef AUDIO_DSP_BATCH_TOP_N_H_
#define AUDIO_DSP_BATCH_TOP_N_H_

#include <algorithm>
#include <utility>
#include <vector>

#include "base/logging.h"

namespace audio_dsp {

template <typename T, typename Score = float>
class BatchTopN {
 public:
  explicit BatchTopN(int limit) : limit_(limit) {
    CHECK(limit >= 1);
    items_.reserve(2 * limit_);
  }

  void Add(Score score, T item) {
    if (has_threshold_ && !(score > threshold_)) return;
    items_.emplace_back(score, std::move(item));
    if (!has_threshold_ && static_cast<int>(items_.size()) == limit_) {
      threshold_ = std::min_element(items_.begin(), items_.end(), ByScore)->first;
      has_threshold_ = true;
    } else if (static_cast<int>(items_.size()) == 2 * limit_) {
      Prune();
    }
  }

  // The best min(added, limit) items, best first.
  std::vector<std::pair<Score, T>> Take() {
    Sort();
    return std::move(items_);
  }
  // The same, left in place: valid until the next Add or Clear, and the
  // storage stays for reuse.
  const std::vector<std::pair<Score, T>>& Sorted() {
    Sort();
    return items_;
  }
  // Forgets every item, keeping the storage.
  void Clear() {
    items_.clear();
    has_threshold_ = false;
  }

 private:
  static bool ByScore(const std::pair<Score, T>& a, const std::pair<Score, T>& b) {
    return a.first < b.first;
  }

  void Sort() {
    std::sort(items_.begin(), items_.end(),
              [](const auto& a, const auto& b) { return a.first > b.first; });
    if (static_cast<int>(items_.size()) > limit_) items_.resize(limit_);
  }
  void Prune() {
    std::nth_element(items_.begin(), items_.begin() + (limit_ - 1), items_.end(),
                     [](const auto& a, const auto& b) { return a.first > b.first; });
    threshold_ = items_[limit_ - 1].first;
    items_.resize(limit_);
  }

  int limit_;
  std::vector<std::pair<Score, T>> items_;
  bool has_threshold_ = false;
  Score threshold_{};
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_BATCH_TOP_N_H_
