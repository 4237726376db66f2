#include "platform/fake/QVFakeJSONOutput.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/output/QVRapidJSONOutput.h"

#include <cmath>
#include <limits>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

template <class Output>
class QVJSONOutputContract : public testing::Test {
 protected:
  std::unique_ptr<QVJSONArrayStream> makeStream() {
    return output_.makeArrayStream([this](std::string_view text) { text_ += text; });
  }
  // The text of an array of these elements.
  std::string textOfArray(const std::vector<QVDictionary>& elements) {
    text_.clear();
    const auto stream = makeStream();
    for (const QVDictionary& element : elements) EXPECT_EQ(stream->append(element), std::nullopt);
    stream->end();
    return text_;
  }
  std::string textOf(const QVValue& value) {
    const std::string text = textOfArray({QVDictionary{{"v", value}}});
    constexpr std::string_view kBefore = "[\n  {\n    \"v\": ";
    constexpr std::string_view kBehind = "\n  }\n]";
    EXPECT_TRUE(text.starts_with(kBefore) && text.ends_with(kBehind)) << text;
    return text.substr(kBefore.size(), text.size() - kBefore.size() - kBehind.size());
  }
  // What the text reads as.
  static QVValue parsed(const std::string& text) {
    QVJSONFailure failure;
    const auto value = QVJSONFile::parse(text, failure);
    EXPECT_TRUE(value.has_value()) << failure.description() << '\n' << text;
    return value.value_or(QVValue());
  }

  Output output_;
  std::string text_;
};

using Outputs = testing::Types<QVFakeJSONOutput, QVRapidJSONOutput>;
TYPED_TEST_SUITE(QVJSONOutputContract, Outputs);

TYPED_TEST(QVJSONOutputContract, WritesAnEmptyArray) {
  EXPECT_EQ(this->textOfArray({}), "[]");
}

TYPED_TEST(QVJSONOutputContract, WritesOneMemberALine) {
  const auto stream = this->makeStream();
  EXPECT_EQ(stream->append(QVDictionary{{"b", QVArray{1, QVArray{}}}, {"a", "x"}}), std::nullopt);
  EXPECT_EQ(stream->append("Session_Playback_Start_1",
                           QVDictionary{{"deep", QVDictionary{{"empty", QVDictionary()}}},
                                        {"none", QVValue()}}),
            std::nullopt);
  EXPECT_EQ(stream->append("Undefined_Unknown_1", QVDictionary()), std::nullopt);
  EXPECT_EQ(stream->append(QVDictionary()), std::nullopt);
  stream->end();
  EXPECT_EQ(this->text_, R"([
  {
    "a": "x",
    "b": [
      1,
      []
    ]
  },
  {
    "Session_Playback_Start_1": {
      "deep": {
        "empty": {}
      },
      "none": null
    }
  },
  {
    "Undefined_Unknown_1": {}
  },
  {}
])");
}

TYPED_TEST(QVJSONOutputContract, WritesNumbersSoThatTheirKindSurvives) {
  const auto text = [this](const QVValue& value) { return this->textOf(value); };
  EXPECT_EQ(text(12), "12");
  EXPECT_EQ(text(12.0), "12.0");
  EXPECT_EQ(text(0.0), "0.0");
  EXPECT_EQ(text(-0.0), "-0.0");
  EXPECT_EQ(text(0.1), "0.1");
  EXPECT_EQ(text(1.0 / 3), "0.3333333333333333");
  EXPECT_EQ(text(99999999999999984.0), "99999999999999984.0");
  EXPECT_EQ(text(1e17), "1e+17");
  EXPECT_EQ(text(1e-5), "1e-05");
  EXPECT_EQ(text(true), "true");
  EXPECT_EQ(text(false), "false");
  EXPECT_EQ(text(INT64_MIN), "-9223372036854775808");
  EXPECT_EQ(text(UINT64_MAX), "18446744073709551615");
}

