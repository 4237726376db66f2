#include "platform/linux/bus/QVBusNames.h"
#include "platform/linux/bus/QVBusSignature.h"
#include "platform/linux/bus/QVBusText.h"

#include <string>

#include <gtest/gtest.h>

using namespace std::string_literals;

TEST(QVBusText, TakesPlainTextOfEveryLength) {
  for (std::size_t length = 0; length < 40; ++length) {
    EXPECT_TRUE(QVBusIsValidText(std::string(length, 'x'))) << length;
  }
}

TEST(QVBusText, FindsABadByteAtEveryPlaceOfEveryLength) {
  for (std::size_t length = 1; length < 40; ++length) {
    for (std::size_t at = 0; at < length; ++at) {
      for (const char bad : {'\0', '\x80', '\xff'}) {
        std::string text(length, 'x');
        text[at] = bad;
        EXPECT_FALSE(QVBusIsValidText(text)) << length << " " << at;
      }
    }
  }
}

TEST(QVBusText, TakesCharactersOfSeveralBytesAtEveryPlace) {
  for (const auto* character : {"\u00e4", "\u20ac", "\U0001f3a7"}) {
    for (std::size_t before = 0; before < 20; ++before) {
      for (std::size_t after = 0; after < 20; ++after) {
        const auto text = std::string(before, 'x') + character + std::string(after, 'x');
        EXPECT_TRUE(QVBusIsValidText(text)) << before << " " << after;
        EXPECT_FALSE(QVBusIsValidText(text.substr(0, before + 1))) << before;
      }
    }
  }
}

TEST(QVBusText, TakesTheLimitsOfEachLength) {
  EXPECT_TRUE(QVBusIsValidText("\x01\x7f"));
  EXPECT_TRUE(QVBusIsValidText("\xc2\x80\xdf\xbf"));
  EXPECT_TRUE(QVBusIsValidText("\xe0\xa0\x80\xed\x9f\xbf\xee\x80\x80\xef\xbf\xbf"));
  EXPECT_TRUE(QVBusIsValidText("\xf0\x90\x80\x80\xf4\x8f\xbf\xbf"));
}

TEST(QVBusText, RefusesWhatIsNotInShortestForm) {
  for (const auto* text : {"\xc0\xaf", "\xc1\xbf", "\xe0\x80\xaf", "\xe0\x9f\xbf",
                           "\xf0\x80\x80\xaf", "\xf0\x8f\xbf\xbf"}) {
    EXPECT_FALSE(QVBusIsValidText(text));
  }
}

TEST(QVBusText, RefusesSurrogatesAndWhatLiesAboveTheLastCharacter) {
  for (const auto* text :
       {"\xed\xa0\x80", "\xed\xbf\xbf", "\xf4\x90\x80\x80", "\xf5\x80\x80\x80", "\xfe", "\xff"}) {
    EXPECT_FALSE(QVBusIsValidText(text));
  }
}

TEST(QVBusText, RefusesSequencesThatAreBroken) {
  for (const auto* text : {"\xc2", "\xc2x", "\xe2\x82", "\xe2x\x80", "\xe2\x82x", "\xf0\x90\x80",
                           "\xf0x\x80\x80", "\xf0\x90x\x80", "\xf0\x90\x80x", "\x80"}) {
    EXPECT_FALSE(QVBusIsValidText(text));
    EXPECT_FALSE(QVBusIsValidText("some text before it "s + text));
  }
}

TEST(QVBusNames, TakesObjectPaths) {
  for (const auto* path : {"/", "/a", "/a/b", "/_/0", "/net/quillon/quietvox/ReportingService"}) {
    EXPECT_TRUE(QVBusIsValidObjectPath(path)) << path;
  }
  for (const auto* path : {"", "a", "a/b", "//", "/a/", "/a//b", "/a-b", "/a.b", "/\u00e4"}) {
    EXPECT_FALSE(QVBusIsValidObjectPath(path)) << path;
  }
}

