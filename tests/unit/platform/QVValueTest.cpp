#include "platform/QVValue.h"

#include <cmath>
#include <cstdint>
#include <limits>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace {

using Kind = QVValue::Kind;

constexpr double kInfinity = std::numeric_limits<double>::infinity();

// One value of every kind, and some at the edges.
std::vector<QVValue> oneOfEach() {
  return {QVValue(),
          false,
          true,
          0,
          -1,
          INT64_MAX,
          INT64_MIN,
          UINT64_MAX,
          0.5,
          kInfinity,
          "",
          "text",
          std::string(100, 'x'),
          QVArray{1, "two"},
          QVDictionary{{"key", "value"}}};
}

TEST(QVValue, KnowsItsKind) {
  EXPECT_EQ(QVValue().kind(), Kind::absent);
  EXPECT_EQ(QVValue(true).kind(), Kind::boolean);
  EXPECT_EQ(QVValue(1).kind(), Kind::integer);
  EXPECT_EQ(QVValue(1u).kind(), Kind::integer);
  EXPECT_EQ(QVValue(uint8_t{1}).kind(), Kind::integer);
  EXPECT_EQ(QVValue(1.0).kind(), Kind::real);
  EXPECT_EQ(QVValue("").kind(), Kind::string);
  EXPECT_EQ(QVValue(std::string()).kind(), Kind::string);
  EXPECT_EQ(QVValue(QVArray()).kind(), Kind::array);
  EXPECT_EQ(QVValue(QVDictionary()).kind(), Kind::dictionary);
}

TEST(QVValue, IsUnsignedOnlyAboveTheSignedRange) {
  EXPECT_EQ(QVValue(uint64_t{INT64_MAX}).kind(), Kind::integer);
  EXPECT_EQ(QVValue(uint64_t{INT64_MAX}).integer(), INT64_MAX);
  EXPECT_EQ(QVValue(uint64_t{INT64_MAX} + 1).kind(), Kind::unsignedInteger);
  EXPECT_EQ(QVValue(UINT64_MAX).unsignedInteger(), UINT64_MAX);
}

TEST(QVValue, KnowsNumbersFromTheRest) {
  const std::vector<bool> numbers{false, true, true,  true,  true,  true,  true, true,
                                  true,  true, false, false, false, false, false};
  const auto values = oneOfEach();
  ASSERT_EQ(values.size(), numbers.size());
  for (std::size_t i = 0; i < values.size(); ++i) EXPECT_EQ(values[i].isNumber(), numbers[i]) << i;
}

TEST(QVValue, EqualsItsCopyAndNothingElse) {
  const auto values = oneOfEach();
  for (std::size_t i = 0; i < values.size(); ++i) {
    for (std::size_t j = 0; j < values.size(); ++j) {
      EXPECT_EQ(values[i] == QVValue(values[j]), i == j) << i << ' ' << j;
    }
  }
}

TEST(QVValue, ComparesTheKindToo) {
  EXPECT_FALSE(QVValue(1) == QVValue(1.0));
  EXPECT_FALSE(QVValue(1) == QVValue(true));
  EXPECT_FALSE(QVValue("1") == QVValue(1));
  EXPECT_FALSE(QVValue(QVArray()) == QVValue(QVDictionary()));
}

TEST(QVValue, ComparesContents) {
  EXPECT_TRUE(QVValue(std::nan("")) == QVValue(-std::nan("1")));
  EXPECT_TRUE(QVValue(0.0) == QVValue(-0.0));
  EXPECT_TRUE(QVValue(QVArray{1, QVArray{std::nan("")}}) ==
              QVValue(QVArray{1, QVArray{std::nan("")}}));
  EXPECT_FALSE(QVValue(QVArray{1, 2}) == QVValue(QVArray{1}));
  EXPECT_FALSE(QVValue(QVArray{1, 2}) == QVValue(QVArray{2, 1}));
  EXPECT_TRUE(QVValue(QVArray()) == QVValue(QVArray(std::initializer_list<QVValue>{})));
  EXPECT_TRUE(QVValue(QVDictionary()) ==
              QVValue(QVDictionary(std::initializer_list<QVDictionaryEntry>{})));
}

TEST(QVValue, SaturatesIntegerReadings) {
  EXPECT_EQ(QVValue(0x1p63).integerValue(), INT64_MAX);
  EXPECT_EQ(QVValue(std::nextafter(0x1p63, 0.0)).integerValue(), INT64_MAX - 1023);
  EXPECT_EQ(QVValue(-0x1p63).integerValue(), INT64_MIN);
  EXPECT_EQ(QVValue(std::nextafter(-0x1p63, -kInfinity)).integerValue(), INT64_MIN);
  EXPECT_EQ(QVValue(1e300).integerValue(), INT64_MAX);
  EXPECT_EQ(QVValue(kInfinity).integerValue(), INT64_MAX);
  EXPECT_EQ(QVValue(-kInfinity).integerValue(), INT64_MIN);
  EXPECT_EQ(QVValue(UINT64_MAX).integerValue(), INT64_MAX);
  EXPECT_EQ(QVValue(std::nan("")).integerValue(), 0);
}

TEST(QVValue, TruncatesIntegerReadings) {
  EXPECT_EQ(QVValue(2.9).integerValue(), 2);
  EXPECT_EQ(QVValue(-2.9).integerValue(), -2);
  EXPECT_EQ(QVValue(true).integerValue(), 1);
  EXPECT_EQ(QVValue(INT64_MIN).integerValue(), INT64_MIN);
}

