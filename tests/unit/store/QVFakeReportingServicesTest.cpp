#include "platform/fake/QVFakeBeacon.h"
#include "platform/fake/QVFakeCountwise.h"
#include "platform/fake/QVFakeJoulewell.h"
#include "platform/fake/QVFakePreferences.h"

#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

using Backends = QVFakeBeacon::Backends;
using Kind = QVFakeBeacon::Kind;

// What a search for backends has come to.
struct Search {
  int answers = 0;
  std::optional<QVArray> backends;

  void begin(QVBeaconSession& session) {
    session.startConfigurationWithCompletionHandler([this](std::optional<QVArray> list) {
      ++answers;
      backends = std::move(list);
    });
  }
};

TEST(QVFakeBeacon, KeepsAllCallsInOneList) {
  QVFakeBeacon beacon;
  const auto token = beacon.newSecureHierarchyTokenFromParentToken(nullptr);
  EXPECT_EQ(token->description(), "token 1");
  auto session = beacon.initWithSessionInfo(
      {{kBeaconSessionInfoHierarchyToken, token->description()}}, {{"a", 1}}, {});
  Search search;
  search.begin(*session);
  std::optional<QVError> error;
  EXPECT_TRUE(session->sendMessageWithCategory(3, 1, {{"n", 1}}, error));
  EXPECT_TRUE(beacon.sendOneMessageWithSessionInfo({{"b", 2}}, {}, 5, 2, {{"n", 2}}, error));
  session->flushMessagesWithCompletion([](const std::optional<QVError>&) {});
  EXPECT_EQ(beacon.liveSessions(), 1);
  session.reset();
  EXPECT_EQ(beacon.liveSessions(), 0);

  const std::vector<QVFakeBeaconEvent> events = beacon.events();
  ASSERT_THAT(events, SizeIs(6));
  EXPECT_EQ(events[0].kind, Kind::session);
  EXPECT_EQ(events[0].userInfo, (QVDictionary{{"a", 1}}));
  EXPECT_EQ(events[1].kind, Kind::configuration);
  EXPECT_EQ(events[2].kind, Kind::message);
  EXPECT_EQ(events[2].session, 1);
  EXPECT_EQ(events[2].category, 3);
  EXPECT_EQ(events[2].type, 1);
  EXPECT_EQ(events[2].payload, (QVDictionary{{"n", 1}}));
  EXPECT_EQ(events[3].kind, Kind::singleMessage);
  EXPECT_EQ(events[3].session, 0);
  EXPECT_EQ(events[3].sessionInfo, (QVDictionary{{"b", 2}}));
  EXPECT_EQ(events[4].kind, Kind::flush);
  EXPECT_EQ(events[5].kind, Kind::sessionEnd);
  EXPECT_EQ(beacon.count(Kind::message), 1U);
  beacon.forgetEvents();
  EXPECT_THAT(beacon.events(), IsEmpty());
}

TEST(QVFakeBeacon, EndsSearchesAsItIsTold) {
  QVFakeBeacon beacon;
  const auto atOnce = beacon.initWithSessionInfo({}, {}, {});
  Search first;
  first.begin(*atOnce);
  EXPECT_EQ(first.answers, 1);
  EXPECT_EQ(first.backends, QVFakeBeacon::defaultBackends());

  beacon.setBackends(Backends::noList);
  const auto none = beacon.initWithSessionInfo({}, {}, {});
  Search second;
  second.begin(*none);
  EXPECT_EQ(second.answers, 1);
  EXPECT_EQ(second.backends, std::nullopt);

  beacon.setBackends(Backends::whenTold);
  const auto told = beacon.initWithSessionInfo({}, {}, {});
  Search third;
  third.begin(*told);
  beacon.setBackends(Backends::never);
  const auto never = beacon.initWithSessionInfo({}, {}, {});
  Search fourth;
  fourth.begin(*never);
  EXPECT_EQ(third.answers, 0);
  beacon.answerBackends(QVArray{"some"});
  beacon.answerBackends();
  EXPECT_EQ(third.answers, 1);
  EXPECT_EQ(third.backends, QVArray{"some"});
  EXPECT_EQ(fourth.answers, 0);
}

TEST(QVFakeBeacon, FailsAsItIsTold) {
  QVFakeBeacon beacon;
  const auto session = beacon.initWithSessionInfo({}, {}, {});
  const QVError refusal{.domain = "test", .code = 1, .userInfo = {}};
  std::optional<QVError> error;
  EXPECT_TRUE(session->sendMessageWithCategory(1, 1, {}, error));
  EXPECT_TRUE(beacon.events(Kind::message).at(0).accepted);
  beacon.refuseMessages(refusal);
  EXPECT_FALSE(session->sendMessageWithCategory(1, 1, {}, error));
  EXPECT_EQ(error, refusal);
  error.reset();
  beacon.refuseMessages(std::nullopt);
  EXPECT_FALSE(beacon.sendOneMessageWithSessionInfo({}, {}, 1, 1, {}, error));
  EXPECT_EQ(error, std::nullopt);
  EXPECT_FALSE(beacon.events(Kind::message).at(1).accepted);

  beacon.setFlushError(refusal);
  std::optional<QVError> flushError;
  session->flushMessagesWithCompletion(
      [&flushError](std::optional<QVError> failure) { flushError = std::move(failure); });
  EXPECT_EQ(flushError, refusal);
}

