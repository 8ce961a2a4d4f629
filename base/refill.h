// Refills a list of results whose entries own storage (byte or symbol
// vectors), so that steady requests allocate nothing. Next() hands out the
// entries in order: those the list already holds, then spares, then new
// ones. When the Refill goes out of scope, by any way out, the list is cut
// to the entries handed out and the rest are kept as spares.
#ifndef BASE_REFILL_H_
#define BASE_REFILL_H_

#include <cstddef>
#include <utility>
#include <vector>

namespace sorvel_base {

template <typename T>
class Refill {
 public:
  Refill(std::vector<T>* list, std::vector<T>* spares) : list_(list), spares_(spares) {}
  Refill(const Refill&) = delete;
  Refill& operator=(const Refill&) = delete;
  ~Refill() {
    while (list_->size() > count_) {
      spares_->push_back(std::move(list_->back()));
      list_->pop_back();
    }
  }

  // The next entry, holding whatever an earlier request left in it.
  T& Next() {
    if (count_ == list_->size()) {
      if (spares_->empty()) {
        list_->emplace_back();
      } else {
        list_->push_back(std::move(spares_->back()));
        spares_->pop_back();
      }
    }
    return (*list_)[count_++];
  }
  size_t count() const { return count_; }

 private:
  std::vector<T>* list_;
  std::vector<T>* spares_;
  size_t count_ = 0;
};

}  // namespace sorvel_base

#endif  // BASE_REFILL_H_
