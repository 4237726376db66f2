#include "tools/qvctl/QVPlot.h"

#include <limits>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::SizeIs;

using Points = QVPlot::Points;

TEST(QVPlotTest, DrawsARisingLine) {
  QVPlot plot({.columns = 5, .rows = 5}, QVPlot::Dots::ascii);
  EXPECT_THAT(plot.draw({{1, 0}, {5, 4}}, 1, 5),
              ElementsAre("    *", "   * ", "  *  ", " *   ", "*    "));
}

TEST(QVPlotTest, DrawsWhatStaysInTheMiddle) {
  QVPlot plot({.columns = 5, .rows = 3}, QVPlot::Dots::ascii);
  EXPECT_THAT(plot.draw({{1, 7}, {3, 7}, {5, 7}}, 1, 5), ElementsAre("     ", "*****", "     "));
}

TEST(QVPlotTest, PutsNumbersAtTheirPlaces) {
  QVPlot plot({.columns = 5, .rows = 3}, QVPlot::Dots::ascii);
  EXPECT_THAT(plot.draw({{3, 1}}, 1, 5), ElementsAre("     ", "  *  ", "     "));
  EXPECT_THAT(plot.draw({{1, 1}}, 1, 1), ElementsAre("     ", "*    ", "     "));
}

TEST(QVPlotTest, ShowsPeaksAmongManyPoints) {
  Points points;
  for (int64_t i = 1; i <= 1000; ++i) points.emplace_back(i, i == 500 ? 1 : 0);
  QVPlot plot({.columns = 11, .rows = 3}, QVPlot::Dots::ascii);
  EXPECT_THAT(plot.draw(points, 1, 1000), ElementsAre("     *     ", "     *     ", "***********"));
}

TEST(QVPlotTest, DrawsEightDotsToACell) {
  QVPlot plot({.columns = 2, .rows = 1}, QVPlot::Dots::braille);
  // From the lowest dot at the left to the highest at the right.
  EXPECT_THAT(plot.draw({{1, 0}, {4, 3}}, 1, 4), ElementsAre("⡠⠊"));
}

TEST(QVPlotTest, BearsTheLargestNumbers) {
  constexpr double kLargest = std::numeric_limits<double>::max();
  QVPlot plot({.columns = 3, .rows = 3}, QVPlot::Dots::ascii);
  EXPECT_THAT(plot.draw({{1, -kLargest}, {3, kLargest}}, 1, 3), ElementsAre("  *", " * ", "*  "));
  EXPECT_THAT(plot.draw({{INT64_MIN, 1}, {INT64_MAX, 2}}, INT64_MIN, INT64_MAX),
              ElementsAre("  *", " * ", "*  "));
}

TEST(QVPlotTest, IsEmptyWithoutPoints) {
  QVPlot plot({.columns = 4, .rows = 2}, QVPlot::Dots::braille);
  EXPECT_THAT(plot.draw({}, 1, 5), ElementsAre("    ", "    "));
}

}  // namespace