TEST(QVFakeBeacon, NotesMisuse) {
  QVFakeBeacon beacon;
  beacon.setBackends(Backends::whenTold);
  const auto session =
      beacon.initWithSessionInfo({{kBeaconSessionInfoHierarchyToken, "token 7"}}, {}, {});
  Search search;
  search.begin(*session);
  std::optional<QVError> error;
  EXPECT_TRUE(session->sendMessageWithCategory(1, 1, {}, error));
  beacon.answerBackends();
  EXPECT_TRUE(session->sendMessageWithCategory(1, 1, {}, error));
  search.begin(*session);
  session->flushMessagesWithCompletion(nullptr);
  EXPECT_THAT(beacon.takeMisuses(),
              ElementsAre("the token \"token 7\" was not made here",
                          "a message to a session that is still looking for backends",
                          "a session configured twice", "a flush without a completion"));
  EXPECT_THAT(beacon.takeMisuses(), IsEmpty());
}

TEST(QVFakeBeaconDeathTest, EndsTheTestWhoseMisuseNobodyTook) {
  EXPECT_DEATH(
      {
        QVFakeBeacon beacon;
        beacon.initWithSessionInfo({}, {}, {})->flushMessagesWithCompletion(nullptr);
      },
      "QVFakeBeacon used wrongly: a flush without a completion");
}

TEST(QVFakeBeacon, CountsTokensAndOutlivesNothing) {
  std::shared_ptr<BeaconSecureHierarchyToken> token;
  std::shared_ptr<QVBeaconSession> session;
  {
    QVFakeBeacon beacon;
    token = beacon.newSecureHierarchyTokenFromParentToken(nullptr);
    const auto child = beacon.newSecureHierarchyTokenFromParentToken(token);
    EXPECT_EQ(beacon.liveTokens(), 2);
    beacon.setBackends(Backends::whenTold);
    session = beacon.initWithSessionInfo({}, {}, {});
    // The open search holds the session, which must not keep the fake's state alive for ever.
    session->startConfigurationWithCompletionHandler([session](const std::optional<QVArray>&) {});
  }
  EXPECT_EQ(session.use_count(), 1);
  EXPECT_EQ(token->description(), "token 1");
}

TEST(QVFakeCountwise, AsksForPayloadsWhenTold) {
  QVFakeCountwise countwise;
  countwise.sendEventLazily("a", [] { return QVDictionary{{"n", 1}}; });
  countwise.setDelivery(QVFakeCountwise::Delivery::whenTold);
  int asked = 0;
  countwise.sendEventLazily("b", [&asked] {
    ++asked;
    return QVDictionary{{"n", 2}};
  });
  EXPECT_THAT(countwise.events(), SizeIs(1));
  EXPECT_EQ(countwise.waitingEvents(), 1U);
  EXPECT_EQ(asked, 0);
  countwise.deliver();
  countwise.deliver();
  EXPECT_EQ(asked, 1);
  ASSERT_THAT(countwise.events(), SizeIs(2));
  EXPECT_EQ(countwise.events()[1].name, "b");
  EXPECT_EQ(countwise.events()[1].payload, (QVDictionary{{"n", 2}}));
  EXPECT_THAT(countwise.sentNames(), ElementsAre("a", "b"));
}

TEST(QVFakeCountwise, DropsWhatIsUnwanted) {
  QVFakeCountwise countwise;
  countwise.addUnwanted("noise");
  bool asked = false;
  countwise.sendEventLazily("noise", [&asked] {
    asked = true;
    return QVDictionary{};
  });
  EXPECT_FALSE(asked);
  EXPECT_THAT(countwise.events(), IsEmpty());
  EXPECT_THAT(countwise.sentNames(), ElementsAre("noise"));
}

TEST(QVFakeCountwise, NotesAnEventWithoutACallback) {
  QVFakeCountwise countwise;
  countwise.sendEventLazily("a", nullptr);
  EXPECT_THAT(countwise.takeMisuses(), ElementsAre("an event without a payload callback: a"));
}

TEST(QVFakeJoulewell, KeepsEventsAndNotesNamelessOnes) {
  QVFakeJoulewell joulewell;
  joulewell.logEvent(28, "Vidra_Haptics", {{"EngineOnDuration", 12.5}}, {});
  joulewell.logEvent(1, "", {}, {{"option", true}});
  ASSERT_THAT(joulewell.events(), SizeIs(2));
  EXPECT_EQ(joulewell.events()[0].agent, 28);
  EXPECT_EQ(joulewell.events()[0].name, "Vidra_Haptics");
  EXPECT_EQ(joulewell.events()[0].event, (QVDictionary{{"EngineOnDuration", 12.5}}));
  EXPECT_EQ(joulewell.events()[1].options, (QVDictionary{{"option", true}}));
  EXPECT_THAT(joulewell.takeMisuses(), ElementsAre("an event without a name"));
}

TEST(QVFakePreferences, CountsReadings) {
  QVFakePreferences preferences;
  preferences.setValue("domain", "key", 1);
  EXPECT_EQ(preferences.readingsOfDomain("domain"), 0U);
  preferences.valuesInDomain("domain");
  preferences.valuesInDomain("other");
  preferences.valuesInDomain("domain");
  EXPECT_EQ(preferences.readingsOfDomain("domain"), 2U);
}

}  // namespace
