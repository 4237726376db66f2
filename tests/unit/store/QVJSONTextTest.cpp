#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/store/QVJSONText.h"

#include <cmath>
#include <limits>
#include <string>
#include <utility>

#include <gtest/gtest.h>

namespace {

std::string compact(const QVValue& value) {
  QVJSONText json;
  return std::string(json.write(value));
}

TEST(QVJSONText, WritesEachKindOfValue) {
  EXPECT_EQ(compact({}), "null");
  EXPECT_EQ(compact(true), "true");
  EXPECT_EQ(compact(false), "false");
  EXPECT_EQ(compact(-12), "-12");
  EXPECT_EQ(compact(std::numeric_limits<int64_t>::min()), "-9223372036854775808");
  EXPECT_EQ(compact(std::numeric_limits<uint64_t>::max()), "18446744073709551615");
  EXPECT_EQ(compact("text"), R"("text")");
  EXPECT_EQ(compact(""), R"("")");
  EXPECT_EQ(compact(QVArray{1, "two", QVArray{}}), R"([1,"two",[]])");
  EXPECT_EQ(compact(QVDictionary{{"b", 2}, {"a", QVDictionary{}}}), R"({"a":{},"b":2})");
}

TEST(QVJSONText, WritesAnAbsentDictionaryAsAnEmptyOne) {
  QVJSONText json;
  EXPECT_EQ(json.write(QVDictionary()), "{}");
}

TEST(QVJSONText, KeepsTheKindOfDoubles) {
  EXPECT_EQ(compact(12.0), "12.0");
  EXPECT_EQ(compact(0.0), "0.0");
  EXPECT_EQ(compact(-0.0), "-0.0");
  EXPECT_EQ(compact(44100.0), "44100.0");
  EXPECT_EQ(compact(100000.0), "100000.0");
  EXPECT_EQ(compact(-1.0), "-1.0");
  EXPECT_EQ(compact(9007199254740991.0), "9007199254740991.0");
  EXPECT_EQ(compact(9007199254740994.0), "9007199254740994.0");
  EXPECT_EQ(compact(99999999999999984.0), "99999999999999984.0");
}

TEST(QVJSONText, WritesDoublesAsTheShortestTextThatReadsBackEqual) {
  EXPECT_EQ(compact(0.1), "0.1");
  EXPECT_EQ(compact(1.0 / 3), "0.3333333333333333");
  EXPECT_EQ(compact(0.0001), "0.0001");
  EXPECT_EQ(compact(1e-5), "1e-05");
  EXPECT_EQ(compact(1e17), "1e+17");
  EXPECT_EQ(compact(-1.5e300), "-1.5e+300");
  EXPECT_EQ(compact(1e300), "1e+300");
  for (const double number : {0.1, 1e-300, 1e17, 2.5, 5e-324, 1.7976931348623157e308, 123456.789}) {
    QVJSONFailure failure;
    EXPECT_EQ(QVJSONFile::parse(compact(number), failure), QVValue(number));
  }
}

TEST(QVJSONText, QuotesNumbersThatJSONHasNoWordFor) {
  EXPECT_EQ(compact(QVArray{std::nan(""), std::numeric_limits<double>::infinity(),
                            QVDictionary{{"deep", -std::numeric_limits<double>::infinity()}}}),
            R"(["nan","inf",{"deep":"-inf"}])");
}

TEST(QVJSONText, EscapesWhatHasToBe) {
  EXPECT_EQ(compact("a\"b\\c\n\t\x01"), R"("a\"b\\c\n\t\u0001")");
  EXPECT_EQ(compact("\b\f\r\x1F\x7F"), "\"\\b\\f\\r\\u001F\x7F\"");
  EXPECT_EQ(compact(std::string_view("a\0b", 3)), R"("a\u0000b")");
  EXPECT_EQ(compact(QVDictionary{{"a\"b", 1}}), R"({"a\"b":1})");
}

TEST(QVJSONText, EscapesWhereverItStands) {
  for (const auto& [byte, escape] :
       {std::pair{'"', "\\\""}, std::pair{'\\', "\\\\"}, std::pair{'\x1F', "\\u001F"}}) {
    for (std::size_t size = 1; size < 20; ++size) {
      for (std::size_t place = 0; place < size; ++place) {
        std::string text(size, 'x');
        text[place] = byte;
        std::string expected(size - 1, 'x');
        expected.insert(place, escape);
        EXPECT_EQ(compact(text), '"' + expected + '"');
      }
    }
  }
  EXPECT_EQ(compact("\x7F !#[]^~\x7F"), "\"\x7F !#[]^~\x7F\"");
}

TEST(QVJSONText, LeavesUTF8AsItIs) {
  const std::string text = "gr\xC3\xBC\xC3\x9F \xE2\x82\xAC \xF0\x9F\x8E\xB5 abcdefgh";
  EXPECT_EQ(compact(text), '"' + text + '"');
  EXPECT_EQ(compact("\xF4\x8F\xBF\xBF\xED\x9F\xBF\xEE\x80\x80"),
            "\"\xF4\x8F\xBF\xBF\xED\x9F\xBF\xEE\x80\x80\"");
}

TEST(QVJSONText, ReplacesWhatIsNoUTF8) {
  const std::string mark = "\xEF\xBF\xBD";
  EXPECT_EQ(compact("\xFF"), '"' + mark + '"');
  EXPECT_EQ(compact("long enough before \xC3"), "\"long enough before " + mark + '"');
  EXPECT_EQ(compact("\xE2\x82 x"), '"' + mark + " x\"");    // a piece of a character
  EXPECT_EQ(compact("\xC0\xAF"), '"' + mark + mark + '"');  // overlong
  EXPECT_EQ(compact("\xE0\x80\x80"), '"' + mark + mark + mark + '"');
  EXPECT_EQ(compact("\xED\xA0\x80"), '"' + mark + mark + mark + '"');  // surrogate
  EXPECT_EQ(compact("\xF4\x90\x80\x80"), '"' + mark + mark + mark + mark + '"');
  EXPECT_EQ(compact("\xF0\x9F\x8E"), '"' + mark + '"');
  EXPECT_EQ(compact("a\x80z"), "\"a" + mark + "z\"");
  EXPECT_EQ(compact(QVDictionary{{"k\xFF", 1}}), "{\"k" + mark + "\":1}");
}

TEST(QVJSONText, WritesSmallTextsAfterLargeOnes) {
  QVJSONText json;
  const std::string large(1'000'000, 'x');
  EXPECT_EQ(json.write(QVValue(large)).size(), large.size() + 2);
  EXPECT_EQ(json.write(QVValue("small")), "\"small\"");
  EXPECT_EQ(json.write(QVValue(1)), "1");
}

}  // namespace
