#include "QVServices/Statistics/Service/QVReportingBlockThrottle.h"
#include "platform/fake/QVFakePlatform.h"

#include <cstdint>
#include <limits>
#include <string>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr uint32_t kSessionPlayback = 0x08000003;
constexpr uint16_t kStart = 1;

constexpr const char* kEnd = "reporterID|42|Session_Playback|Start";

std::string keyOf(const QVDictionary& message) {
  return QVReportingBlockThrottle::buildMessageKey(message, 42, kSessionPlayback, kStart);
}

TEST(QVReportingBlockThrottleKeyTest, JoinsKeysValuesReporterAndNames) {
  EXPECT_EQ(keyOf({{"b", 2}, {"a", 1}, {"_throttle_seconds", 3}}),
            "_throttle_seconds|^|a|1|b|2|reporterID|42|Session_Playback|Start");
}

TEST(QVReportingBlockThrottleKeyTest, NamesTheReporterWhereThereIsNoPayload) {
  EXPECT_EQ(QVReportingBlockThrottle::buildMessageKey({}, 0, 0, 0),
            "reporterID|0|Undefined|Generic");
  EXPECT_EQ(QVReportingBlockThrottle::buildMessageKey({}, INT64_MIN, 0xFFFFFFFF, 0xFFFF),
            "reporterID|-9223372036854775808|Undefined|Unknown");
}

TEST(QVReportingBlockThrottleKeyTest, SortsUpperCaseBeforeUnderscoresBeforeLowerCase) {
  EXPECT_EQ(keyOf({{"a", 1}, {"_", 2}, {"Z", 3}, {"A", 4}, {"aa", 5}}),
            std::string("A|4|Z|3|_|2|a|1|aa|5|").append(kEnd));
}

TEST(QVReportingBlockThrottleKeyTest, ShowsValuesInTheirTextForms) {
  EXPECT_EQ(keyOf({{"a", QVArray{1, "x", 0.5}},
                   {"b", true},
                   {"d", QVDictionary{{"k", QVValue()}, {"j", "v"}}},
                   {"f", 0.1},
                   {"n", QVValue()},
                   {"s", "te|xt"},
                   {"u", UINT64_MAX},
                   {"w", 12.0}}),
            std::string(R"(a|[1,"x",0.5]|b|1|d|{"j":"v","k":null}|f|0.1|n|(null)|s|te|xt|)"
                        R"(u|18446744073709551615|w|12|)")
                .append(kEnd));
}

TEST(QVReportingBlockThrottleKeyTest, IgnoresTheValuesOfReservedKeys) {
  EXPECT_EQ(keyOf({{"systemuptime_sec", 1},
                   {"processuptime_ms", "2"},
                   {"qvreporting_timestamp", 3.5},
                   {"_comparison_field_blacklist", 4},
                   {"_throttle_seconds", QVArray{}}}),
            std::string("_comparison_field_blacklist|^|_throttle_seconds|^|processuptime_ms|^|"
                        "qvreporting_timestamp|^|systemuptime_sec|^|")
                .append(kEnd));
}

TEST(QVReportingBlockThrottleKeyTest, IgnoresTheValuesOfFieldsThatTheMessageNames) {
  const auto withBlacklist = [](const QVValue& blacklist) {
    return keyOf({{"1", "one"}, {"a", 1}, {"b", 2}, {"_comparison_field_blacklist", blacklist}});
  };
  const std::string nothingIgnored =
      std::string("1|one|_comparison_field_blacklist|^|a|1|b|2|").append(kEnd);
  EXPECT_EQ(withBlacklist(QVArray{"b", "elsewhere", "a"}),
            std::string("1|one|_comparison_field_blacklist|^|a|^|b|^|").append(kEnd));
  EXPECT_EQ(withBlacklist(QVArray{}), nothingIgnored);
  EXPECT_EQ(withBlacklist(QVArray{1, true, QVArray{"a"}, "A"}), nothingIgnored)
      << "keys are strings, of that very case";
  for (const QVValue& other : {QVValue("a"), QVValue(1), QVValue(QVDictionary{{"a", "a"}})}) {
    EXPECT_EQ(withBlacklist(other), nothingIgnored);
  }
}

TEST(QVReportingBlockThrottleKeyTest, IgnoresTheVolumeWhereThereIsAnOperationTime) {
  EXPECT_EQ(keyOf({{"Volume", 0.5}, {"VolumeOperationTime", 17}}),
            std::string("Volume|^|VolumeOperationTime|^|").append(kEnd));
  EXPECT_EQ(keyOf({{"Volume", 0.5}}), std::string("Volume|0.5|").append(kEnd));
  EXPECT_EQ(keyOf({{"VolumeOperationTime", 17}}),
            std::string("VolumeOperationTime|17|").append(kEnd));
}

