#include "platform/linux/output/QVJSONScalars.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>

namespace {

// Below this every whole number is a double of its own.
constexpr double kWholeNumbers = 0x1p53;

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

// What stands at the beginning of `bytes`: a whole character, or the longest piece of one that
// still could have become a character (at least one byte).
struct Sequence {
  std::size_t length;
  bool valid;
};

Sequence sequenceAt(std::string_view bytes) {
  const auto at = [&bytes](std::size_t i) { return static_cast<unsigned char>(bytes[i]); };
  const unsigned char lead = at(0);
  if (lead < 0x80) return {1, true};
  if (lead < 0xC2 || lead > 0xF4) return {1, false};
  const std::size_t length = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  // The second byte's range keeps out overlong forms, surrogates and what lies above U+10FFFF.
  unsigned char low = 0x80;
  unsigned char high = 0xBF;
  if (lead == 0xE0) low = 0xA0;
  if (lead == 0xED) high = 0x9F;
  if (lead == 0xF0) low = 0x90;
  if (lead == 0xF4) high = 0x8F;
  for (std::size_t i = 1; i < length; ++i) {
    if (i >= bytes.size() || at(i) < low || at(i) > high) return {i, false};
    low = 0x80;
    high = 0xBF;
  }
  return {length, true};
}

// Is there a byte in the word that JSON escapes, or that is not ASCII? May say yes to a word that
// has none, never no to one that has. The usual trick: taking 1 from a zero byte sets its top bit.
constexpr bool mayNeedCare(uint64_t word) {
  constexpr uint64_t kOnes = 0x0101010101010101;
  constexpr uint64_t kTops = 0x8080808080808080;
  const uint64_t quotes = word ^ (kOnes * '"');
  const uint64_t backslashes = word ^ (kOnes * '\\');
  return ((word | (word - kOnes * 0x20) | (quotes - kOnes) | (backslashes - kOnes)) & kTops) != 0;
}

// How many bytes from the beginning on are copied as they are.
std::size_t runLength(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size()) {
    uint64_t word = 0;
    if (text.size() - i >= sizeof word) {
      std::memcpy(&word, text.data() + i, sizeof word);
      if (!mayNeedCare(word)) {
        i += sizeof word;
        continue;
      }
    }
    const auto byte = static_cast<unsigned char>(text[i]);
    if (byte < 0x20 || byte == '"' || byte == '\\') return i;
    const Sequence sequence = sequenceAt(text.substr(i));
    if (!sequence.valid) return i;
    i += sequence.length;
  }
  return i;
}

// The letter that stands for the byte behind a backslash; NUL where it takes its number.
char escapeLetter(char byte) {
  switch (byte) {
    case '"':
    case '\\':
      return byte;
    case '\b':
      return 'b';
    case '\f':
      return 'f';
    case '\n':
      return 'n';
    case '\r':
      return 'r';
    case '\t':
      return 't';
    default:
      return '\0';
  }
}

}  // namespace

bool QVIsPlainJSONText(std::string_view text) {
  if (text.empty()) return true;
  uint64_t word = 0;
  std::size_t i = 0;
  for (; i + sizeof word <= text.size(); i += sizeof word) {
    std::memcpy(&word, text.data() + i, sizeof word);
    if (mayNeedCare(word)) return false;
  }
  word = 0x2020202020202020;
  if (i < text.size()) std::memcpy(&word, text.data() + i, text.size() - i);
  return !mayNeedCare(word);
}

std::string_view QVJSONStringPieces::next() {
  constexpr std::string_view kHex = "0123456789ABCDEF";
  if (rest_.empty()) return {};
  if (const std::size_t run = runLength(rest_); run != 0) {
    const std::string_view piece = rest_.substr(0, run);
    rest_.remove_prefix(run);
    return piece;
  }
  const char byte = rest_.front();
  const auto number = static_cast<unsigned char>(byte);
  if (number >= 0x80) {
    rest_.remove_prefix(sequenceAt(rest_).length);
    return kReplacement;
  }
  rest_.remove_prefix(1);
  if (const char letter = escapeLetter(byte); letter != '\0') {
    escape_ = {'\\', letter};
    return {escape_.data(), 2};
  }
  escape_ = {'\\', 'u', '0', '0', kHex[number >> 4], kHex[number & 15]};
  return {escape_.data(), escape_.size()};
}

std::string_view QVWriteJSONReal(double number, QVJSONDigits& digits) {
  char* end = digits.data() + digits.size();
  const double magnitude = std::fabs(number);
  if (magnitude >= 1 && magnitude < kWholeNumbers && number == std::trunc(number)) {
    // The same digits, found faster.
    end = std::to_chars(digits.data(), end, static_cast<int64_t>(number)).ptr;
  } else {
    const bool fixed = number == 0 || (magnitude >= 1e-4 && magnitude < 1e17);
    end = std::to_chars(digits.data(), end, number,
                        fixed ? std::chars_format::fixed : std::chars_format::scientific)
              .ptr;
  }
  if (std::none_of(digits.data(), end, [](char c) { return c == '.' || c == 'e'; })) {
    *end++ = '.';
    *end++ = '0';
  }
  return {digits.data(), end};
}
