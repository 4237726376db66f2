#include "platform/fake/QVFakeLog.h"
#include "platform/linux/orientation/QVOrientationRegistrations.h"

#include <cstddef>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Period = QVOrientationRegistrations::Period;

class QVOrientationRegistrationsTest : public testing::Test {
 protected:
  void add(const std::string& callbackID, const std::string& name) {
    registrations_.add(callbackID, [this, name](int32_t orientation) {
      told_.push_back(name + ' ' + std::to_string(orientation));
    });
  }
  void report(int32_t orientation) { registrations_.report(registrations_.period(), orientation); }
  std::vector<std::string> takeTold() { return std::exchange(told_, {}); }

  QVFakeLog log_;
  QVOrientationRegistrations registrations_{log_};
  std::vector<std::string> told_;
};

TEST_F(QVOrientationRegistrationsTest, TellsWhatDiffersFromTheLastKnownValue) {
  add("a", "a");
  report(1);
  EXPECT_THAT(takeTold(), IsEmpty());
  report(1);
  EXPECT_THAT(takeTold(), IsEmpty());
  report(3);
  report(3);
  report(0);
  EXPECT_THAT(takeTold(), ElementsAre("a 3", "a 0"));
}

TEST_F(QVOrientationRegistrationsTest, SharesTheLastKnownValueWithLaterRegistrations) {
  add("a", "a");
  report(1);
  add("b", "b");
  report(1);
  EXPECT_THAT(takeTold(), IsEmpty());
  report(2);
  EXPECT_THAT(takeTold(), ElementsAre("a 2", "b 2"));
}

TEST_F(QVOrientationRegistrationsTest, KnowsTheBaselineFromThePeriodsFirstRegistrationOn) {
  std::vector<int32_t> said{1, 4};
  QVOrientationRegistrations registrations(log_, [&said] {
    const int32_t value = said.front();
    said.erase(said.begin());
    return value;
  });
  const auto enroll = [&](const std::string& name) {
    registrations.add(name, [this, name](int32_t orientation) {
      told_.push_back(name + ' ' + std::to_string(orientation));
    });
  };
  enroll("a");
  EXPECT_THAT(said, ElementsAre(4)) << "the first asks at once";
  enroll("b");
  EXPECT_THAT(said, ElementsAre(4)) << "others share it";
  registrations.report(registrations.period(), 1);
  EXPECT_THAT(takeTold(), IsEmpty());
  registrations.report(registrations.period(), 3);
  EXPECT_THAT(takeTold(), ElementsAre("a 3", "b 3"));
  registrations.remove("a");
  registrations.remove("b");
  enroll("a");
  EXPECT_THAT(said, IsEmpty());
  registrations.report(registrations.period(), 4);
  EXPECT_THAT(takeTold(), IsEmpty());
  registrations.report(registrations.period(), 1);
  EXPECT_THAT(takeTold(), ElementsAre("a 1"));
}

TEST_F(QVOrientationRegistrationsTest, EndsTheOldestOfAnID) {
  add("a", "first");
  add("a", "second");
  add("b", "other");
  report(1);
  registrations_.remove("a");
  report(2);
  EXPECT_THAT(takeTold(), ElementsAre("second 2", "other 2"));
  registrations_.remove("a");
  registrations_.remove("a");
  registrations_.remove("unknown");
  report(3);
  EXPECT_THAT(takeTold(), ElementsAre("other 3"));
}

TEST_F(QVOrientationRegistrationsTest, CountsPeriodsOfDemand) {
  EXPECT_EQ(registrations_.period(), QVOrientationRegistrations::kNoDemand);
  add("a", "a");
  const Period first = registrations_.period();
  EXPECT_NE(first, QVOrientationRegistrations::kNoDemand);
  add("b", "b");
  registrations_.remove("a");
  EXPECT_EQ(registrations_.period(), first);
  registrations_.remove("b");
  EXPECT_EQ(registrations_.period(), QVOrientationRegistrations::kNoDemand);
  add("a", "a");
  EXPECT_NE(registrations_.period(), QVOrientationRegistrations::kNoDemand);
  EXPECT_NE(registrations_.period(), first);
}

