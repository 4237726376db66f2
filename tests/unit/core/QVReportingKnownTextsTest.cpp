#include "QVServices/Statistics/Service/QVReportingKnownTexts.h"
#include "platform/QVText.h"

#include <cstddef>
#include <string>

#include <gmock/gmock.h>

namespace {

TEST(QVReportingKnownTexts, KeepsATextOnce) {
  QVReportingKnownTexts known;
  const std::string* const route = known.keep("BuiltInSpeaker");
  ASSERT_NE(route, nullptr);
  EXPECT_EQ(*route, "BuiltInSpeaker");
  const std::size_t footprint = known.footprint();
  EXPECT_GE(footprint, route->size());
  EXPECT_EQ(known.keep(std::string("BuiltInSpeaker")), route);
  EXPECT_EQ(known.footprint(), footprint);
  const std::string* const other = known.keep("BuiltInReceiver");
  ASSERT_NE(other, nullptr);
  EXPECT_NE(other, route);
  EXPECT_GE(known.footprint(), footprint + other->size());
}

TEST(QVReportingKnownTexts, CountsATextAsOftenAsItWasKept) {
  QVReportingKnownTexts known;
  EXPECT_EQ(known.writtenOut(), 0u);
  known.keep(std::string(100, 'x'));
  known.keep(std::string(100, 'x'));
  known.keep(std::string(20, 'y'));
  known.keep("short");
  EXPECT_EQ(known.writtenOut(), 220u);
}

TEST(QVReportingKnownTexts, LeavesOutWhatIsHardlyWorthAReference) {
  QVReportingKnownTexts known;
  constexpr std::size_t kShortest = QVReportingKnownTexts::kShortest;
  constexpr std::size_t kLongest = QVReportingKnownTexts::kLongest;
  EXPECT_EQ(known.keep(""), nullptr);
  EXPECT_EQ(known.keep(std::string(kShortest - 1, 'x')), nullptr);
  EXPECT_NE(known.keep(std::string(kShortest, 'x')), nullptr);
  EXPECT_NE(known.keep(std::string(kLongest, 'x')), nullptr);
  EXPECT_EQ(known.keep(std::string(kLongest + 1, 'x')), nullptr);
}

TEST(QVReportingKnownTexts, KeepsNoMoreThanItsMaximum) {
  QVReportingKnownTexts known;
  const std::string* const first = known.keep("the first of them");
  for (std::size_t i = 1; i < QVReportingKnownTexts::kMaximumTexts; ++i) {
    ASSERT_NE(known.keep(QVText("one of many texts: ", i)), nullptr);
  }
  const std::size_t footprint = known.footprint();
  EXPECT_EQ(known.keep("one too many of them"), nullptr);
  EXPECT_EQ(known.footprint(), footprint);
  EXPECT_EQ(known.keep("the first of them"), first) << "where it always was";
}

}  // namespace
