#include "tools/qvctl/QVTimeText.h"

#include <cstdlib>

#include <gtest/gtest.h>
#include <time.h>

namespace {

using std::chrono::microseconds;

constexpr int64_t kSecond = 1'000'000;
// 2026-11-21 06:20:01 UTC, a quarter of a second after.
constexpr int64_t kNow = 1'795'242'001 * kSecond + 250'000;

class QVTimeTextTest : public testing::Test {
 protected:
  // Two hours east of Greenwich, whatever the machine's zone.
  void SetUp() override {
    ::setenv("TZ", "EET-2", 1);
    ::tzset();
  }
  void TearDown() override {
    ::unsetenv("TZ");
    ::tzset();
  }
};

TEST_F(QVTimeTextTest, ReadsDurations) {
  EXPECT_EQ(QVParseDuration("250ms"), microseconds(250'000));
  EXPECT_EQ(QVParseDuration("7us"), microseconds(7));
  EXPECT_EQ(QVParseDuration("90"), microseconds(90 * kSecond));
  EXPECT_EQ(QVParseDuration("1.5s"), microseconds(1'500'000));
  EXPECT_EQ(QVParseDuration("10m"), microseconds(600 * kSecond));
  EXPECT_EQ(QVParseDuration("10min"), microseconds(600 * kSecond));
  EXPECT_EQ(QVParseDuration("1h30m"), microseconds(5400 * kSecond));
  EXPECT_EQ(QVParseDuration("2d"), microseconds(2 * 86'400 * kSecond));
  EXPECT_EQ(QVParseDuration("0"), microseconds(0));
}

TEST_F(QVTimeTextTest, RefusesWhatIsNoDuration) {
  for (const char* text :
       {"", "s", "-5s", "5 s", "5x", "nan", "inf", "1e3", "5s!", "99999999999d"}) {
    EXPECT_FALSE(QVParseDuration(text)) << text;
  }
}

TEST_F(QVTimeTextTest, ReadsTimes) {
  EXPECT_EQ(QVParseTime("2026-11-21T06:20:01.25Z", 0), kNow);
  EXPECT_EQ(QVParseTime("2026-11-21T07:20:01.25+01:00", 0), kNow);
  EXPECT_EQ(QVParseTime("2026-11-21T02:50:01.25-0330", 0), kNow);
  for (const char* wrong : {"2026-11-21T07:20+1", "2026-11-21T07:20+15:00",
                            "2026-11-21T07:20+01:60", "2026-11-21T07:20+01:00Z"}) {
    EXPECT_FALSE(QVParseTime(wrong, 0)) << wrong;
  }
  EXPECT_EQ(QVParseTime("2026-11-21 08:20:01.25", 0), kNow);
  EXPECT_EQ(QVParseTime("2026-11-21 08:20", 0), kNow - kSecond - 250'000);
  EXPECT_EQ(QVParseTime("08:20:01", kNow), kNow - 250'000);
  EXPECT_EQ(QVParseTime("2026-11-21", 0), QVParseTime("today", kNow));
  EXPECT_EQ(QVParseTime("2026-11-20", 0), QVParseTime("yesterday", kNow));
  EXPECT_EQ(QVParseTime("now", kNow), kNow);
  EXPECT_EQ(QVParseTime("10m", kNow), kNow - 600 * kSecond);
  EXPECT_EQ(QVParseTime("@1795242001", 0), kNow - 250'000);
}

TEST_F(QVTimeTextTest, RefusesWhatIsNoTime) {
  for (const char* text :
       {"", "tomorrow", "2026-13-01", "2026-1-1", "2026-02-30", "2026-02-29", "2026-11-21 25:00",
        "@", "@x", "2026-11-21Tx", "08:61", "2026-11-21 08:20Zz", "08:20:01."}) {
    EXPECT_FALSE(QVParseTime(text, kNow)) << text;
  }
}

TEST_F(QVTimeTextTest, ReadsWhatNamesOfSummariesBeginWith) {
  EXPECT_EQ(QVParseStamp("20261121-062001+0000"), kNow - 250'000);
  EXPECT_EQ(QVParseStamp("20261121-082001+0200"), kNow - 250'000);
  EXPECT_EQ(QVParseStamp("20261120-225001-0730"), kNow - 250'000);
  for (const char* text : {"", "20261121-062001", "20261121-062001+00", "20261121-062001+00000",
                           "20261321-062001+0000", "20261121-252001+0000", "20261121 062001+0000",
                           "2026-1121-062001+000", "20261121-062001*0000", "20261121-0620-1+0000",
                           "20261121-062001+-100"}) {
    EXPECT_FALSE(QVParseStamp(text)) << text;
  }
}

TEST_F(QVTimeTextTest, WritesTimes) {
  EXPECT_EQ(QVLocalTimeText(kNow), "2026-11-21 08:20:01.250000");
  EXPECT_EQ(QVLocalTimeText(kNow, false), "2026-11-21 08:20:01");
  EXPECT_EQ(QVUniversalTimeText(kNow), "2026-11-21T06:20:01.250000Z");
  EXPECT_EQ(QVUniversalTimeText(-1), "1969-12-31T23:59:59.999999Z");
}

TEST_F(QVTimeTextTest, SaysHowLongSomethingHasBeen) {
  EXPECT_EQ(QVElapsedText(microseconds(5 * kSecond)), "5 s");
  EXPECT_EQ(QVElapsedText(microseconds(-kSecond)), "0 s");
  EXPECT_EQ(QVElapsedText(microseconds(720 * kSecond)), "12 min");
  EXPECT_EQ(QVElapsedText(microseconds(7320 * kSecond)), "2 h 2 min");
  EXPECT_EQ(QVElapsedText(microseconds((3 * 86'400 + 4 * 3600) * kSecond)), "3 d 4 h");
}

}  // namespace
