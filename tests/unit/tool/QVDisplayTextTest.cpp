#include "tools/qvctl/QVDisplayText.h"

#include <gtest/gtest.h>

namespace {

TEST(QVDisplayTextTest, LeavesTextAsItIs) {
  for (const char* text : {"", "plain", "grüß", "日本", "e\xCC\x81", "😀"}) {
    EXPECT_EQ(QVDisplayText(text), text);
    EXPECT_EQ(QVDisplayJSON(text), text);
  }
}

TEST(QVDisplayTextTest, WritesControlCharactersOut) {
  EXPECT_EQ(QVDisplayText("a\nb\tc\rd"), "a\\nb\\tc\\rd");
  EXPECT_EQ(QVDisplayText("\033[2J\x07\x7F"), "\\x1B[2J\\x07\\x7F");
  // The one-byte form of "escape [", as a character.
  EXPECT_EQ(QVDisplayText("\xC2\x9B"), "\\u009B");
  EXPECT_EQ(QVDisplayText(std::string_view("\0", 1)), "\\x00");
}

TEST(QVDisplayTextTest, WritesChangesOfDirectionOut) {
  EXPECT_EQ(QVDisplayText("a\xE2\x80\xAE"
                          "b"),
            "a\\u202Eb");
  EXPECT_EQ(QVDisplayText("\xE2\x81\xA6"), "\\u2066");
  EXPECT_EQ(QVDisplayText("\xE2\x80\x8B"), "\\u200B");
}

TEST(QVDisplayTextTest, WritesInvisibleCharactersOut) {
  EXPECT_EQ(QVDisplayText("\u00AD\u180E\u3164"), "\\u00AD\\u180E\\u3164");
  EXPECT_EQ(QVDisplayText("\U000E0041"), "\\uE0041");
  EXPECT_EQ(QVDisplayJSON("\"\U000E0041\u00AD\""), R"("\udb40\udc41\u00ad")");
}

TEST(QVDisplayTextTest, WritesBytesThatAreNoTextOut) {
  EXPECT_EQ(QVDisplayText("\xFF"), "\\xFF");
  EXPECT_EQ(QVDisplayText("\xC3"), "\\xC3");
  EXPECT_EQ(QVDisplayText("\xC0\x80"), "\\xC0\\x80");
  EXPECT_EQ(QVDisplayText("\xED\xA0\x80"), "\\xED\\xA0\\x80");
  EXPECT_EQ(QVDisplayText("\xF4\x90\x80\x80"), "\\xF4\\x90\\x80\\x80");
  EXPECT_EQ(QVDisplayText("\xE2\x82z"), "\\xE2\\x82z");
}

TEST(QVDisplayTextTest, KeepsJSONWhatItIs) {
  EXPECT_EQ(QVDisplayJSON("{\"a\":\"\xC2\x9B\xE2\x80\xAE\"}"), R"({"a":"\u009b\u202e"})");
}

TEST(QVDisplayTextTest, KnowsWhereTextThatComesInPartsCanBeCut) {
  const std::string text = "aß日𝄞";
  const std::vector<std::size_t> whole{0, 1, 1, 3, 3, 3, 6, 6, 6, 6, 10};
  ASSERT_EQ(text.size() + 1, whole.size());
  for (std::size_t i = 0; i < whole.size(); ++i) {
    EXPECT_EQ(QVWholeCharacters(text.substr(0, i)), whole[i]) << i;
  }
  // What is no UTF-8 at all is not waited for.
  EXPECT_EQ(QVWholeCharacters("\x80\x80\x80\x80"), 4U);
  EXPECT_EQ(QVWholeCharacters("a\x80"), 2U);
}

TEST(QVDisplayTextTest, KnowsHowWideTextIs) {
  EXPECT_EQ(QVDisplayWidth("plain"), 5U);
  EXPECT_EQ(QVDisplayWidth("grüß"), 4U);
  EXPECT_EQ(QVDisplayWidth("日本"), 4U);
  EXPECT_EQ(QVDisplayWidth("e\xCC\x81"), 1U);
}

TEST(QVDisplayTextTest, ClipsText) {
  EXPECT_EQ(QVClippedText("plain", 5), "plain");
  EXPECT_EQ(QVClippedText("plainer", 5), "plai…");
  EXPECT_EQ(QVClippedText("日本語", 6), "日本語");
  EXPECT_EQ(QVClippedText("日本語", 5), "日本…");
  EXPECT_EQ(QVClippedText("日本語", 4), "日…");
  EXPECT_EQ(QVClippedText("日本語", 1), "…");
  EXPECT_EQ(QVClippedText("text", 0), "");
}

}  // namespace
