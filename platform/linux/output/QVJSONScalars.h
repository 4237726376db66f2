#pragma once

#include <array>
#include <string_view>

// How strings and doubles stand in the JSON text that the service writes. Pure functions; any
// thread.

// Printable ASCII without quotes and backslashes: nearly all text is, and is copied as it is.
bool QVIsPlainJSONText(std::string_view text);

// Any other string falls into pieces: runs that are copied as they are, and what stands for single
// bytes, an escape or, for bytes that are no UTF-8, U+FFFD. The string outlives it.
class QVJSONStringPieces {
 public:
  explicit QVJSONStringPieces(std::string_view text) : rest_(text) {}
  // The next piece, valid until the one after; an empty one at the end.
  std::string_view next();

 private:
  std::string_view rest_;
  std::array<char, 6> escape_;
};

// Room for the digits of a double.
using QVJSONDigits = std::array<char, 64>;

// A finite number as the shortest text that reads back equal, with ".0" where it would look like
// an integer; the text lies in `digits`.
std::string_view QVWriteJSONReal(double number, QVJSONDigits& digits);
