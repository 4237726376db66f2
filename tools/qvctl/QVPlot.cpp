#include "tools/qvctl/QVPlot.h"

#include <algorithm>
#include <cmath>

namespace {

constexpr std::size_t kBrailleColumns = 2;
constexpr std::size_t kBrailleRows = 4;

// The bit of each dot of a braille character, by its row, then its column.
constexpr unsigned kBits[kBrailleRows][kBrailleColumns] = {
    {0x01, 0x08}, {0x02, 0x10}, {0x04, 0x20}, {0x40, 0x80}};

// U+2800 and the bits, in UTF-8.
std::string brailleOf(unsigned bits) {
  return {static_cast<char>(0xE2), static_cast<char>(0xA0 | bits >> 6U),
          static_cast<char>(0x80 | (bits & 0x3FU))};
}

}  // namespace

QVPlot::QVPlot(Size size, Dots dots, const Frame& frame)
    : size_(size),
      dots_(dots),
      frame_(frame),
      width_(size.columns * (dots == Dots::braille ? kBrailleColumns : 1)),
      height_(size.rows * (dots == Dots::braille ? kBrailleRows : 1)),
      isSet_(width_ * height_) {}

QVPlot::Place QVPlot::placeOf(int64_t place, double number) const {
  const auto first = static_cast<double>(frame_.first);
  const double length = static_cast<double>(frame_.last) - first;
  const double along = length > 0 ? (static_cast<double>(place) - first) / length : 0;
  // Halved, so that the largest numbers have a difference.
  const double span = frame_.highest / 2 - frame_.lowest / 2;
  const double above = span > 0 ? (number / 2 - frame_.lowest / 2) / span : 0.5;
  return {std::clamp(along, 0.0, 1.0) * static_cast<double>(width_ - 1),
          (1 - std::clamp(above, 0.0, 1.0)) * static_cast<double>(height_ - 1)};
}

void QVPlot::add(int64_t place, double number) {
  const Place next = placeOf(place, number);
  join(last_.value_or(next), next);
  last_ = next;
}

std::vector<std::string> QVPlot::rows() const {
  std::vector<std::string> rows;
  for (std::size_t i = 0; i < size_.rows; ++i) rows.push_back(row(i));
  return rows;
}

void QVPlot::set(std::size_t x, std::size_t y) {
  isSet_[std::min(y, height_ - 1) * width_ + std::min(x, width_ - 1)] = true;
}

void QVPlot::join(const Place& from, const Place& to) {
  const double steps = std::ceil(std::max(std::fabs(to.x - from.x), std::fabs(to.y - from.y)));
  const auto count = static_cast<std::size_t>(steps);
  for (std::size_t i = 0; i <= count; ++i) {
    const double part = count == 0 ? 0 : static_cast<double>(i) / static_cast<double>(count);
    set(static_cast<std::size_t>(std::lround(from.x + (to.x - from.x) * part)),
        static_cast<std::size_t>(std::lround(from.y + (to.y - from.y) * part)));
  }
}

std::string QVPlot::row(std::size_t index) const {
  std::string text;
  for (std::size_t column = 0; column < size_.columns; ++column) {
    if (dots_ == Dots::ascii) {
      text.push_back(isSet_[index * width_ + column] ? '*' : ' ');
      continue;
    }
    unsigned bits = 0;
    for (std::size_t y = 0; y < kBrailleRows; ++y) {
      for (std::size_t x = 0; x < kBrailleColumns; ++x) {
        const std::size_t dot = (index * kBrailleRows + y) * width_ + column * kBrailleColumns + x;
        if (isSet_[dot]) bits |= kBits[y][x];
      }
    }
    text.append(bits == 0 ? " " : brailleOf(bits));
  }
  return text;
}
