#include "platform/QVText.h"
#include "platform/fake/QVFakeBeacon.h"
#include "platform/linux/store/QVStoreBeacon.h"
#include "tests/contract/store/QVStoreUnderTest.h"

#include <atomic>
#include <set>
#include <thread>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// What both have of a message: its session's number in order of their making, 0 for none, then
// category, type and payload.
std::string rendering(int64_t session, int category, int type, const std::string& payload) {
  return QVText(session, " ", category, " ", type, " ", payload);
}

class FakeBeaconHarness {
 public:
  QVBeacon& beacon() { return beacon_; }
  std::vector<std::string> messages() {
    std::vector<std::string> found;
    for (const QVFakeBeaconEvent& event : beacon_.events()) {
      if (event.kind != QVFakeBeaconEvent::Kind::message &&
          event.kind != QVFakeBeaconEvent::Kind::singleMessage) {
        continue;
      }
      found.push_back(rendering(event.session, event.category, event.type, QVText(event.payload)));
    }
    return found;
  }

 private:
  QVFakeBeacon beacon_;
};

class StoreBeaconHarness {
 public:
  QVBeacon& beacon() { return beacon_; }
  std::vector<std::string> messages() {
    return store_.rows(
        "SELECT coalesce(session, 0) || ' ' || category || ' ' || type || ' ' || payload"
        " FROM beacon_message ORDER BY id");
  }

 private:
  QVStoreUnderTest store_;
  QVStoreBeacon beacon_{store_.store()};
};

template <class Harness>
class QVBeaconContract : public testing::Test {
 protected:
  std::shared_ptr<QVBeaconSession> makeSession(int64_t sessionID = 1) {
    return harness_.beacon().initWithSessionInfo(
        {{kBeaconSessionInfoClientType, 19}, {kBeaconSessionInfoSessionID, sessionID}},
        {{kBeaconUserInfoClientName, "client"}, {kBeaconUserInfoServiceName, "service"}}, {});
  }
  // Ends the session's search for backends; how often it was answered, and with what.
  std::optional<QVArray> findBackends(QVBeaconSession& session) {
    std::promise<std::optional<QVArray>> answer;
    session.startConfigurationWithCompletionHandler(
        [&answer](std::optional<QVArray> list) { answer.set_value(std::move(list)); });
    return answer.get_future().get();
  }
  std::optional<QVError> flush(QVBeaconSession& session) {
    std::promise<std::optional<QVError>> answer;
    session.flushMessagesWithCompletion(
        [&answer](std::optional<QVError> error) { answer.set_value(std::move(error)); });
    return answer.get_future().get();
  }
  void send(QVBeaconSession& session, uint16_t category, uint16_t type,
            const QVDictionary& payload) {
    std::optional<QVError> error;
    EXPECT_TRUE(session.sendMessageWithCategory(category, type, payload, error));
    EXPECT_EQ(error, std::nullopt);
  }

  Harness harness_;
};

using Harnesses = testing::Types<FakeBeaconHarness, StoreBeaconHarness>;
TYPED_TEST_SUITE(QVBeaconContract, Harnesses);

TYPED_TEST(QVBeaconContract, FindsBackends) {
  const auto session = this->makeSession();
  const std::optional<QVArray> backends = this->findBackends(*session);
  ASSERT_NE(backends, std::nullopt);
  EXPECT_FALSE(backends->empty());
}

TYPED_TEST(QVBeaconContract, KeepsTheMessagesOfASessionInOrder) {
  const auto session = this->makeSession();
  this->findBackends(*session);
  this->send(*session, 3, 1, {{"n", 1}});
  this->send(*session, 65535, 65535, {{"text", "two"}});
  this->send(*session, 0, 0, {});
  EXPECT_EQ(this->flush(*session), std::nullopt);
  EXPECT_THAT(this->harness_.messages(),
              ElementsAre(R"(1 3 1 {"n":1})", R"(1 65535 65535 {"text":"two"})", "1 0 0 {}"));
}

TYPED_TEST(QVBeaconContract, TellsSessionsApart) {
  const auto first = this->makeSession(5);
  const auto second = this->makeSession(5);
  EXPECT_NE(first, second);
  this->findBackends(*first);
  this->findBackends(*second);
  this->send(*second, 1, 1, {});
  this->send(*first, 2, 2, {});
  EXPECT_THAT(this->harness_.messages(), ElementsAre("2 1 1 {}", "1 2 2 {}"));
}

TYPED_TEST(QVBeaconContract, SendsWhatWasSentWithoutAFlush) {
  auto session = this->makeSession();
  this->findBackends(*session);
  this->send(*session, 3, 1, {{"n", 1}});
  session.reset();
  EXPECT_THAT(this->harness_.messages(), ElementsAre(R"(1 3 1 {"n":1})"));
}

TYPED_TEST(QVBeaconContract, SendsOneMessageWithoutASession) {
  std::optional<QVError> error;
  EXPECT_TRUE(this->harness_.beacon().sendOneMessageWithSessionInfo(
      {{kBeaconSessionInfoSessionID, -1}}, {}, 5, 2, {{"n", 1}}, error));
  EXPECT_EQ(error, std::nullopt);
  EXPECT_THAT(this->harness_.messages(), ElementsAre(R"(0 5 2 {"n":1})"));
}

TYPED_TEST(QVBeaconContract, MakesTokensThatDiffer) {
  std::set<std::string> texts;
  std::shared_ptr<BeaconSecureHierarchyToken> token;
  for (int i = 0; i < 100; ++i) {
    token = this->harness_.beacon().newSecureHierarchyTokenFromParentToken(token);
    EXPECT_FALSE(token->description().empty());
    EXPECT_EQ(token->description(), token->description());
    texts.insert(token->description());
  }
  EXPECT_EQ(texts.size(), 100U);
}

TYPED_TEST(QVBeaconContract, DescribesSessions) {
  EXPECT_FALSE(this->makeSession()->description().empty());
}

TYPED_TEST(QVBeaconContract, AnswersAFlushOfASessionThatIsDroppedMeanwhile) {
  auto session = this->makeSession();
  std::promise<std::optional<QVError>> answer;
  session->flushMessagesWithCompletion(
      [&answer](std::optional<QVError> error) { answer.set_value(std::move(error)); });
  session.reset();
  EXPECT_EQ(answer.get_future().get(), std::nullopt);
}

TYPED_TEST(QVBeaconContract, ServesManySessionsAtOnce) {
  constexpr int kThreads = 4;
  constexpr int kMessages = 200;
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([this] {
      const auto session = this->makeSession();
      this->findBackends(*session);
      for (int i = 0; i < kMessages; ++i) this->send(*session, 1, 1, {{"n", i}});
      EXPECT_EQ(this->flush(*session), std::nullopt);
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(this->harness_.messages().size(), static_cast<std::size_t>(kThreads * kMessages));
}

}  // namespace
