// Summaries, which are read part by part.

#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVSummaryFile.h"
#include "tools/qvctl/QVSummaryNumbers.h"
#include "tools/qvctl/QVToolFailure.h"

#include <fstream>
#include <string>
#include <tuple>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using ::testing::ElementsAre;
using ::testing::FieldsAre;
using ::testing::IsEmpty;

// Larger than a part of a file.
constexpr std::size_t kLong = 200'000;

class QVSummaryFileTest : public testing::Test {
 protected:
  using Numbers = std::vector<std::tuple<std::string, int64_t, double>>;

  QVSummaryFile fileOf(const std::string& text) const {
    const auto path = root_.path() / "file.json";
    std::ofstream(path) << text;
    return QVSummaryFile::choose(root_.path(), path);
  }
  // What is wrong with the text; empty where nothing is.
  std::string failureOf(const std::string& text) const {
    const QVSummaryFile file = fileOf(text);
    try {
      file.check();
    } catch (const QVToolFailure& failure) {
      EXPECT_EQ(failure.status(), QVToolStatus::failed);
      const std::string what = failure.what();
      EXPECT_TRUE(what.starts_with(file.path().string() + ": ")) << what;
      return what.substr(file.path().string().size() + 2);
    }
    return {};
  }
  Numbers numbersOf(const std::string& text, int64_t messages) const {
    Numbers found;
    QVSummaryNumbers numbers([&found](const std::string& key, int64_t message, double number) {
      found.emplace_back(key, message, number);
    });
    fileOf(text).scan(numbers);
    EXPECT_EQ(numbers.messages(), messages) << text;
    return found;
  }

  const QVTemporaryRoot root_;
};

TEST_F(QVSummaryFileTest, IsAnArrayOfAnything) {
  for (const char* text :
       {"[]", " [ ] \n", "[{}]", R"([null, true, -1.5e300, "a\u00e4\n", [[]], {"a": {}}])"}) {
    EXPECT_EQ(failureOf(text), "") << text;
  }
}

TEST_F(QVSummaryFileTest, SaysWhereItIsBroken) {
  EXPECT_EQ(failureOf("[{},\n{]"), "line 2, column 2: Missing a name for object member.");
  EXPECT_EQ(failureOf("[1]\n\n x"),
            "line 3, column 2: The document root must not be followed by "
            "other values.");
  for (const std::string& text :
       {std::string("{}"), std::string("1"), std::string("null"), std::string("\"[]\""),
        std::string(""), std::string("["), std::string("[1"), std::string("[1,]"),
        std::string("[01]"), std::string("[\"\xFF\"]"), std::string("[nan]"),
        std::string("[1]\0[2]", 7), std::string("[1\0]", 4)}) {
    EXPECT_NE(failureOf(text), "") << text;
  }
  EXPECT_EQ(failureOf("{\"a\": 1}"), "line 1, column 1: no JSON array");
}

TEST_F(QVSummaryFileTest, SaysWhereItIsBrokenFarBehind) {
  std::string text = "[\n" + std::string(kLong, ' ') + "1,\n\n";
  text.append("\"").append(kLong, 'x').append("\" x]");
  EXPECT_EQ(failureOf(text), "line 4, column " + std::to_string(kLong + 4) +
                                 ": Missing a comma or ']' after an array element.");
}

TEST_F(QVSummaryFileTest, IsNotReadTooDeeply) {
  const auto nested = [](std::size_t depth) {
    return std::string(depth, '[') + std::string(depth, ']');
  };
  EXPECT_EQ(failureOf(nested(64)), "");
  EXPECT_EQ(failureOf(nested(65)), "line 1, column 65: nested deeper than 64");
}

TEST_F(QVSummaryFileTest, IsNotReadWhereItIsNoFile) {
  const QVSummaryFile directory = QVSummaryFile::choose(root_.path(), root_.path());
  EXPECT_THROW(directory.check(), QVToolFailure);
  EXPECT_THROW(directory.read([](std::string_view /*part*/) {}), QVToolFailure);
}

TEST_F(QVSummaryFileTest, ComesInPartsOfWholeCharacters) {
  std::string text;
  while (text.size() < kLong) text.append("日本語𝄞");
  for (const std::size_t shift : {0U, 1U, 2U, 3U}) {
    const std::string whole = std::string(shift, ' ') + text + "\xE6";
    std::string together;
    std::size_t parts = 0;
    fileOf(whole).read([&](std::string_view part) {
      // Each begins where a character does.
      EXPECT_NE(static_cast<unsigned char>(part[0]) & 0xC0U, 0x80U);
      together.append(part);
      ++parts;
    });
    EXPECT_EQ(together, whole);
    EXPECT_GT(parts, 3U);
  }
}

TEST_F(QVSummaryFileTest, HasTheNumbersOfItsMessages) {
  EXPECT_THAT(numbersOf(R"([{"rate": 48000},
      {"Session_Playback_Start_1": {"frames": 480, "on": true, "route": "speaker", "x": null}},
      {"Session_Playback_Start_2": {"off": false, "list": [1, {"deep": 2}], "load": 0.25}},
      {"Undefined_Unknown_1": {"QV_Session_Summary_Event": "1", "frames": "480"}}])",
                        2),
              ElementsAre(FieldsAre("frames", 1, 480.0), FieldsAre("on", 1, 1.0),
                          FieldsAre("off", 2, 0.0), FieldsAre("load", 2, 0.25)));
}

TEST_F(QVSummaryFileTest, HasNoNumbersElsewhere) {
  EXPECT_THAT(numbersOf(R"([{"a": {"b": 1}}])", 0), IsEmpty());
  EXPECT_THAT(numbersOf(R"([{}, 1, "a", null, true, [2, [3, [4]]], {"a": 5, "b": [6]}])", 0),
              IsEmpty());
  EXPECT_THAT(numbersOf(R"([1, {"a": {"b": 2}}])", 1), ElementsAre(FieldsAre("b", 1, 2.0)));
  EXPECT_THAT(numbersOf(R"([{}, {"a": {"b": 2e308, "c": 1e-999}, "d": {"b": 2}}])", 2),
              ElementsAre(FieldsAre("c", 1, 0.0), FieldsAre("b", 2, 2.0)));
}

}  // namespace
