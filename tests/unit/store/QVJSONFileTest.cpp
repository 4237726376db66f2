#include "platform/linux/files/QVJSONFile.h"
#include "tests/support/QVTemporaryRoot.h"

#include <cmath>
#include <filesystem>
#include <fstream>
#include <limits>
#include <string>

#include <gtest/gtest.h>
#include <sys/stat.h>

namespace {

QVValue parsed(std::string_view text) {
  QVJSONFailure failure;
  const std::optional<QVValue> value = QVJSONFile::parse(text, failure);
  EXPECT_TRUE(value.has_value()) << text << ": " << failure.description();
  return value.value_or(QVValue());
}

QVJSONFailure failureOf(std::string_view text) {
  QVJSONFailure failure;
  EXPECT_EQ(QVJSONFile::parse(text, failure), std::nullopt) << text;
  return failure;
}

TEST(QVJSONFile, ReadsEachKindOfValue) {
  EXPECT_EQ(parsed("null"), QVValue());
  EXPECT_EQ(parsed(" true "), QVValue(true));
  EXPECT_EQ(parsed("-12"), QVValue(-12));
  EXPECT_EQ(parsed("12.0"), QVValue(12.0));
  EXPECT_EQ(parsed("1e2"), QVValue(100.0));
  EXPECT_EQ(parsed("-9223372036854775808"), QVValue(std::numeric_limits<int64_t>::min()));
  EXPECT_EQ(parsed("18446744073709551615"), QVValue(std::numeric_limits<uint64_t>::max()));
  EXPECT_EQ(parsed("18446744073709551616"), QVValue(18446744073709551616.0));
  EXPECT_EQ(parsed("0.1"), QVValue(0.1));
  EXPECT_EQ(parsed(R"("a\u0000\u00e4\ud83c\udfb5\n")"),
            QVValue(std::string_view("a\0\xC3\xA4\xF0\x9F\x8E\xB5\n", 9)));
  EXPECT_EQ(parsed(R"([1, "two", [], {}])"), QVValue(QVArray{1, "two", QVArray{}, QVDictionary{}}));
  EXPECT_EQ(parsed(R"({"b": {"c": [1]}, "a": 2})"),
            QVValue(QVDictionary{{"a", 2}, {"b", QVDictionary{{"c", QVArray{1}}}}}));
}

TEST(QVJSONFile, TakesTheLaterOfEqualKeys) {
  EXPECT_EQ(parsed(R"({"a": 1, "b": 2, "a": 3})"), QVValue(QVDictionary{{"a", 3}, {"b", 2}}));
}

TEST(QVJSONFile, SaysWhereATextIsNoJSON) {
  const QVJSONFailure failure = failureOf("{\n  \"a\": 1,\n  \"b\": oops\n}");
  EXPECT_EQ(failure.line, 3U);
  EXPECT_EQ(failure.column, 8U);
  EXPECT_EQ(failure.description(), "line 3, column 8: Invalid value.");
  EXPECT_FALSE(failure.missing);
}

TEST(QVJSONFile, CountsLinesAndColumnsFromOne) {
  EXPECT_EQ(failureOf("").description(), "line 1, column 1: The document is empty.");
  EXPECT_EQ(failureOf("x").description(), "line 1, column 1: Invalid value.");
  EXPECT_EQ(failureOf("\nx").line, 2U);
  EXPECT_EQ(failureOf("\nx").column, 1U);
}

TEST(QVJSONFile, RefusesWhatIsNotQuiteJSON) {
  for (const char* text : {"{",          "[1,]", "{\"a\"}",  "{\"a\":1,}",       "{a:1}",
                           "// note\n1", "1 2",  "NaN",      "Infinity",         "01",
                           "+1",         ".5",   "1e999",    "\"\\x\"",          "\"\n\"",
                           "\"open",     "'a'",  "\"\xFF\"", "\"\xED\xA0\x80\"", "\"\\ud800\"",
                           "tru"}) {
    EXPECT_NE(failureOf(text).line, 0U) << text;
  }
}

TEST(QVJSONFile, RefusesHalvesOfSurrogatePairs) {
  for (const char* text : {R"("\udfb5")", R"("a\udc00b")", R"("\ud83c")", R"("\ud83cx")",
                           R"({"\udfb5": 1})", R"(["\udfb5\ud83c"])"}) {
    EXPECT_EQ(failureOf(text).reason, "The surrogate pair in string is invalid.") << text;
  }
  EXPECT_EQ(parsed(R"("\ud7ff\ue000")"), QVValue("\xED\x9F\xBF\xEE\x80\x80"));
}

TEST(QVJSONFile, RefusesNumbersThatNoDoubleHolds) {
  for (const char* text : {"2e308", "-2e308", "581e308", "1e309", "1e999", "1.8e308",
                           "[1e2147483647]", "1e99999999999999999999"}) {
    EXPECT_EQ(failureOf(text).reason, "Number too big to be stored in double.") << text;
  }
  EXPECT_EQ(failureOf("2" + std::string(308, '0')).reason,
            "Number too big to be stored in double.");
}

TEST(QVJSONFile, ReadsNumbersAtTheEdges) {
  EXPECT_EQ(parsed("1.7976931348623157e308"), QVValue(std::numeric_limits<double>::max()));
  EXPECT_EQ(parsed("1" + std::string(308, '0')), QVValue(1e308));
  EXPECT_EQ(parsed("5e-324"), QVValue(5e-324));
  EXPECT_EQ(parsed("2.2250738585072014E-308"), QVValue(std::numeric_limits<double>::min()));
  EXPECT_EQ(parsed("1e-999"), QVValue(0.0));
  EXPECT_EQ(parsed("0." + std::string(400, '0') + "1"), QVValue(0.0));
  EXPECT_EQ(parsed("-0"), QVValue(0));
  EXPECT_EQ(parsed("9223372036854775808"), QVValue(uint64_t{1} << 63));
  EXPECT_EQ(parsed("-9223372036854775809"), QVValue(-9223372036854775808.0));
  // Halfway between two doubles, and a little more: the digits decide, however many there are.
  EXPECT_EQ(parsed("9007199254740993.0"), QVValue(9007199254740992.0));
  EXPECT_EQ(parsed("9007199254740993." + std::string(800, '0') + "1"), QVValue(9007199254740994.0));
}

TEST(QVJSONFile, RefusesBytesAfterAnEndThatTheyPretend) {
  EXPECT_EQ(failureOf(std::string_view("1\0", 2)).line, 1U);
}

TEST(QVJSONFile, LimitsNesting) {
  const auto nested = [](std::size_t depth) {
    return std::string(depth, '[') + std::string(depth, ']');
  };
  EXPECT_EQ(parsed(nested(QVJSONFile::kMaximumDepth)).kind(), QVValue::Kind::array);
  const QVJSONFailure failure = failureOf(nested(QVJSONFile::kMaximumDepth + 1));
  EXPECT_EQ(failure.reason, "nested deeper than 64");
  EXPECT_EQ(failure.line, 1U);
  // Far more than a stack could take.
  EXPECT_EQ(failureOf(std::string(1'000'000, '[')).reason, "nested deeper than 64");
  std::string objects;
  for (int i = 0; i < 65; ++i) objects += "{\"a\":";
  EXPECT_EQ(failureOf(objects).reason, "nested deeper than 64");
}

class QVJSONFileOnDisk : public ::testing::Test {
 protected:
  std::string write(const std::string& text) {
    const std::string path = (root_.path() / "file.json").string();
    std::ofstream(path, std::ios::binary) << text;
    return path;
  }
  const QVTemporaryRoot root_;
  QVJSONFailure failure_;
};

TEST_F(QVJSONFileOnDisk, ReadsAFile) {
  EXPECT_EQ(QVJSONFile::readDictionary(write(R"({"a": 1})"), failure_), (QVDictionary{{"a", 1}}));
  std::string large = "[0";
  for (int i = 0; i < 50'000; ++i) large += ",\n 1";
  const std::optional<QVValue> value = QVJSONFile::read(write(large + "]"), failure_);
  ASSERT_NE(value, std::nullopt);
  EXPECT_EQ(value->array().size(), 50'001U);
}

TEST_F(QVJSONFileOnDisk, TellsAMissingFileFromABadOne) {
  EXPECT_EQ(QVJSONFile::read((root_.path() / "none.json").string(), failure_), std::nullopt);
  EXPECT_TRUE(failure_.missing);
  EXPECT_EQ(failure_.description(), "No such file or directory");
  const std::string path = write("{");
  EXPECT_EQ(QVJSONFile::read(path, failure_), std::nullopt);
  EXPECT_FALSE(failure_.missing);
  EXPECT_EQ(QVJSONFile::read(path + "/below.json", failure_), std::nullopt);
  EXPECT_TRUE(failure_.missing);
}

TEST_F(QVJSONFileOnDisk, WantsAnObjectWhereOneIsNeeded) {
  EXPECT_EQ(QVJSONFile::readDictionary(write("[1]"), failure_), std::nullopt);
  EXPECT_EQ(failure_.description(), "line 1, column 1: not an object");
}

TEST_F(QVJSONFileOnDisk, RefusesWhatIsNoRegularFile) {
  EXPECT_EQ(QVJSONFile::read(root_.path().string(), failure_), std::nullopt);
  EXPECT_EQ(failure_.reason, "not a regular file");
  const std::string pipe = (root_.path() / "pipe").string();
  ASSERT_EQ(mkfifo(pipe.c_str(), 0600), 0);
  EXPECT_EQ(QVJSONFile::read(pipe, failure_), std::nullopt) << "and does not wait for a writer";
  EXPECT_EQ(failure_.reason, "not a regular file");
}

TEST_F(QVJSONFileOnDisk, LimitsTheFilesSize) {
  const std::string fitting = '"' + std::string(QVJSONFile::kMaximumBytes - 2, 'x') + '"';
  EXPECT_NE(QVJSONFile::read(write(fitting), failure_), std::nullopt);
  EXPECT_EQ(QVJSONFile::read(write(fitting + ' '), failure_), std::nullopt);
  EXPECT_EQ(failure_.reason, "larger than 4194304 bytes");
}

}  // namespace
