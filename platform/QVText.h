#pragma once

#include "platform/QVValue.h"

#include <concepts>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>

// The text form of values, as log lines, summaries and keys show it: absent "(null)", a string as
// it is, a boolean 1 or 0, integers in decimal, doubles as the shortest text that reads back equal
// (fixed notation for 1e-4 <= |x| < 1e17, no ".0"; nan, inf, -inf), arrays and dictionaries as
// compact one-line JSON. No locale. Pure functions; any thread.

void QVAppendText(std::string& out, const QVValue& value);
void QVAppendText(std::string& out, const QVArray& value);
void QVAppendText(std::string& out, const QVDictionary& value);
void QVAppendText(std::string& out, double value);
void QVAppendText(std::string& out, int64_t value);
void QVAppendText(std::string& out, uint64_t value);
inline void QVAppendText(std::string& out, std::string_view text) {
  out.append(text);
}
inline void QVAppendText(std::string& out, const char* text) {
  out.append(text);
}
inline void QVAppendText(std::string& out, const std::string& text) {
  out.append(text);
}
inline void QVAppendText(std::string& out, char text) {
  out.push_back(text);
}
template <std::same_as<bool> Boolean>
void QVAppendText(std::string& out, Boolean value) {
  out.push_back(value ? '1' : '0');
}
template <std::integral Integer>
requires(!std::same_as<Integer, bool> && !std::same_as<Integer, char> &&
         !std::same_as<Integer, int64_t> &&
         !std::same_as<Integer, uint64_t>) void QVAppendText(std::string& out, Integer value) {
  if constexpr (std::signed_integral<Integer>) {
    QVAppendText(out, static_cast<int64_t>(value));
  } else {
    QVAppendText(out, static_cast<uint64_t>(value));
  }
}

template <class Contents>
void QVAppendText(std::string& out, const std::optional<Contents>& value) {
  if (value) {
    QVAppendText(out, *value);
  } else {
    out.append("(null)");
  }
}

// The parts' texts, one after the other.
template <class... Parts>
std::string QVText(const Parts&... parts) {
  std::string out;
  (QVAppendText(out, parts), ...);
  return out;
}

// Appends `text` as a JSON string with its quotes; control characters, '"' and '\' are escaped,
// everything else is copied as it is.
void QVAppendJSONString(std::string& out, std::string_view text);