TEST(QVValue, ReadsWhatIsNoNumberAsZero) {
  for (const QVValue& value :
       {QVValue(), QVValue("12"), QVValue(QVArray{12}), QVValue(QVDictionary{{"12", 12}})}) {
    EXPECT_EQ(value.integerValue(), 0);
    EXPECT_EQ(value.doubleValue(), 0.0);
  }
}

TEST(QVValue, ReadsNumbersAsDoubles) {
  EXPECT_EQ(QVValue(false).doubleValue(), 0.0);
  EXPECT_EQ(QVValue(true).doubleValue(), 1.0);
  EXPECT_EQ(QVValue(-3).doubleValue(), -3.0);
  EXPECT_EQ(QVValue(UINT64_MAX).doubleValue(), 0x1p64);
  EXPECT_EQ(QVValue(2.5).doubleValue(), 2.5);
  EXPECT_TRUE(std::isnan(QVValue(std::nan("")).doubleValue()));
}

TEST(QVValue, OwnsTheCharactersItWasMadeOf) {
  std::string text = "before";
  const QVValue value(text);
  text = "after!";
  EXPECT_EQ(value.string(), "before");
}

TEST(QVValue, BorrowsCharactersWhenToldTo) {
  const std::string text = "borrowed";
  const QVValue value = QVValue::borrowing(text);
  EXPECT_EQ(value.string().data(), text.data());
  EXPECT_EQ(value, QVValue("borrowed"));
}

TEST(QVValue, CopiesBorrowedCharacters) {
  QVValue copy;
  {
    const auto text = std::make_unique<std::string>("gone with its owner, and long enough");
    const QVValue borrowing = QVValue::borrowing(*text);
    copy = borrowing;
    EXPECT_NE(copy.string().data(), text->data());
  }
  EXPECT_EQ(copy.string(), "gone with its owner, and long enough");
}

TEST(QVValue, RefusesStringsThatItsLengthCannotTell) {
  // Refused before a character is read.
  const char character = 'x';
  const std::string_view tooLong(&character, std::size_t{UINT32_MAX} + 1);
  EXPECT_THROW(QVValue{tooLong}, std::length_error);
  EXPECT_THROW(QVValue::borrowing(tooLong), std::length_error);
}

TEST(QVValue, SharesOwnedCharactersBetweenCopies) {
  const QVValue value("shared");
  const QVValue copy = value;  // NOLINT(performance-unnecessary-copy-initialization): under test
  EXPECT_EQ(copy.string().data(), value.string().data());
}

TEST(QVValue, KeepsEmbeddedZeroesAndEmptyStrings) {
  EXPECT_EQ(QVValue(std::string_view("a\0b", 3)).string(), std::string_view("a\0b", 3));
  const QVValue empty("");
  const QVValue copy = empty;  // NOLINT(performance-unnecessary-copy-initialization): under test
  EXPECT_EQ(copy.string(), "");
  EXPECT_EQ(QVValue(QVValue::borrowing({})).string(), "");
}

TEST(QVValue, IsAbsentAfterAMove) {
  for (QVValue& value : oneOfEach()) {
    const QVValue expected = value;
    QVValue moved = std::move(value);
    EXPECT_EQ(moved, expected);
    // NOLINTNEXTLINE(bugprone-use-after-move): what is left is the point
    EXPECT_TRUE(value.isAbsent());
    value = std::move(moved);
    EXPECT_EQ(value, expected);
    EXPECT_TRUE(moved.isAbsent());  // NOLINT(bugprone-use-after-move)
  }
}

TEST(QVValue, SurvivesAnAssignmentOfItself) {
  for (QVValue& value : oneOfEach()) {
    const QVValue expected = value;
    const QVValue& itself = value;
    value = itself;
    EXPECT_EQ(value, expected);
    value = std::move(const_cast<QVValue&>(itself));
    EXPECT_EQ(value, expected);
  }
}

TEST(QVValue, SurvivesTheAssignmentOfItsOwnPart) {
  QVValue value = QVArray{QVDictionary{{"inner", "deep inside"}}};
  value = value.array()[0];
  EXPECT_EQ(value, QVValue(QVDictionary{{"inner", "deep inside"}}));
  value = *value.dictionary().find("inner");
  EXPECT_EQ(value, QVValue("deep inside"));
}

TEST(QVArray, KeepsItsItemsInOrder) {
  const QVArray array{3, "b", QVArray{1}};
  ASSERT_EQ(array.size(), 3u);
  EXPECT_EQ(array[0], QVValue(3));
  EXPECT_EQ(array[1], QVValue("b"));
  EXPECT_EQ(array[2].array()[0], QVValue(1));
  EXPECT_TRUE(QVArray().empty());
  EXPECT_EQ(QVArray().begin(), QVArray().end());
}

TEST(QVArray, CopiesCharactersOutOfItsItems) {
  QVArray array;
  {
    const auto text = std::make_unique<std::string>("borrowed by the item only");
    const QVValue item = QVValue::borrowing(*text);
    array = QVArray::assemble({&item, 1});
  }
  EXPECT_EQ(array[0].string(), "borrowed by the item only");
}

TEST(QVArray, LetsItsItemsOutliveIt) {
  QVValue item;
  {
    const QVArray array{"a string inside of the array's block"};
    item = array[0];
  }
  EXPECT_EQ(item.string(), "a string inside of the array's block");
}

TEST(QVArray, OutlivesTheValueItCameFrom) {
  QVArray array;
  {
    const QVValue value = QVArray{"x", 2};
    array = value.array();
  }
  EXPECT_EQ(array, (QVArray{"x", 2}));
}

}  // namespace
