#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

// Draws numbers over their places as lines of text: each cell of a terminal has 2 by 4 dots where
// it shows braille, else one. Points are joined by lines. Pure; any thread.
class QVPlot {
 public:
  using Points = std::vector<std::pair<int64_t, double>>;  // place and number, in ascending places
  struct Size {
    std::size_t columns = 72;
    std::size_t rows = 8;
  };
  enum class Dots { braille, ascii };

  QVPlot(Size size, Dots dots);

  // The rows of the picture, from the top, of exactly so many columns. Places reach from `first` to
  // `last`; the smallest number is at the bottom and the largest at the top.
  std::vector<std::string> draw(const Points& points, int64_t first, int64_t last);

 private:
  struct Place {
    double x = 0;
    double y = 0;
  };

  void set(std::size_t x, std::size_t y);
  void join(const Place& from, const Place& to);
  std::string row(std::size_t index) const;

  const Size size_;
  const Dots dots_;
  const std::size_t width_;   // in dots
  const std::size_t height_;  // in dots
  std::vector<bool> isSet_;   // by y, then x, from the top
};
