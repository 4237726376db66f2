#include "tools/qvctl/QVNames.h"

#include <gtest/gtest.h>

namespace {

TEST(QVNamesTest, KnowServiceTypes) {
  EXPECT_EQ(QVServiceTypeText(2), "telephony");
  EXPECT_EQ(QVServiceTypeText(65535), "unknown");
  EXPECT_EQ(QVServiceTypeText(4711), "4711");
  EXPECT_EQ(QVParseServiceType("telephony"), 2);
  EXPECT_EQ(QVParseServiceType("Telephony"), 2);
  EXPECT_EQ(QVParseServiceType("2"), 2);
  EXPECT_EQ(QVParseServiceType("0x2"), 2);
  EXPECT_EQ(QVParseServiceType("65534"), 65534);
  EXPECT_EQ(QVParseServiceType("unknown"), 65535);
  for (const char* text : {"", "phone", "65536", "-1", "2x"})
    EXPECT_FALSE(QVParseServiceType(text));
}

TEST(QVNamesTest, KnowCategories) {
  EXPECT_EQ(QVCategoryText(0x08000003), "Session.Playback");
  EXPECT_EQ(QVCategoryText(3), "Playback");
  EXPECT_EQ(QVCategoryText(0x80000000), "Toolbox.Undefined");
  EXPECT_EQ(QVCategoryText(0xFFFFFFFF), "Summary");
  // Two components, an unknown kind.
  EXPECT_EQ(QVCategoryText(0x18000003), "0x18000003");
  EXPECT_EQ(QVCategoryText(0x0800000C), "0x0800000C");
  EXPECT_EQ(QVCategoryText(12), "12");
  EXPECT_EQ(QVParseCategory("Session.Playback"), 0x08000003U);
  EXPECT_EQ(QVParseCategory("session_playback"), 0x08000003U);
  EXPECT_EQ(QVParseCategory("dsp.Error"), 0x10000008U);
  EXPECT_EQ(QVParseCategory("Playback"), 3U);
  EXPECT_EQ(QVParseCategory("Undefined"), 0U);
  EXPECT_EQ(QVParseCategory("Summary"), 0xFFFFFFFFU);
  EXPECT_EQ(QVParseCategory("0x12340003"), 0x12340003U);
  EXPECT_EQ(QVParseCategory("134217731"), 0x08000003U);
  for (const char* text : {"", "Session", "Session.", ".Playback", "Nothing.Playback",
                           "Session.Nothing", "Session.Playback.Start", "4294967296"}) {
    EXPECT_FALSE(QVParseCategory(text)) << text;
  }
}

TEST(QVNamesTest, GiveBackEveryNameThatTheyWrite) {
  for (uint32_t component : {0U, 0x08000000U, 0x10000000U, 0x20000000U, 0x40000000U, 0x80000000U}) {
    for (uint32_t kind = 0; kind < 20; ++kind) {
      EXPECT_EQ(QVParseCategory(QVCategoryText(component | kind)), component | kind);
    }
  }
  for (uint32_t number = 0; number <= 65535; ++number) {
    const auto value = static_cast<uint16_t>(number);
    ASSERT_EQ(QVParseServiceType(QVServiceTypeText(value)), value);
    ASSERT_EQ(QVParseMessageType(QVMessageTypeText(value)), value);
  }
}

TEST(QVNamesTest, KnowMessageTypes) {
  EXPECT_EQ(QVMessageTypeText(1), "Start");
  EXPECT_EQ(QVMessageTypeText(65535), "Unknown");
  EXPECT_EQ(QVMessageTypeText(6), "6");
  EXPECT_EQ(QVParseMessageType("issuedetector"), 5);
  EXPECT_EQ(QVParseMessageType("5"), 5);
  EXPECT_FALSE(QVParseMessageType("Undefined"));
}

TEST(QVNamesTest, MakePatternsOfCategories) {
  const auto both = QVCategoryPattern::parse("Session.Playback");
  ASSERT_TRUE(both);
  EXPECT_TRUE(both->matches(0x08000003));
  EXPECT_FALSE(both->matches(0x10000003));
  EXPECT_TRUE(both->matchesKind(3));
  EXPECT_FALSE(both->matchesKind(2));
  const auto kind = QVCategoryPattern::parse("Playback");
  ASSERT_TRUE(kind);
  EXPECT_TRUE(kind->matches(0x10000003));
  EXPECT_FALSE(kind->matches(0x10000002));
  const auto component = QVCategoryPattern::parse("session");
  ASSERT_TRUE(component);
  EXPECT_TRUE(component->matches(0x08000007));
  EXPECT_FALSE(component->matches(0x10000007));
  EXPECT_FALSE(QVCategoryPattern::parse("Nothing"));
}

}  // namespace
