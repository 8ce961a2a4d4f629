// Symbol position (a running symbol index) -> one score per symbol value,
// iterated in ascending position.
//
// A sorted vector of entries rather than a tree: receivers fill one per token
// request, and clearing it keeps the entries and their score vectors, so a
// request allocates only while the map grows past its largest size so far.
// Positions mostly arrive in ascending order, which appends.
//
// Not thread safe. Iterators and references are invalidated by any insertion
// or erasure, as for a vector.
#ifndef AUDIO_SORVANE_SYMBOL_SCORE_MAP_H_
#define AUDIO_SORVANE_SYMBOL_SCORE_MAP_H_

#include <algorithm>
#include <cstddef>
#include <utility>
#include <vector>

#include "audio/dsp/eigen_types.h"

namespace audio_sorvane {

class SymbolScoreMap {
 public:
  using value_type = std::pair<int, audio_dsp::FloatVector>;
  using iterator = value_type*;
  using const_iterator = const value_type*;

  iterator begin() { return entries_.data(); }
  iterator end() { return entries_.data() + size_; }
  const_iterator begin() const { return entries_.data(); }
  const_iterator end() const { return entries_.data() + size_; }
  size_t size() const { return size_; }
  bool empty() const { return size_ == 0; }

  // Forgets every entry, keeping their storage.
  void clear() { size_ = 0; }

  iterator find(int position) {
    const iterator it = LowerBound(position);
    return it != end() && it->first == position ? it : end();
  }

  // Adds (position, scores) unless the position is present; returns the
  // entry and whether it was added.
  template <typename Scores>
  std::pair<iterator, bool> try_emplace(int position, const Scores& scores) {
    iterator it = LowerBound(position);
    if (it != end() && it->first == position) return {it, false};
    it = InsertAt(it, position);
    it->second = scores;
    return {it, true};
  }
  template <typename Scores>
  std::pair<iterator, bool> emplace(int position, const Scores& scores) {
    return try_emplace(position, scores);
  }

  // The scores at `position`, added empty when absent.
  audio_dsp::FloatVector& operator[](int position) {
    iterator it = LowerBound(position);
    if (it == end() || it->first != position) {
      it = InsertAt(it, position);
      it->second.resize(0);
    }
    return it->second;
  }

  // Removes the entry at `position`; returns how many were removed (0 or 1).
  size_t erase(int position) {
    const iterator it = find(position);
    if (it == end()) return 0;
    std::rotate(it, it + 1, end());  // the removed entry becomes spare storage
    --size_;
    return 1;
  }

 private:
  iterator LowerBound(int position) {
    return std::lower_bound(begin(), end(), position,
                            [](const value_type& entry, int p) { return entry.first < p; });
  }

  // Moves a spare entry (or a new one) to `it` and gives it `position`.
  iterator InsertAt(iterator it, int position) {
    const size_t index = static_cast<size_t>(it - begin());
    if (size_ == entries_.size()) entries_.emplace_back();
    ++size_;
    std::rotate(begin() + index, end() - 1, end());
    entries_[index].first = position;
    return begin() + index;
  }

  std::vector<value_type> entries_;
  size_t size_ = 0;  // entries_[size_ ...] are spare
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_SYMBOL_SCORE_MAP_H_