TEST_F(QVOrientationRegistrationsTest, IgnoresWhatIsReportedForAnEarlierPeriod) {
  add("a", "a");
  const Period first = registrations_.period();
  report(1);
  registrations_.remove("a");
  registrations_.report(first, 2);
  add("a", "a");
  registrations_.report(first, 2);
  report(3);
  registrations_.report(first, 2);
  EXPECT_THAT(takeTold(), IsEmpty());
  report(4);
  EXPECT_THAT(takeTold(), ElementsAre("a 4"));
}

TEST_F(QVOrientationRegistrationsTest, LetsACallbackRegisterAndUnregister) {
  registrations_.add("a", [this](int32_t orientation) {
    told_.push_back("a " + std::to_string(orientation));
    registrations_.remove("a");
    registrations_.remove("b");
    add("c", "c");
  });
  add("b", "b");
  report(1);
  report(2);
  EXPECT_THAT(takeTold(), ElementsAre("a 2"));
  // Nobody was left in between: what is known counts from here.
  report(3);
  EXPECT_THAT(takeTold(), IsEmpty());
  report(4);
  EXPECT_THAT(takeTold(), ElementsAre("c 4"));
}

TEST_F(QVOrientationRegistrationsTest, DestroysCallbacksWithoutItsLock) {
  // Would wait for ever under the lock.
  std::shared_ptr<int> asks(new int(0), [this](const int* count) {
    told_.emplace_back("gone");
    static_cast<void>(registrations_.period());
    delete count;
  });
  registrations_.add("a", [asks = std::move(asks)](int32_t) {});
  EXPECT_THAT(takeTold(), IsEmpty());
  registrations_.remove("a");
  EXPECT_THAT(takeTold(), ElementsAre("gone"));
}

TEST_F(QVOrientationRegistrationsTest, CallsTheOthersWhereACallbackFails) {
  add("a", "a");
  registrations_.add("b", [](int32_t) { throw std::runtime_error("out of order"); });
  registrations_.add("c", [](int32_t) { throw 1; });
  add("d", "d");
  report(1);
  report(2);
  EXPECT_THAT(takeTold(), ElementsAre("a 2", "d 2"));
  constexpr const char* kLine =
      "3[default] -[QVOrientationRegistrations report:orientation:]: exception in orientation "
      "callback ";
  EXPECT_THAT(log_.renderings(), ElementsAre(std::string(kLine) + "b: out of order",
                                             std::string(kLine) + "c: of unknown type"));
}

TEST_F(QVOrientationRegistrationsTest, DropsWhatComesAboveItsLimitUntilOneHasEnded) {
  for (std::size_t i = 0; i < QVOrientationRegistrations::kMaximumRegistrations; ++i) {
    registrations_.add("many", [](int32_t) {});
  }
  EXPECT_THAT(log_.renderings(), IsEmpty());
  const auto held = std::make_shared<int>(0);
  registrations_.add("a", [held](int32_t) {});
  EXPECT_EQ(held.use_count(), 1) << "it goes with its callback";
  add("b", "b");
  constexpr const char* kLine =
      "3[default] -[QVOrientationRegistrations add:callback:]: orientation callback ";
  EXPECT_THAT(log_.renderings(),
              ElementsAre(std::string(kLine) + "a is not registered: there are 16384"));
  registrations_.remove("b");
  add("c", "c");
  EXPECT_EQ(log_.renderings().size(), 1U) << "b was none, so none is free";

  registrations_.remove("many");
  add("d", "d");
  add("e", "e");
  EXPECT_THAT(log_.renderings(),
              ElementsAre(testing::_, std::string(kLine) + "e is not registered: there are 16384"));
  report(1);
  report(2);
  EXPECT_THAT(takeTold(), ElementsAre("d 2"));
}

TEST_F(QVOrientationRegistrationsTest, KeepsARunningCallbackUntilItHasEnded) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> weak = held;
  registrations_.add("a", [this, weak, held = std::move(held)](int32_t) {
    registrations_.remove("a");
    told_.push_back(weak.expired() ? "gone" : "there");
  });
  report(1);
  report(2);
  EXPECT_THAT(takeTold(), ElementsAre("there"));
  EXPECT_TRUE(weak.expired());
}

}  // namespace
