#include "platform/QVText.h"

#include <cmath>
#include <cstdlib>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace {

TEST(QVText, WritesIntegersInDecimal) {
  EXPECT_EQ(QVText(0), "0");
  EXPECT_EQ(QVText(-1), "-1");
  EXPECT_EQ(QVText(INT64_MIN), "-9223372036854775808");
  EXPECT_EQ(QVText(UINT64_MAX), "18446744073709551615");
  EXPECT_EQ(QVText(int8_t{-128}, ' ', uint8_t{255}, ' ', int16_t{-1}, ' ', uint16_t{65535}),
            "-128 255 -1 65535");
  EXPECT_EQ(QVText(uint32_t{4294967295}), "4294967295");
}

TEST(QVText, WritesBooleansAsDigits) {
  EXPECT_EQ(QVText(true, false), "10");
}

TEST(QVText, WritesTextAsItIs) {
  EXPECT_EQ(QVText("a", std::string("b"), std::string_view("c"), 'd'), "abcd");
  EXPECT_EQ(QVText(), "");
}

TEST(QVText, WritesNothingAsNull) {
  EXPECT_EQ(QVText(std::optional<std::string>()), "(null)");
  EXPECT_EQ(QVText(std::optional<std::string_view>("there")), "there");
  EXPECT_EQ(QVText(QVValue()), "(null)");
}

TEST(QVText, WritesDoublesAsTheShortestTextThatReadsBackEqual) {
  const std::vector<std::pair<double, std::string>> texts{
      {0.0, "0"},
      {12.0, "12"},
      {0.1, "0.1"},
      {100000.0, "100000"},
      {-2.5, "-2.5"},
      {1.0 / 3.0, "0.3333333333333333"},
      {0.1 + 0.2, "0.30000000000000004"},
      {1e16, "10000000000000000"},
      {9007199254740993.0, "9007199254740992"},
      {1e300, "1e+300"},
      {5e-324, "5e-324"},
      {std::numeric_limits<double>::max(), "1.7976931348623157e+308"}};
  for (const auto& [value, text] : texts) {
    EXPECT_EQ(QVText(value), text);
    EXPECT_EQ(std::strtod(text.c_str(), nullptr), value) << text;
  }
}

TEST(QVText, WritesFixedNotationBetweenItsLimits) {
  EXPECT_EQ(QVText(1e-4), "0.0001");
  EXPECT_EQ(QVText(std::nextafter(1e-4, 0.0)), "9.999999999999999e-05");
  EXPECT_EQ(QVText(-1e-4), "-0.0001");
  EXPECT_EQ(QVText(1e-5), "1e-05");
  EXPECT_EQ(QVText(std::nextafter(1e17, 0.0)), "99999999999999984");
  EXPECT_EQ(QVText(1e17), "1e+17");
  EXPECT_EQ(QVText(-1e17), "-1e+17");
  EXPECT_EQ(QVText(123456789012345680.0), "1.2345678901234568e+17");
}

TEST(QVText, WritesNumbersThatAreNone) {
  EXPECT_EQ(QVText(std::nan("")), "nan");
  EXPECT_EQ(QVText(-std::nan("")), "nan");
  EXPECT_EQ(QVText(std::numeric_limits<double>::infinity()), "inf");
  EXPECT_EQ(QVText(-std::numeric_limits<double>::infinity()), "-inf");
  EXPECT_EQ(QVText(-0.0), "-0");
}

TEST(QVText, WritesContainersAsCompactJSON) {
  const QVDictionary nested{
      {"z", QVArray{1, 2.5, "text", true, QVValue()}},
      {"a", QVDictionary{{"inner", QVDictionary(std::initializer_list<QVDictionaryEntry>{})}}},
      {"n", std::nan("")}};
  EXPECT_EQ(QVText(nested), R"({"a":{"inner":{}},"n":nan,"z":[1,2.5,"text",true,null]})");
  EXPECT_EQ(QVText(QVValue(nested)), QVText(nested));
  EXPECT_EQ(QVText(QVArray()), "[]");
  EXPECT_EQ(QVText(QVDictionary()), "{}");
  EXPECT_EQ(QVText(QVArray{false, "(null)"}), R"j([false,"(null)"])j");
}

TEST(QVText, QuotesStringsInsideOfContainersOnly) {
  EXPECT_EQ(QVText(QVValue("a \"b\"")), "a \"b\"");
  EXPECT_EQ(QVText(QVArray{"a \"b\""}), "[\"a \\\"b\\\"\"]");
}

TEST(QVText, EscapesWhatJSONCannotHold) {
  std::string out;
  QVAppendJSONString(out, std::string_view("\"\\\n\r\t\b\f\0\x1f/\x7fé", 13));
  EXPECT_EQ(out, "\"\\\"\\\\\\n\\r\\t\\u0008\\u000c\\u0000\\u001f/\x7fé\"");
}

TEST(QVText, EscapesKeys) {
  EXPECT_EQ(QVText(QVDictionary{{"a\nb", 1}}), R"({"a\nb":1})");
}

}  // namespace