TYPED_TEST(QVJSONOutputContract, WritesTextThatReadsBackEqual) {
  std::string everyByteOfASCII;
  for (char c = 0; c >= 0 && c < 127; ++c) everyByteOfASCII += c;
  const std::vector<QVDictionary> elements{
      {{"text", everyByteOfASCII}, {"gr\xC3\xBC\xC3\x9F \xE2\x82\xAC \xF0\x9F\x8E\xB5", ""}},
      {{"a \"quoted\" \\key\n", QVArray{1, 2.5, "x", QVDictionary{{"y", QVValue()}}}}},
      {{"large", std::string(200'000, '"') + std::string(200'000, 'x')}},
      {{"limits", QVArray{5e-324, 1.7976931348623157e308, INT64_MAX, UINT64_MAX}}}};
  const QVValue read = this->parsed(this->textOfArray(elements));
  ASSERT_EQ(read.array().size(), elements.size());
  for (std::size_t i = 0; i < elements.size(); ++i) {
    EXPECT_EQ(read.array()[i], QVValue(elements[i])) << i;
  }
}

TYPED_TEST(QVJSONOutputContract, ReplacesWhatIsNoUTF8) {
  const auto text = [this](std::string_view bytes) { return this->textOf(QVValue(bytes)); };
  const std::string mark = "\xEF\xBF\xBD";
  EXPECT_EQ(text("\xFF"), '"' + mark + '"');
  EXPECT_EQ(text("long enough before \xC3"), "\"long enough before " + mark + '"');
  EXPECT_EQ(text("\xE2\x82 x"), '"' + mark + " x\"") << "a piece of a character";
  EXPECT_EQ(text("\xC0\xAF"), '"' + mark + mark + '"') << "overlong";
  EXPECT_EQ(text("\xE0\x80\x80"), '"' + mark + mark + mark + '"') << "overlong";
  EXPECT_EQ(text("\xED\xA0\x80"), '"' + mark + mark + mark + '"') << "surrogate";
  EXPECT_EQ(text("\xF4\x90\x80\x80"), '"' + mark + mark + mark + mark + '"') << "above the last";
  EXPECT_EQ(text("\xF0\x9F\x8E"), '"' + mark + '"');
  EXPECT_EQ(text("a\x80z"), "\"a" + mark + "z\"");
  EXPECT_EQ(text("\xF4\x8F\xBF\xBF\xED\x9F\xBF\xEE\x80\x80"),
            "\"\xF4\x8F\xBF\xBF\xED\x9F\xBF\xEE\x80\x80\"");
  EXPECT_EQ(this->textOfArray({QVDictionary{{"k\xFF", 1}}}),
            "[\n  {\n    \"k" + mark + "\": 1\n  }\n]");
}

TYPED_TEST(QVJSONOutputContract, RefusesNumbersThatJSONHasNoWordFor) {
  const auto refusal = [this](const QVDictionary& element) {
    const auto error = this->makeStream()->append(element);
    return error ? error->description() : "";
  };
  EXPECT_EQ(refusal({{"rate", std::nan("")}}), R"("rate" is nan, which JSON has no word for)");
  EXPECT_EQ(refusal({{"rate", kInfinity}}), R"("rate" is inf, which JSON has no word for)");
  EXPECT_EQ(refusal({{"rate", -kInfinity}}), R"("rate" is -inf, which JSON has no word for)");
  EXPECT_EQ(refusal({{"a", 1}, {"outer", QVArray{1, QVDictionary{{"inner", kInfinity}}}}}),
            R"("inner" is inf, which JSON has no word for)");
  EXPECT_EQ(refusal({{"list", QVArray{QVArray{std::nan("")}}}}),
            R"("list" is nan, which JSON has no word for)");
}

TYPED_TEST(QVJSONOutputContract, SaysInWhichMessageARefusedNumberLies) {
  const auto error =
      this->makeStream()->append("Session_Playback_Start_3", QVDictionary{{"rate", std::nan("")}});
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description(),
            R"(Session_Playback_Start_3: "rate" is nan, which JSON has no word for)");
}

TYPED_TEST(QVJSONOutputContract, HandsNothingOnAfterARefusal) {
  const auto stream = this->makeStream();
  EXPECT_EQ(stream->append(QVDictionary{{"a", 1}}), std::nullopt);
  const auto error = stream->append(QVDictionary{{"b", std::nan("")}});
  ASSERT_TRUE(error.has_value());
  const std::string before = this->text_;
  EXPECT_EQ(stream->append(QVDictionary{{"c", std::string(1'000'000, 'x')}}), error);
  EXPECT_EQ(stream->append("name", QVDictionary{{"c", std::string(1'000'000, 'x')}}), error);
  EXPECT_EQ(this->text_, before);
}

TYPED_TEST(QVJSONOutputContract, WritesForManyThreads) {
  std::vector<std::jthread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this, thread] {
      std::string text;
      const auto stream = this->output_.makeArrayStream([&text](std::string_view t) { text += t; });
      for (int i = 0; i < 100; ++i) {
        EXPECT_EQ(stream->append(QVDictionary{{"thread", thread}}), std::nullopt);
      }
      stream->end();
      const QVArray array = this->parsed(text).array();
      ASSERT_EQ(array.size(), 100u);
      EXPECT_EQ(array[99], QVValue(QVDictionary{{"thread", thread}}));
    });
  }
}

}  // namespace
