#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

// Draws numbers over their places as lines of text: each cell of a terminal has 2 by 4 dots where
// it shows braille, else one. Points are joined by lines, and only the picture is kept of them.
// Threads: one at a time.
class QVPlot {
 public:
  struct Size {
    std::size_t columns = 72;
    std::size_t rows = 8;
  };
  enum class Dots { braille, ascii };
  // What is at the edges: places from the left to the right, numbers from the bottom to the top.
  struct Frame {
    int64_t first = 0;
    int64_t last = 0;
    double lowest = 0;
    double highest = 0;
  };

  QVPlot(Size size, Dots dots, const Frame& frame);

  // Draws a point, and joins it with the one before it. Places come in ascending order; what is
  // outside of the frame is drawn at its edge.
  void add(int64_t place, double number);
  // The rows of the picture, from the top, of exactly so many columns.
  std::vector<std::string> rows() const;

 private:
  struct Place {
    double x = 0;
    double y = 0;
  };

  Place placeOf(int64_t place, double number) const;
  void set(std::size_t x, std::size_t y);
  void join(const Place& from, const Place& to);
  std::string row(std::size_t index) const;

  const Size size_;
  const Dots dots_;
  const Frame frame_;
  const std::size_t width_;   // in dots
  const std::size_t height_;  // in dots
  std::vector<bool> isSet_;   // by y, then x, from the top
  std::optional<Place> last_;
};
