#include "client/QVClientCallTable.h"

#include <set>

#include <gtest/gtest.h>

namespace {

// A call that notes its number when it is failed.
QVClientCall noting(std::vector<int>& order, int number) {
  return {QVClientBooleanReply([&order, number](const auto&) { order.push_back(number); })};
}

class QVClientCallTableTest : public testing::Test {
 protected:
  uint32_t insert(int number) {
    table_.prepare();
    return table_.insert(noting(order_, number));
  }
  void finish(uint32_t serial) {
    QVClientCall call;
    ASSERT_TRUE(table_.take(serial, call));
    QVClientFail(call, {});
  }

  std::vector<int> order_;
  QVClientCallTable table_{1000};
};

TEST_F(QVClientCallTableTest, HandsOutEachCallOnce) {
  const uint32_t first = insert(1);
  const uint32_t second = insert(2);
  finish(second);
  finish(first);
  EXPECT_EQ(order_, (std::vector<int>{2, 1}));
  QVClientCall call;
  EXPECT_FALSE(table_.take(first, call));
  EXPECT_EQ(table_.count(), 0U);
}

TEST_F(QVClientCallTableTest, KnowsNoCallOfAnUnusedSerial) {
  QVClientCall call;
  EXPECT_FALSE(table_.take(1, call));
  EXPECT_FALSE(table_.abandon(1));
  const uint32_t serial = insert(1);
  EXPECT_FALSE(table_.take(0, call));
  EXPECT_FALSE(table_.take(serial + 64, call));
  EXPECT_FALSE(table_.take(serial + 1, call));
}

TEST_F(QVClientCallTableTest, SerialsAreNeverGivenTwice) {
  std::set<uint32_t> serials{table_.unansweredSerial()};
  const uint32_t waitsLong = insert(0);
  serials.insert(waitsLong);
  for (int i = 1; i < 500; ++i) {
    const uint32_t serial = insert(i);
    EXPECT_TRUE(serials.insert(serial).second);
    finish(serial);
  }
  finish(waitsLong);
  EXPECT_EQ(order_.back(), 0);
}

TEST_F(QVClientCallTableTest, GrowsUpToItsLimit) {
  std::vector<uint32_t> serials;
  while (!table_.isFull()) serials.push_back(insert(static_cast<int>(serials.size())));
  EXPECT_EQ(serials.size(), 1000U);
  for (const uint32_t serial : serials) finish(serial);
  for (int i = 0; i < 1000; ++i) EXPECT_EQ(order_[static_cast<std::size_t>(i)], i);
}

TEST_F(QVClientCallTableTest, AnAbandonedCallLeavesItsPlaceAndItsAnswerFindsNone) {
  const uint32_t serial = insert(1);
  EXPECT_TRUE(table_.abandon(serial));
  EXPECT_EQ(table_.count(), 0U);
  EXPECT_FALSE(table_.abandon(serial));
  QVClientCall call;
  EXPECT_FALSE(table_.take(serial, call));
  EXPECT_TRUE(order_.empty());
}

TEST_F(QVClientCallTableTest, CallsThatAreAllAbandonedNeverFillIt) {
  for (int i = 0; i < 3000; ++i) EXPECT_TRUE(table_.abandon(insert(i)));
  EXPECT_FALSE(table_.isFull());
}

TEST_F(QVClientCallTableTest, HandsOutAllCallsTheOldestFirst) {
  for (int i = 0; i < 100; ++i) insert(i);
  finish(insert(100));
  for (const QVClientCall& call : table_.takeAll()) QVClientFail(call, {});
  ASSERT_EQ(order_.size(), 101U);
  for (int i = 0; i < 100; ++i) EXPECT_EQ(order_[static_cast<std::size_t>(i) + 1], i);
  EXPECT_EQ(table_.count(), 0U);
  finish(insert(7));
  EXPECT_EQ(order_.back(), 7);
}

}  // namespace
