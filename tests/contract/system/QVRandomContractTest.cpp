#include "platform/fake/QVFakeRandom.h"
#include "platform/linux/system/QVSystemRandom.h"

#include <cstdint>
#include <set>

#include <gmock/gmock.h>

namespace {

template <class Random>
class QVRandomContract : public testing::Test {
 protected:
  Random random_;
};

using Randoms = testing::Types<QVFakeRandom, QVSystemRandom>;
TYPED_TEST_SUITE(QVRandomContract, Randoms);

TYPED_TEST(QVRandomContract, DrawsBelowTheBoundAndReachesAllOfIt) {
  std::set<uint32_t> drawn;
  for (int i = 0; i < 10'000; ++i) drawn.insert(this->random_.uniform(60));
  EXPECT_EQ(drawn.size(), 60U);
  EXPECT_EQ(*drawn.rbegin(), 59U);
}

TYPED_TEST(QVRandomContract, HasNoChoiceBelowOne) {
  for (int i = 0; i < 10; ++i) EXPECT_EQ(this->random_.uniform(1), 0U);
}

TYPED_TEST(QVRandomContract, TakesTheLargestBound) {
  for (int i = 0; i < 10; ++i) EXPECT_LT(this->random_.uniform(UINT32_MAX), UINT32_MAX);
}

}  // namespace
