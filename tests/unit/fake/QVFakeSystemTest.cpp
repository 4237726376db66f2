#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeMemoryCharge.h"
#include "platform/fake/QVFakeProcess.h"
#include "platform/fake/QVFakeRandom.h"
#include "platform/fake/QVFakeTracePoints.h"

#include <chrono>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

TEST(QVFakeClockTest, MovesBothTimesAndSetsTheDateApart) {
  QVFakeClock clock;
  EXPECT_EQ(clock.currentDate(), QVFakeClock::kStart);
  clock.advance(1500ms);
  EXPECT_EQ(clock.currentDate(), QVFakeClock::kStart + 1500ms);
  EXPECT_EQ(clock.steadyTime(), 1500ms);
  clock.setCurrentDate(QVFakeClock::kStart - 1h);
  EXPECT_EQ(clock.steadyTime(), 1500ms);
  clock.advanceTo(2s);
  EXPECT_EQ(clock.currentDate(), QVFakeClock::kStart - 1h + 500ms);
  clock.advanceTo(1s);
  EXPECT_EQ(clock.steadyTime(), 2s) << "steady time never goes back";
}

TEST(QVFakeTracePointsTest, KeepsMarksInOrder) {
  QVFakeTracePoints points;
  points.mark(0x21042814);
  points.trace(7, 1, 2, 3, 4);
  EXPECT_THAT(points.codes(), ElementsAre(0x21042814, 7));
  EXPECT_EQ(points.marks()[1], (QVFakeTracePoints::Mark{7, {1, 2, 3, 4}}));
  points.clear();
  EXPECT_TRUE(points.marks().empty());
}

TEST(QVFakeProcessTest, AnswersFromItsTableAndNotesExits) {
  QVFakeProcess process;
  EXPECT_EQ(process.nameOfProcess(process.ownProcessIdentifier()), "quietvoxd");
  EXPECT_EQ(process.nameOfProcess(42), std::nullopt);
  process.addProcess(42, "player");
  EXPECT_EQ(process.nameOfProcess(42), "player");
  EXPECT_EQ(process.lookUpCount(), 3);
  process.setOwnProcess(5, "me");
  EXPECT_EQ(process.ownProcessIdentifier(), 5);
  EXPECT_EQ(process.ownProcessName(), "me");
  process.exitImmediately(2);
  EXPECT_THAT(process.exitStatuses(), ElementsAre(2));
}

TEST(QVFakeRandomTest, DrawsTheScriptThenCounts) {
  QVFakeRandom random;
  random.script({58, 0});
  EXPECT_EQ(random.uniform(59), 58U);
  EXPECT_EQ(random.uniform(59), 0U);
  EXPECT_EQ(random.uniform(2), 0U);
  EXPECT_EQ(random.uniform(2), 1U);
  EXPECT_EQ(random.uniform(2), 0U);
  EXPECT_THAT(random.bounds(), ElementsAre(59, 59, 2, 2, 2));
}

TEST(QVFakeRandomDeathTest, RefusesAScriptBeyondTheBound) {
  QVFakeRandom random;
  random.script({59});
  EXPECT_DEATH(random.uniform(59), "scripted 59 is not below the bound 59");
}

TEST(QVFakeMemoryChargeTest, AddsUpWhatIsHeld) {
  QVFakeMemoryCharge charge;
  charge.add(5);
  charge.add(2);
  charge.remove(5);
  EXPECT_EQ(charge.held(), 2U);
  charge.remove(2);
  EXPECT_EQ(charge.held(), 0U);
}

TEST(QVFakeMemoryChargeDeathTest, RefusesToRemoveMoreOrLessThanWasAdded) {
  EXPECT_DEATH(
      {
        QVFakeMemoryCharge charge;
        charge.add(5);
        charge.remove(6);
      },
      "6 bytes removed of 5");
  EXPECT_DEATH(QVFakeMemoryCharge().add(5), "ended with 5 bytes");
}

}  // namespace
