// What the two event sinks make of a message.

#include "QVServices/Statistics/QVReportingCountwiseBridge.h"
#include "QVServices/Statistics/QVReportingJoulewellUtility.h"
#include "platform/fake/QVFakePlatform.h"

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class Session final : public QVReportingSessionInformation {
 public:
  explicit Session(QVDictionary information = {}) : information_(std::move(information)) {}
  QVDictionary userInfo() const override { return information_; }
  void setUserInfo(QVDictionary information) { information_ = std::move(information); }

 private:
  QVDictionary information_;
};

const QVDictionary kPlayer{{"HostApplicationDisplayID", "org.example.Player"}, {"rate", 48000}};

class QVReportingJoulewellUtilityTest : public testing::Test {
 protected:
  void handle(const QVDictionary& message, const Session& session, uint32_t category = 3,
              uint16_t type = 1) {
    QVReportingJoulewellUtility::handleEvent(message, category, type, session);
  }
  std::vector<QVFakeJoulewell::Event> events() { return platform_.joulewell().events(); }
  std::vector<std::string> lines() { return platform_.log().renderings(); }
  static std::string line(const std::string& text) {
    return "3[default] +[QVReportingJoulewellUtility handleEvent:withCategory:type:session:]: " +
           text;
  }

  QVFakePlatform platform_;
};

TEST_F(QVReportingJoulewellUtilityTest, LogsAnEngineRun) {
  handle({{"EngineOnTime", 12.5}, {"qvreporting_timestamp", 1000}, {"other", "x"}},
         Session(kPlayer));
  ASSERT_THAT(events(), SizeIs(1));
  EXPECT_EQ(events()[0].agent, 28);
  EXPECT_EQ(events()[0].name, "Vidra_Haptics");
  EXPECT_EQ(events()[0].event, (QVDictionary{{"EngineOnDuration", 12.5},
                                             {"ApplicationName", "org.example.Player"},
                                             {"TimestampEnd", 1000}}));
  EXPECT_TRUE(events()[0].options.empty());
  EXPECT_THAT(lines(), IsEmpty());
}

TEST_F(QVReportingJoulewellUtilityTest, LogsNothingWithoutAnEngineRun) {
  const Session session(kPlayer);
  handle({{"qvreporting_timestamp", 1000}, {"Engine On Time", 1}, {"EngineOnTime ", 1}}, session);
  handle({}, session, 0x20000005, 4);
  handle(QVDictionary(), session);
  EXPECT_THAT(events(), IsEmpty());
  EXPECT_THAT(lines(), IsEmpty());
}

TEST_F(QVReportingJoulewellUtilityTest, LooksAtNeitherCategoryNorType) {
  for (const uint32_t category : {0u, 0xFFFFFFFFu, 0x20000005u}) {
    handle({{"EngineOnTime", 1}, {"qvreporting_timestamp", 2}}, Session(kPlayer), category, 65535);
  }
  EXPECT_THAT(events(), SizeIs(3));
}

TEST_F(QVReportingJoulewellUtilityTest, ComplainsAboutAMissingTimestampAndLogsTheRest) {
  handle({{"EngineOnTime", 12.5}}, Session(kPlayer));
  ASSERT_THAT(events(), SizeIs(1));
  EXPECT_EQ(events()[0].event,
            (QVDictionary{{"EngineOnDuration", 12.5}, {"ApplicationName", "org.example.Player"}}));
  EXPECT_THAT(lines(), ElementsAre(line("failed to get QVReporting timestamp for joulewell")));
}

TEST_F(QVReportingJoulewellUtilityTest, CallsAnApplicationThatIsNotNamedUnknown) {
  handle({{"EngineOnTime", 1}, {"qvreporting_timestamp", 2}}, Session());
  EXPECT_EQ(*events().at(0).event.find("ApplicationName"), QVValue("Unknown"));
  EXPECT_THAT(lines(), IsEmpty());
}

TEST_F(QVReportingJoulewellUtilityTest, ComplainsAboutAnApplicationWithoutAName) {
  handle({{"EngineOnTime", 1}}, Session({{"HostApplicationDisplayID", QVValue()}}));
  EXPECT_EQ(events().at(0).event, (QVDictionary{{"EngineOnDuration", 1}}));
  EXPECT_THAT(lines(), ElementsAre(line("failed to get app name for joulewell"),
                                   line("failed to get QVReporting timestamp for joulewell")));
}

TEST_F(QVReportingJoulewellUtilityTest, CopiesValuesOfWhateverKind) {
  handle({{"EngineOnTime", "long"}, {"qvreporting_timestamp", QVArray{1, 2}}},
         Session({{"HostApplicationDisplayID", 12}}));
  EXPECT_EQ(events().at(0).event, (QVDictionary{{"EngineOnDuration", "long"},
                                                {"ApplicationName", 12},
                                                {"TimestampEnd", QVArray{1, 2}}}));
}

