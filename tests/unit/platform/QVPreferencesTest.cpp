#include "platform/QVPreferences.h"

#include <cmath>

#include <gtest/gtest.h>

namespace {

bool boolean(const QVValue& value) {
  return QVPreferences::booleanReading(&value);
}
std::optional<std::string> string(const QVValue& value) {
  return QVPreferences::stringReading(&value);
}

TEST(QVPreferences, ReadsBooleansFromBooleansAndNumbers) {
  EXPECT_TRUE(boolean(true));
  EXPECT_FALSE(boolean(false));
  EXPECT_TRUE(boolean(1));
  EXPECT_TRUE(boolean(-1));
  EXPECT_FALSE(boolean(0));
  EXPECT_TRUE(boolean(0.001));
  EXPECT_FALSE(boolean(-0.0));
  EXPECT_TRUE(boolean(UINT64_MAX));
  EXPECT_TRUE(boolean(std::nan("")));
}

TEST(QVPreferences, ReadsBooleansFromThreeWordsInAnyCase) {
  for (const char* word : {"true", "TRUE", "tRuE", "yes", "YES", "Yes", "1"}) {
    EXPECT_TRUE(boolean(word)) << word;
  }
  for (const char* word :
       {"", "no", "false", "on", "y", "t", "11", "1.0", " true", "true ", "truee", "tru", "0"}) {
    EXPECT_FALSE(boolean(word)) << word;
  }
}

TEST(QVPreferences, ReadsEverythingElseAsFalse) {
  EXPECT_FALSE(QVPreferences::booleanReading(nullptr));
  EXPECT_FALSE(boolean(QVValue()));
  EXPECT_FALSE(boolean(QVArray{true}));
  EXPECT_FALSE(boolean(QVDictionary{{"true", true}}));
}

TEST(QVPreferences, ReadsStringsFromStringsAndNumbers) {
  EXPECT_EQ(string("Kitchen"), "Kitchen");
  EXPECT_EQ(string(""), "");
  EXPECT_EQ(string(12), "12");
  EXPECT_EQ(string(0.5), "0.5");
  EXPECT_EQ(string(UINT64_MAX), "18446744073709551615");
}

TEST(QVPreferences, ReadsNoStringFromTheRest) {
  EXPECT_EQ(QVPreferences::stringReading(nullptr), std::nullopt);
  EXPECT_EQ(string(QVValue()), std::nullopt);
  EXPECT_EQ(string(QVArray{"Kitchen"}), std::nullopt);
  EXPECT_EQ(string(QVDictionary{{"name", "Kitchen"}}), std::nullopt);
}

}  // namespace
