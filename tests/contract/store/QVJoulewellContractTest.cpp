#include "platform/QVText.h"
#include "platform/fake/QVFakeJoulewell.h"
#include "platform/linux/store/QVStoreJoulewell.h"
#include "tests/contract/store/QVStoreUnderTest.h"

#include <thread>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::SizeIs;

class FakeJoulewellHarness {
 public:
  QVJoulewell& joulewell() { return joulewell_; }
  // Agent, name and contents of the events.
  std::vector<std::string> events() {
    std::vector<std::string> found;
    for (const auto& event : joulewell_.events()) {
      found.push_back(QVText(event.agent, " ", event.name, " ", event.event));
    }
    return found;
  }

 private:
  QVFakeJoulewell joulewell_;
};

class StoreJoulewellHarness {
 public:
  QVJoulewell& joulewell() { return joulewell_; }
  std::vector<std::string> events() {
    return store_.rows(
        "SELECT agent || ' ' || name || ' ' || payload FROM joulewell_event ORDER BY id");
  }

 private:
  QVStoreUnderTest store_;
  QVStoreJoulewell joulewell_{store_.store()};
};

template <class Harness>
class QVJoulewellContract : public testing::Test {
 protected:
  Harness harness_;
};

using Harnesses = testing::Types<FakeJoulewellHarness, StoreJoulewellHarness>;
TYPED_TEST_SUITE(QVJoulewellContract, Harnesses);

TYPED_TEST(QVJoulewellContract, LogsEventsInOrder) {
  QVJoulewell& joulewell = this->harness_.joulewell();
  joulewell.logEvent(28, "Vidra_Haptics", {{"EngineOnDuration", 12.5}, {"TimestampEnd", 1000}}, {});
  joulewell.logEvent(-1, "other", {}, {});
  EXPECT_THAT(this->harness_.events(),
              ElementsAre(R"(28 Vidra_Haptics {"EngineOnDuration":12.5,"TimestampEnd":1000})",
                          "-1 other {}"));
}

TYPED_TEST(QVJoulewellContract, KeepsNoHoldOfTheNamesCharacters) {
  std::string name = "Vidra_Haptics";
  this->harness_.joulewell().logEvent(28, name, {}, {});
  name.assign(name.size(), 'x');
  EXPECT_THAT(this->harness_.events(), ElementsAre("28 Vidra_Haptics {}"));
}

TYPED_TEST(QVJoulewellContract, TakesEventsFromManyThreads) {
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this] {
      for (int i = 0; i < 500; ++i) this->harness_.joulewell().logEvent(1, "event", {}, {});
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_THAT(this->harness_.events(), SizeIs(2000));
}

}  // namespace