class QVReportingCountwiseBridgeTest : public testing::Test {
 protected:
  void handle(const QVDictionary& message, const Session& session, uint32_t category = 3,
              uint16_t type = 1) {
    QVReportingCountwiseBridge::handleEvent(message, category, type, session);
  }
  std::vector<QVFakeCountwise::Event> events() { return platform_.countwise().events(); }

  QVFakePlatform platform_;
};

TEST_F(QVReportingCountwiseBridgeTest, SendsTheMessageWithTheApplicationsName) {
  const QVDictionary message{{"a b", 1}, {"nested", QVDictionary{{"x", 2}}}};
  handle(message, Session(kPlayer));
  ASSERT_THAT(events(), SizeIs(1));
  EXPECT_EQ(events()[0].name, "net.quillon.quietvox.Playback.Start");
  EXPECT_EQ(events()[0].payload, (QVDictionary{{"a b", 1},
                                               {"nested", QVDictionary{{"x", 2}}},
                                               {"HostApplicationDisplayID", "org.example.Player"}}))
      << "with its keys as they came";
  EXPECT_EQ(message, (QVDictionary{{"a b", 1}, {"nested", QVDictionary{{"x", 2}}}}));
  EXPECT_THAT(platform_.log().lines(), IsEmpty());
}

TEST_F(QVReportingCountwiseBridgeTest, OverwritesTheNameThatTheMessageGives) {
  handle({{"HostApplicationDisplayID", "pretender"}}, Session(kPlayer));
  EXPECT_EQ(events().at(0).payload,
            (QVDictionary{{"HostApplicationDisplayID", "org.example.Player"}}));
}

TEST_F(QVReportingCountwiseBridgeTest, CallsAnApplicationThatIsNotNamedUnknown) {
  handle({{"HostApplicationDisplayID", "pretender"}}, Session());
  handle({{"a", 1}}, Session({{"rate", 48000}}));
  EXPECT_EQ(events().at(0).payload, (QVDictionary{{"HostApplicationDisplayID", "Unknown"}}));
  EXPECT_EQ(events().at(1).payload,
            (QVDictionary{{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(QVReportingCountwiseBridgeTest, SendsAnAbsentMessageAsTheNameAlone) {
  handle(QVDictionary(), Session(kPlayer));
  EXPECT_EQ(events().at(0).payload,
            (QVDictionary{{"HostApplicationDisplayID", "org.example.Player"}}));
}

TEST_F(QVReportingCountwiseBridgeTest, NamesTheEventAfterCategoryAndType) {
  const Session session;
  handle({}, session, 0x80000003, 1);
  handle({}, session, 0x10000008, 4);
  handle({}, session, 3, 0xFFFF);
  handle({}, session, 3, 9);
  handle({}, session, 0x20000000, 0);
  handle({}, session, 0x18000001, 5);
  EXPECT_THAT(
      platform_.countwise().sentNames(),
      ElementsAre("net.quillon.quietvox.Toolbox_Playback.Start",
                  "net.quillon.quietvox.DSP_Error.Error", "net.quillon.quietvox.Playback.Unknown",
                  "net.quillon.quietvox.Playback.Undefined",
                  "net.quillon.quietvox.HAL_Undefined.Generic",
                  "net.quillon.quietvox._Generic.IssueDetector"));
}

TEST_F(QVReportingCountwiseBridgeTest, SendsOneEventForEachSession) {
  for (const char* application : {"A", "B", "C"}) {
    handle({{"a", 1}}, Session({{"HostApplicationDisplayID", application}}));
  }
  ASSERT_THAT(events(), SizeIs(3));
  EXPECT_EQ(*events()[0].payload.find("HostApplicationDisplayID"), QVValue("A"));
  EXPECT_EQ(*events()[1].payload.find("HostApplicationDisplayID"), QVValue("B"));
  EXPECT_EQ(*events()[2].payload.find("HostApplicationDisplayID"), QVValue("C"));
  EXPECT_EQ(events()[2].name, events()[0].name);
}

TEST_F(QVReportingCountwiseBridgeTest, TellsWhatHeldWhenTheEventWasSent) {
  platform_.countwise().setDelivery(QVFakeCountwise::Delivery::whenTold);
  {
    Session session(kPlayer);
    handle({{"a", 1}}, session);
    session.setUserInfo({{"HostApplicationDisplayID", "changed since"}});
  }
  platform_.countwise().deliver();
  EXPECT_EQ(events().at(0).payload,
            (QVDictionary{{"a", 1}, {"HostApplicationDisplayID", "org.example.Player"}}))
      << "the payload outlives message and session";
}

}  // namespace
