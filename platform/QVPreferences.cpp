#include "platform/QVPreferences.h"

#include "platform/QVText.h"

#include <algorithm>
#include <array>

namespace {

bool equalsIgnoringCase(std::string_view text, std::string_view lowerCase) {
  return std::equal(text.begin(), text.end(), lowerCase.begin(), lowerCase.end(),
                    [](char a, char b) { return (a >= 'A' && a <= 'Z' ? a - 'A' + 'a' : a) == b; });
}

}  // namespace

bool QVPreferences::booleanReading(const QVValue* value) {
  if (value == nullptr) return false;
  if (value->isNumber()) return value->doubleValue() != 0;
  if (!value->isString()) return false;
  constexpr std::array<std::string_view, 3> kTrue{"true", "yes", "1"};
  return std::ranges::any_of(
      kTrue, [value](std::string_view word) { return equalsIgnoringCase(value->string(), word); });
}

std::optional<std::string> QVPreferences::stringReading(const QVValue* value) {
  if (value == nullptr || !(value->isString() || value->isNumber())) return std::nullopt;
  return QVText(*value);
}
