#include "platform/QVText.h"
#include "platform/fake/QVFakeCountwise.h"
#include "platform/linux/store/QVStoreCountwise.h"
#include "tests/contract/store/QVStoreUnderTest.h"

#include <atomic>
#include <memory>
#include <thread>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::SizeIs;

class FakeCountwiseHarness {
 public:
  QVCountwise& countwise() { return countwise_; }
  void refuse(const std::string& name) { countwise_.addUnwanted(name); }
  // Name and payload of the events that reached the service.
  std::vector<std::string> events() {
    std::vector<std::string> found;
    for (const auto& event : countwise_.events()) {
      found.push_back(event.name + " " + QVText(event.payload));
    }
    return found;
  }

 private:
  QVFakeCountwise countwise_;
};

class StoreCountwiseHarness {
 public:
  QVCountwise& countwise() { return countwise_; }
  void refuse(const std::string& name) {
    store_.preferences().setValue("net.quillon.countwise", "unwanted", QVArray{QVValue(name)});
  }
  std::vector<std::string> events() {
    return store_.rows("SELECT name || ' ' || payload FROM countwise_event ORDER BY id");
  }

 private:
  QVStoreUnderTest store_;
  QVStoreCountwise countwise_{store_.store()};
};

template <class Harness>
class QVCountwiseContract : public testing::Test {
 protected:
  Harness harness_;
};

using Harnesses = testing::Types<FakeCountwiseHarness, StoreCountwiseHarness>;
TYPED_TEST_SUITE(QVCountwiseContract, Harnesses);

TYPED_TEST(QVCountwiseContract, SendsEventsInOrder) {
  QVCountwise& countwise = this->harness_.countwise();
  countwise.sendEventLazily("first", [] { return QVDictionary{{"n", 1}}; });
  countwise.sendEventLazily("second", [] { return QVDictionary(); });
  EXPECT_THAT(this->harness_.events(), ElementsAre(R"(first {"n":1})", "second {}"));
}

TYPED_TEST(QVCountwiseContract, AsksForAPayloadOnceAndLetsGoOfIt) {
  std::atomic<int> asked = 0;
  auto captured = std::make_shared<int>(7);
  const std::weak_ptr<int> watched = captured;
  this->harness_.countwise().sendEventLazily("event", [&asked, captured] {
    ++asked;
    return QVDictionary{{"n", *captured}};
  });
  captured.reset();
  EXPECT_THAT(this->harness_.events(), ElementsAre(R"(event {"n":7})"));
  EXPECT_EQ(asked, 1);
  EXPECT_TRUE(watched.expired());
}

TYPED_TEST(QVCountwiseContract, DoesNotAskForWhatIsUnwanted) {
  this->harness_.refuse("noise");
  std::atomic<bool> asked = false;
  auto captured = std::make_shared<int>(7);
  const std::weak_ptr<int> watched = captured;
  this->harness_.countwise().sendEventLazily("noise", [&asked, captured] {
    asked = true;
    return QVDictionary();
  });
  captured.reset();
  this->harness_.countwise().sendEventLazily("signal", [] { return QVDictionary(); });
  EXPECT_THAT(this->harness_.events(), ElementsAre("signal {}"));
  EXPECT_FALSE(asked);
  EXPECT_TRUE(watched.expired());
}

TYPED_TEST(QVCountwiseContract, TakesEventsFromAPayloadCallback) {
  // A service that held a lock while it asks would hang here.
  QVCountwise& countwise = this->harness_.countwise();
  countwise.sendEventLazily("outer", [&countwise] {
    countwise.sendEventLazily("inner", [] { return QVDictionary(); });
    return QVDictionary();
  });
  EXPECT_THAT(this->harness_.events(), testing::Contains("outer {}"));
  EXPECT_THAT(this->harness_.events(), SizeIs(2));
}

TYPED_TEST(QVCountwiseContract, TakesEventsFromManyThreads) {
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this] {
      for (int i = 0; i < 500; ++i) {
        this->harness_.countwise().sendEventLazily("event", [] { return QVDictionary(); });
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_THAT(this->harness_.events(), SizeIs(2000));
}

}  // namespace
