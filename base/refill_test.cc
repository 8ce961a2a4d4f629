#include "base/refill.h"

#include <vector>

#include "gtest/gtest.h"

namespace sorvel_base {
namespace {

// Requests of 3, 1 and 3 entries: the list is cut to each count, and the
// third request gets back the storage of the first (through the spares).
TEST(RefillTest, CutsToCountAndReusesStorage) {
  std::vector<std::vector<int>> list, spares;
  std::vector<const int*> storage;
  {
    Refill<std::vector<int>> refill(&list, &spares);
    for (int i = 0; i < 3; ++i) {
      std::vector<int>& entry = refill.Next();
      entry.assign(100, i);
      storage.push_back(entry.data());
    }
  }
  ASSERT_EQ(list.size(), 3u);
  {
    Refill<std::vector<int>> refill(&list, &spares);
    EXPECT_EQ(refill.Next().data(), storage[0]);  // the old entry, as it was left
  }
  EXPECT_EQ(list.size(), 1u);
  EXPECT_EQ(spares.size(), 2u);
  {
    Refill<std::vector<int>> refill(&list, &spares);
    for (int i = 0; i < 3; ++i) EXPECT_GE(refill.Next().capacity(), 100u) << i;
    EXPECT_EQ(refill.count(), 3u);
  }
  EXPECT_EQ(list.size(), 3u);
  EXPECT_TRUE(spares.empty());
}

}  // namespace
}  // namespace sorvel_base
