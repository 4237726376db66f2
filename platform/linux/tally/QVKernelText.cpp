#include "platform/linux/tally/QVKernelText.h"

#include <algorithm>
#include <charconv>
#include <limits>
#include <system_error>

namespace {

constexpr std::string_view kBlanks = " \t";

bool isBlank(char c) {
  return kBlanks.find(c) != std::string_view::npos;
}
bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

std::string_view trimmed(std::string_view text) {
  text.remove_prefix(std::min(text.find_first_not_of(kBlanks), text.size()));
  return text.substr(0, text.find_last_not_of(kBlanks) + 1);  // 0 where there is nothing else
}

std::optional<int64_t> integerAtBeginning(std::string_view text) {
  const bool negative = text.starts_with('-');
  const auto* const end = std::find_if_not(text.begin() + (negative ? 1 : 0), text.end(), isDigit);
  const auto length = static_cast<std::size_t>(end - text.begin());
  if (length == (negative ? 1U : 0U)) return std::nullopt;
  if (length < text.size() && !isBlank(text[length])) return std::nullopt;
  int64_t value = 0;
  if (std::from_chars(text.data(), end, value).ec == std::errc::result_out_of_range) {
    using Limits = std::numeric_limits<int64_t>;
    return negative ? Limits::min() : Limits::max();
  }
  return value;
}

// The line divided there, where that is a counter.
std::optional<QVKernelText::Counter> divided(std::string_view line, std::size_t at) {
  if (at >= line.size()) return std::nullopt;
  const std::string_view key = trimmed(line.substr(0, at));
  if (key.empty() || key.size() > QVKernelText::kMaximumKeyBytes) return std::nullopt;
  const auto value = integerAtBeginning(trimmed(line.substr(at + 1)));
  if (!value) return std::nullopt;
  return QVKernelText::Counter{.key = key, .value = *value};
}

// Where the first ":" is that a blank or the end follows.
std::size_t endOfKey(std::string_view line) {
  for (std::size_t at = line.find(':'); at != std::string_view::npos; at = line.find(':', at + 1)) {
    if (at + 1 == line.size() || isBlank(line[at + 1])) return at;
  }
  return std::string_view::npos;
}

}  // namespace

std::optional<QVKernelText::Counter> QVKernelText::parseLine(std::string_view line) {
  line = trimmed(line);
  if (const auto counter = divided(line, endOfKey(line))) return counter;
  const std::size_t firstBlank = line.find_first_of(kBlanks);
  const auto counter = divided(line, firstBlank);
  if (counter && line[firstBlank - 1] != ':') return counter;  // ": 12" has no key
  return divided(line, line.find(':'));
}

std::optional<std::string_view> QVKernelText::takeLine(std::string_view& text) {
  if (text.empty()) return std::nullopt;
  const std::size_t length = std::min(text.find('\n'), text.size());
  const std::string_view line = text.substr(0, length);
  text.remove_prefix(std::min(length + 1, text.size()));
  return line;
}
