#include "platform/linux/bus/QVIntakeBudget.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace {

constexpr std::size_t kBound = 1000;

class QVIntakeBudgetTest : public testing::Test {
 protected:
  void SetUp() override {
    budget_->setWake([this] { ++wakes_; });
  }

  std::shared_ptr<QVIntakeBudget> budget_ = std::make_shared<QVIntakeBudget>(kBound);
  int wakes_ = 0;
};

}  // namespace

TEST_F(QVIntakeBudgetTest, AdmitsEverybodyUpToTheBound) {
  const auto account = budget_->open();
  EXPECT_TRUE(budget_->admits(*account));
  account->add(kBound);
  EXPECT_TRUE(budget_->admits(*account));
  account->add(1);
  EXPECT_FALSE(budget_->admits(*account));
  EXPECT_EQ(budget_->total(), kBound + 1);
  account->remove(kBound + 1);
}

TEST_F(QVIntakeBudgetTest, AdmitsAboveTheBoundWhoHoldsNoMoreThanItsShare) {
  const auto heavy = budget_->open();
  const auto light = budget_->open();
  const auto atShare = budget_->open();
  const auto idle = budget_->open();
  heavy->add(1500);
  light->add(10);
  atShare->add(kBound / 4);
  EXPECT_FALSE(budget_->admits(*heavy));
  EXPECT_TRUE(budget_->admits(*light));
  EXPECT_TRUE(budget_->admits(*atShare));
  EXPECT_TRUE(budget_->admits(*idle));
  atShare->add(1);
  EXPECT_FALSE(budget_->admits(*atShare));
  heavy->remove(1500);
  light->remove(10);
  atShare->remove(kBound / 4 + 1);
}

TEST_F(QVIntakeBudgetTest, WakesOnceWhenTheTotalIsBelowTheBoundAgain) {
  const auto account = budget_->open();
  account->add(1500);
  EXPECT_FALSE(budget_->admits(*account));
  account->remove(100);
  EXPECT_EQ(wakes_, 0);
  account->remove(400);
  EXPECT_EQ(wakes_, 1);
  account->remove(500);
  EXPECT_EQ(wakes_, 1);
  EXPECT_TRUE(budget_->admits(*account));
  account->remove(500);
  EXPECT_EQ(wakes_, 1);
}

TEST_F(QVIntakeBudgetTest, WakesWhoWaitsWhenOthersDrain) {
  const auto heavy = budget_->open();
  const auto other = budget_->open();
  heavy->add(900);
  other->add(900);
  EXPECT_FALSE(budget_->admits(*heavy));
  other->remove(900);
  EXPECT_EQ(wakes_, 1);
  EXPECT_TRUE(budget_->admits(*heavy));
  heavy->remove(900);
}

TEST_F(QVIntakeBudgetTest, WakesWhoIsBackAtItsShareWhileOthersStayHeavy) {
  const auto lingering = budget_->open();
  const auto draining = budget_->open();
  lingering->add(3000);
  draining->add(600);
  EXPECT_FALSE(budget_->admits(*lingering));
  EXPECT_FALSE(budget_->admits(*draining));
  draining->remove(50);
  EXPECT_EQ(wakes_, 0);
  draining->remove(50);
  EXPECT_EQ(wakes_, 1);
  EXPECT_TRUE(budget_->admits(*draining));
  EXPECT_FALSE(budget_->admits(*lingering));
  draining->remove(500);
  EXPECT_EQ(wakes_, 1) << "it does not wait any more";
  lingering->remove(3000);
  EXPECT_EQ(wakes_, 2);
}

TEST_F(QVIntakeBudgetTest, HoldsEveryoneBackWhileClosedConnectionsLeftTooMuchBehind) {
  QVMemoryCharge* leftBehind = nullptr;
  {
    const auto closing = budget_->open();
    leftBehind = closing.get();
    leftBehind->add(QVIntakeBudget::kCeilingFactor * budget_->bound() + 1);
  }
  const auto newcomer = budget_->open();
  EXPECT_FALSE(budget_->admits(*newcomer)) << "though it holds nothing itself";
  leftBehind->remove(1);
  EXPECT_EQ(wakes_, 1);
  EXPECT_TRUE(budget_->admits(*newcomer));
  leftBehind->remove(QVIntakeBudget::kCeilingFactor * budget_->bound());
}

TEST_F(QVIntakeBudgetTest, WakesWhoWaitsWhenOthersClose) {
  const auto lingering = budget_->open();
  auto idle = budget_->open();
  const auto waiting = budget_->open();
  lingering->add(3000);
  waiting->add(400);
  EXPECT_FALSE(budget_->admits(*waiting)) << "a third of the bound is its share";
  idle.reset();
  EXPECT_EQ(wakes_, 1);
  EXPECT_TRUE(budget_->admits(*waiting)) << "now it is half";
  waiting->remove(400);
  lingering->remove(3000);
}

TEST_F(QVIntakeBudgetTest, KeepsAnAccountAsLongAsItIsCharged) {
  auto account = budget_->open();
  QVMemoryCharge* charge = account.get();
  auto payload = std::make_unique<QVDictionary>();
  std::vector<QVDictionaryEntry> entries{{"key", "value"}};
  *payload = QVDictionary::assemble(entries, charge);
  const std::size_t footprint = payload->footprint();
  account.reset();
  const std::weak_ptr<QVIntakeBudget> weak = budget_;
  EXPECT_EQ(budget_->total(), footprint);
  budget_.reset();
  EXPECT_FALSE(weak.expired()) << "the account keeps it";
  payload.reset();
  EXPECT_TRUE(weak.expired()) << "nothing keeps it";
}

TEST_F(QVIntakeBudgetTest, CountsOnlyOpenConnectionsForTheShare) {
  auto first = budget_->open();
  auto second = budget_->open();
  first->add(600);
  second->add(600);
  EXPECT_FALSE(budget_->admits(*first));
  QVMemoryCharge* left = second.get();
  second.reset();
  EXPECT_TRUE(budget_->admits(*first)) << "its share is the whole bound now";
  left->remove(600);
  first->remove(600);
}

TEST_F(QVIntakeBudgetTest, LosesNoWakeBetweenThreads) {
  // One side adds and waits to be admitted, the other removes: were a wake lost, the waiting would
  // end by its deadline and the test fail.
  std::mutex mutex;
  std::condition_variable condition;
  int woken = 0;
  budget_->setWake([&] {
    const std::lock_guard lock(mutex);
    ++woken;
    condition.notify_one();
  });
  auto account = budget_->open();
  std::atomic<int> owed{0};
  std::atomic<bool> finished{false};
  std::thread remover([&] {
    while (!finished.load() || owed.load() != 0) {
      if (owed.load() == 0) {
        std::this_thread::yield();
        continue;
      }
      owed.fetch_sub(1);
      account->remove(300);
    }
  });
  for (int i = 0; i < 20000; ++i) {
    account->add(300);
    owed.fetch_add(1);
    std::unique_lock lock(mutex);
    woken = 0;
    lock.unlock();
    if (budget_->admits(*account)) continue;
    lock.lock();
    ASSERT_TRUE(condition.wait_for(lock, std::chrono::seconds(20), [&] { return woken != 0; }));
  }
  finished.store(true);
  remover.join();
  EXPECT_EQ(budget_->total(), 0U);
}
