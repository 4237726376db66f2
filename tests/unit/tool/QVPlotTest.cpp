#include "tools/qvctl/QVPlot.h"

#include <algorithm>
#include <limits>
#include <utility>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::SizeIs;

using Points = std::vector<std::pair<int64_t, double>>;

// The points' picture, between the smallest and the largest number.
std::vector<std::string> drawn(QVPlot::Size size, QVPlot::Dots dots, const Points& points,
                               int64_t first, int64_t last) {
  QVPlot::Frame frame{.first = first, .last = last};
  for (const auto& [place, number] : points) {
    frame.lowest = &number == &points[0].second ? number : std::min(frame.lowest, number);
    frame.highest = &number == &points[0].second ? number : std::max(frame.highest, number);
  }
  QVPlot plot(size, dots, frame);
  for (const auto& [place, number] : points) plot.add(place, number);
  return plot.rows();
}

TEST(QVPlotTest, DrawsARisingLine) {
  EXPECT_THAT(drawn({.columns = 5, .rows = 5}, QVPlot::Dots::ascii, {{1, 0}, {5, 4}}, 1, 5),
              ElementsAre("    *", "   * ", "  *  ", " *   ", "*    "));
}

TEST(QVPlotTest, DrawsWhatStaysInTheMiddle) {
  EXPECT_THAT(drawn({.columns = 5, .rows = 3}, QVPlot::Dots::ascii, {{1, 7}, {3, 7}, {5, 7}}, 1, 5),
              ElementsAre("     ", "*****", "     "));
}

TEST(QVPlotTest, PutsNumbersAtTheirPlaces) {
  EXPECT_THAT(drawn({.columns = 5, .rows = 3}, QVPlot::Dots::ascii, {{3, 1}}, 1, 5),
              ElementsAre("     ", "  *  ", "     "));
  EXPECT_THAT(drawn({.columns = 5, .rows = 3}, QVPlot::Dots::ascii, {{1, 1}}, 1, 1),
              ElementsAre("     ", "*    ", "     "));
}

TEST(QVPlotTest, ShowsPeaksAmongManyPoints) {
  Points points;
  for (int64_t i = 1; i <= 1000; ++i) points.emplace_back(i, i == 500 ? 1 : 0);
  EXPECT_THAT(drawn({.columns = 11, .rows = 3}, QVPlot::Dots::ascii, points, 1, 1000),
              ElementsAre("     *     ", "     *     ", "***********"));
}

TEST(QVPlotTest, DrawsEightDotsToACell) {
  // From the lowest dot at the left to the highest at the right.
  EXPECT_THAT(drawn({.columns = 2, .rows = 1}, QVPlot::Dots::braille, {{1, 0}, {4, 3}}, 1, 4),
              ElementsAre("⡠⠊"));
}

TEST(QVPlotTest, BearsTheLargestNumbers) {
  constexpr double kLargest = std::numeric_limits<double>::max();
  EXPECT_THAT(
      drawn({.columns = 3, .rows = 3}, QVPlot::Dots::ascii, {{1, -kLargest}, {3, kLargest}}, 1, 3),
      ElementsAre("  *", " * ", "*  "));
  EXPECT_THAT(drawn({.columns = 3, .rows = 3}, QVPlot::Dots::ascii,
                    {{INT64_MIN, 1}, {INT64_MAX, 2}}, INT64_MIN, INT64_MAX),
              ElementsAre("  *", " * ", "*  "));
}

TEST(QVPlotTest, KeepsWhatIsOutsideAtItsEdge) {
  QVPlot plot({.columns = 3, .rows = 3}, QVPlot::Dots::ascii,
              {.first = 1, .last = 3, .lowest = 0, .highest = 2});
  plot.add(0, 9);
  EXPECT_THAT(plot.rows(), ElementsAre("*  ", "   ", "   "));
  plot.add(7, -9);
  EXPECT_THAT(plot.rows(), ElementsAre("*  ", " * ", "  *"));
}

TEST(QVPlotTest, IsEmptyWithoutPoints) {
  EXPECT_THAT(drawn({.columns = 4, .rows = 2}, QVPlot::Dots::braille, {}, 1, 5),
              ElementsAre("    ", "    "));
}

}  // namespace