TEST(QVBusNames, TakesInterfaceNames) {
  for (const auto* name : {"a.b", "a.b.c", "_a._9", "A.B9"}) {
    EXPECT_TRUE(QVBusIsValidInterfaceName(name)) << name;
  }
  for (const auto* name : {"", "a", ".a", "a.", "a..b", "a.9b", "9a.b", "a-b.c", "a.b c"}) {
    EXPECT_FALSE(QVBusIsValidInterfaceName(name)) << name;
  }
  EXPECT_TRUE(QVBusIsValidInterfaceName("a." + std::string(253, 'b')));
  EXPECT_FALSE(QVBusIsValidInterfaceName("a." + std::string(254, 'b')));
}

TEST(QVBusNames, TakesMemberNames) {
  for (const auto* name : {"a", "A9", "_", "SendMessage"}) {
    EXPECT_TRUE(QVBusIsValidMemberName(name)) << name;
  }
  for (const auto& name : {""s, "9a"s, "a.b"s, "a-b"s, "a b"s, "a\0b"s, "\u00e4"s}) {
    EXPECT_FALSE(QVBusIsValidMemberName(name)) << name;
  }
  EXPECT_TRUE(QVBusIsValidMemberName(std::string(255, 'b')));
  EXPECT_FALSE(QVBusIsValidMemberName(std::string(256, 'b')));
}

TEST(QVBusNames, TakesBusNames) {
  for (const auto* name : {":1.42", ":a-b.0", "a.b", "a-b.c", "-a.b", "_._"}) {
    EXPECT_TRUE(QVBusIsValidBusName(name)) << name;
  }
  for (const auto* name : {"", ":", ":1", "1.2", "a", "a.", ".a", "a.9", "a..b", ":1..2", "a.b!"}) {
    EXPECT_FALSE(QVBusIsValidBusName(name)) << name;
  }
  EXPECT_FALSE(QVBusIsValidBusName("a." + std::string(254, 'b')));
}

TEST(QVBusSignature, TakesWhatIsInOrderAndKnowsWhereTypesEnd) {
  QVBusSignature signature;
  ASSERT_TRUE(signature.parse("a{sv}uqbax(i(st)av)"));
  EXPECT_FALSE(signature.isSingleType());
  EXPECT_EQ(signature.endOf(0), 5U);
  EXPECT_EQ(signature.endOf(1), 5U);
  EXPECT_EQ(signature.endOf(3), 4U);
  EXPECT_EQ(signature.endOf(8), 10U);
  EXPECT_EQ(signature.endOf(10), 19U);
  EXPECT_EQ(signature.endOf(12), 16U);
  ASSERT_TRUE(signature.parse("aaa{s(ii)}"));
  EXPECT_TRUE(signature.isSingleType());
  ASSERT_TRUE(signature.parse(""));
  EXPECT_FALSE(signature.isSingleType());
}

TEST(QVBusSignature, RefusesWhatBreaksTheGrammar) {
  QVBusSignature signature;
  for (const auto& text :
       {"z"s,    "a"s,    "ia"s,     "("s,     "()"s,      "(i"s,   "i)"s,  ")"s,
        "{sv}"s, "a{s}"s, "a{svv}"s, "a{vs}"s, "a{(i)s}"s, "a{sv"s, "a{"s,  "a{s"s,
        "a{}"s,  "(a)"s,  "r"s,      "e"s,     "m"s,       "*"s,    "i\0i"s}) {
    EXPECT_FALSE(signature.parse(text)) << text;
  }
}

TEST(QVBusSignature, HoldsToTheLimitsOfDepthAndLength) {
  QVBusSignature signature;
  EXPECT_TRUE(signature.parse(std::string(32, 'a').append("i")));
  EXPECT_FALSE(signature.parse(std::string(33, 'a').append("i")));
  EXPECT_TRUE(signature.parse(std::string(32, '(').append("i").append(32, ')')));
  EXPECT_FALSE(signature.parse(std::string(33, '(').append("i").append(33, ')')));
  EXPECT_TRUE(signature.parse(std::string(255, 'i')));
  EXPECT_FALSE(signature.parse(std::string(256, 'i')));
  // One after the other is not one in the other.
  std::string row;
  for (int i = 0; i < 50; ++i) row += "(ai)";
  EXPECT_TRUE(signature.parse(row));
}