class QVReportingBlockThrottleSleepTimeTest : public testing::Test {
 protected:
  static double sleepTime(const QVValue& seconds) {
    return QVReportingBlockThrottle::determineSleepTime({{"_throttle_seconds", seconds}});
  }
  std::vector<std::string> takeLines() {
    auto lines = platform_.log().renderings();
    platform_.log().clear();
    return lines;
  }
  static std::string line(const std::string& text) {
    return std::string("6[default] +[QVReportingBlockThrottle determineSleepTime:]: ").append(text);
  }

  QVFakePlatform platform_;
};

TEST_F(QVReportingBlockThrottleSleepTimeTest, IsHalfASecondWhereTheMessageSaysNothing) {
  EXPECT_EQ(QVReportingBlockThrottle::determineSleepTime({{"a", 4}}), 0.5);
  EXPECT_EQ(QVReportingBlockThrottle::determineSleepTime({}), 0.5);
  EXPECT_THAT(takeLines(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleSleepTimeTest, TakesNumbersBelowFiveInSinglePrecision) {
  EXPECT_EQ(sleepTime(4.9), double{4.9F});
  EXPECT_NE(sleepTime(4.9), 4.9);
  EXPECT_EQ(sleepTime(4.999999999), 5.0) << "below five as it is read, five as it is used";
  EXPECT_EQ(sleepTime(4), 4.0);
  EXPECT_EQ(sleepTime(0), 0.0);
  EXPECT_EQ(sleepTime(0.25), 0.25);
  EXPECT_EQ(sleepTime(true), 1.0);
  EXPECT_EQ(sleepTime(false), 0.0);
  EXPECT_THAT(takeLines(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleSleepTimeTest, LetsNegativeNumbersPass) {
  EXPECT_EQ(sleepTime(-1), -1.0);
  EXPECT_EQ(sleepTime(-0.5), -0.5);
  constexpr double kLowest = std::numeric_limits<float>::lowest();
  EXPECT_EQ(sleepTime(-1e300), kLowest);
  EXPECT_EQ(sleepTime(-std::numeric_limits<double>::infinity()), kLowest);
  EXPECT_EQ(sleepTime(INT64_MIN), -0x1p63);
  EXPECT_THAT(takeLines(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleSleepTimeTest, IsHalfASecondForWhatIsNoNumberAfterAll) {
  EXPECT_EQ(sleepTime(std::numeric_limits<double>::quiet_NaN()), 0.5);
  EXPECT_THAT(takeLines(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleSleepTimeTest, RejectsFiveAndAbove) {
  for (const QVValue& seconds :
       {QVValue(5), QVValue(7), QVValue(5.0), QVValue(5.25), QVValue(UINT64_MAX), QVValue(1e300),
        QVValue(std::numeric_limits<double>::infinity())}) {
    EXPECT_EQ(sleepTime(seconds), 0.5);
  }
  EXPECT_THAT(
      takeLines(),
      ElementsAre(line("Rejecting large throttle time. {time=5, max=5.000000}"),
                  line("Rejecting large throttle time. {time=7, max=5.000000}"),
                  line("Rejecting large throttle time. {time=5, max=5.000000}"),
                  line("Rejecting large throttle time. {time=5.25, max=5.000000}"),
                  line("Rejecting large throttle time. {time=18446744073709551615, max=5.000000}"),
                  line("Rejecting large throttle time. {time=1e+300, max=5.000000}"),
                  line("Rejecting large throttle time. {time=inf, max=5.000000}")));
}

TEST_F(QVReportingBlockThrottleSleepTimeTest, RejectsWhatIsNoNumber) {
  for (const QVValue& seconds :
       {QVValue("3"), QVValue(QVArray{3}), QVValue(QVDictionary{{"s", 3}}), QVValue()}) {
    EXPECT_EQ(sleepTime(seconds), 0.5);
  }
  EXPECT_THAT(takeLines(),
              ElementsAre(line("Rejecting non NSNumber value of throttle time. {time=3}"),
                          line("Rejecting non NSNumber value of throttle time. {time=[3]}"),
                          line(R"(Rejecting non NSNumber value of throttle time. {time={"s":3}})"),
                          line("Rejecting non NSNumber value of throttle time. {time=(null)}")));
}

}  // namespace
