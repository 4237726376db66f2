#include "platform/QVOrientation.h"

#include <algorithm>
#include <array>
#include <cstddef>

namespace {

// By value.
constexpr std::array<std::string_view, 5> kWords{"undefined", "normal", "bottom-up", "left-up",
                                                 "right-up"};

}  // namespace

std::string_view QVOrientation::textOfOrientation(int32_t orientation) {
  const bool known = orientation >= 0 && static_cast<std::size_t>(orientation) < kWords.size();
  return kWords[known ? static_cast<std::size_t>(orientation) : 0];
}

int32_t QVOrientation::orientationNamed(std::string_view word) {
  const auto* const found = std::ranges::find(kWords, word);
  return found == kWords.end() ? kUndefined : static_cast<int32_t>(found - kWords.begin());
}
