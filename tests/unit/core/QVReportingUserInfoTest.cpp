#include "QVServices/Statistics/QVReportingUserInfo.h"

#include <string>

#include <gtest/gtest.h>

namespace {

using enum QVReportingUserInfo::Addition;

class QVReportingUserInfoTest : public testing::Test {
 protected:
  static QVDictionary entry(const char* key, std::size_t bytes) {
    return {{key, std::string(bytes, 'x')}};
  }

  QVReportingUserInfoAccount account_{4'000};
};

TEST_F(QVReportingUserInfoTest, ReplacesEntriesOfTheSameKey) {
  QVReportingUserInfo info(account_);
  EXPECT_EQ(info.addEntries({{"a", 1}, {"b", 2}}), done);
  EXPECT_EQ(info.addEntries({{"b", 3}, {"c", 4}}), done);
  EXPECT_EQ(info.contents(), (QVDictionary{{"a", 1}, {"b", 3}, {"c", 4}}));
}

TEST_F(QVReportingUserInfoTest, TakesNoMoreThanIsLeftByTheOthers) {
  QVReportingUserInfo one(account_);
  QVReportingUserInfo two(account_);
  EXPECT_EQ(one.addEntries(entry("a", 3'000)), done);
  EXPECT_EQ(two.addEntries(entry("a", 2'000)), tooLargeForAll);
  EXPECT_TRUE(two.contents().empty());
  EXPECT_EQ(two.addEntries(entry("a", 500)), done);
}

TEST_F(QVReportingUserInfoTest, LeavesRoomAgainWhenItGoes) {
  QVReportingUserInfo stays(account_);
  {
    QVReportingUserInfo goes(account_);
    EXPECT_EQ(goes.addEntries(entry("a", 3'000)), done);
    EXPECT_EQ(stays.addEntries(entry("a", 3'000)), tooLargeForAll);
  }
  EXPECT_EQ(stays.addEntries(entry("a", 3'000)), done);
}

// As readers of the contents keep what they got, that counts, too.
TEST_F(QVReportingUserInfoTest, CountsWhatReadersKeep) {
  QVReportingUserInfo info(account_);
  EXPECT_EQ(info.addEntries(entry("a", 1'500)), done);
  QVDictionary kept = info.contents();
  EXPECT_EQ(info.addEntries(entry("a", 1'600)), done);
  EXPECT_EQ(info.addEntries(entry("a", 1'700)), tooLargeForAll);
  kept = {};
  EXPECT_EQ(info.addEntries(entry("a", 1'700)), done);
}

}  // namespace
