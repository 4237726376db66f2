// The columns of a session's summary.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <cmath>

namespace {

class QVReportingSummaryEventTest : public QVServiceFixture {
 protected:
  QVReportingSummaryEventTest() { session_->setServiceType(2); }

  void send(const QVDictionary& message) {
    session_->sendMessage(message, kSessionPlayback, kStart, {});
  }
  QVDictionary summary() { return session_->createSummaryEventForSession(); }

  std::shared_ptr<QVReportingSession> session_ = QVReportingSession::initWithID(7, {42});
};

TEST_F(QVReportingSummaryEventTest, IsAbsentWhereNothingWasRecorded) {
  EXPECT_TRUE(summary().isAbsent());
  session_->start();
  EXPECT_TRUE(summary().isAbsent());
  send({{"a", 1}});
  session_->stop();
  EXPECT_TRUE(summary().isAbsent()) << "the arrays are gone";
}

TEST_F(QVReportingSummaryEventTest, JoinsTheValuesOfEachKey) {
  send({{"a", 1}});
  send({{"a", 2}, {"b", "x"}});
  EXPECT_EQ(summary(), (QVDictionary{{"QV_Session_Summary_Event", "2"}, {"a", "1,2"}, {"b", "x"}}));
}

TEST_F(QVReportingSummaryEventTest, HasTheServiceTypeOfTheMoment) {
  send({{"a", 1}});
  session_->setServiceType(65534);
  EXPECT_EQ(*summary().find("QV_Session_Summary_Event"), QVValue("65534"));
}

TEST_F(QVReportingSummaryEventTest, AppendsValuesUnderItsOwnKeyAfterTheServiceType) {
  send({{"QV_Session_Summary_Event", "mine"}});
  send({{"QV_Session_Summary_Event", 5}});
  EXPECT_EQ(summary(), (QVDictionary{{"QV_Session_Summary_Event", "2,mine,5"}}));
}

TEST_F(QVReportingSummaryEventTest, WritesEveryKindOfValueInItsTextForm) {
  send({{"v", 12.0}});
  send({{"v", true}});
  send({{"v", QVValue()}});
  send({{"v", 0.1}});
  send({{"v", "a,b"}});
  send({{"v", QVArray{1, "x"}}});
  send({{"v", QVDictionary{{"k", QVValue()}}}});
  send({{"v", UINT64_MAX}});
  send({{"v", std::nan("")}});
  send({{"v", ""}});
  EXPECT_EQ(*summary().find("v"),
            QVValue(R"(12,1,(null),0.1,a,b,[1,"x"],{"k":null},18446744073709551615,nan,)"));
}

TEST_F(QVReportingSummaryEventTest, HasNormalisedKeys) {
  send({{"buffer size", 1}});
  send({{"buffer_size", 2}});
  EXPECT_EQ(*summary().find("buffer_size"), QVValue("1,2"));
  EXPECT_FALSE(summary().contains("buffer size"));
}

TEST_F(QVReportingSummaryEventTest, LeavesNoGapsForMissingKeys) {
  send({{"a", 1}});
  send({{"b", 2}});
  send({{"a", 3}});
  EXPECT_EQ(summary(), (QVDictionary{{"QV_Session_Summary_Event", "2"}, {"a", "1,3"}, {"b", "2"}}));
}

TEST_F(QVReportingSummaryEventTest, ConsistsOfTheServiceTypeWhereAllPayloadsAreEmpty) {
  send({});
  EXPECT_EQ(summary(), (QVDictionary{{"QV_Session_Summary_Event", "2"}}));
}

TEST_F(QVReportingSummaryEventTest, ChangesNothing) {
  send({{"a", 1}});
  const QVDictionary first = summary();
  EXPECT_EQ(summary(), first);
  EXPECT_EQ(session_->aggregatedPayloadData()->size(), 1u);
  EXPECT_EQ(session_->messageTypeCounts().size(), 1u);
}

TEST_F(QVReportingSummaryEventTest, IsRecordedAndNumberedWhenTheSessionStops) {
  session_->start();
  send({{"a", 1}});
  const auto aggregated = session_->aggregatedPayloadData();
  const auto nested = session_->nestedAggregatedPayloadData();
  session_->stop();
  std::vector<std::string> identifiers;
  for (const auto& [identifier, payload] : entriesOf(*nested)) identifiers.push_back(identifier);
  EXPECT_THAT(identifiers, testing::ElementsAre("Session_Playback_Start_1", "Undefined_Unknown_1"));
  EXPECT_EQ(aggregated->size(), 2u);
}

}  // namespace
