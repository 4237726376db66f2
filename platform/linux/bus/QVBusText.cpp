#include "platform/linux/bus/QVBusText.h"

#include <cstdint>
#include <cstring>

namespace {

bool isContinuation(unsigned char c) noexcept {
  return (c & 0xC0) == 0x80;
}

// The length of the character of several bytes that begins at `at`; 0 where it is not valid.
std::size_t lengthOfSequence(const unsigned char* at, std::size_t available) noexcept {
  const unsigned char first = at[0];
  if (first >= 0xC2 && first <= 0xDF) {
    return available >= 2 && isContinuation(at[1]) ? 2 : 0;
  }
  if (first >= 0xE0 && first <= 0xEF) {
    if (available < 3 || !isContinuation(at[1]) || !isContinuation(at[2])) return 0;
    if (first == 0xE0 && at[1] < 0xA0) return 0;   // overlong
    if (first == 0xED && at[1] >= 0xA0) return 0;  // surrogates
    return 3;
  }
  if (first >= 0xF0 && first <= 0xF4) {
    if (available < 4 || !isContinuation(at[1]) || !isContinuation(at[2]) ||
        !isContinuation(at[3])) {
      return 0;
    }
    if (first == 0xF0 && at[1] < 0x90) return 0;   // overlong
    if (first == 0xF4 && at[1] >= 0x90) return 0;  // above U+10FFFF
    return 4;
  }
  return 0;
}

}  // namespace

bool QVBusIsValidTextBytewise(std::string_view text) noexcept {
  const auto* at = reinterpret_cast<const unsigned char*>(text.data());
  const auto* end = at + text.size();
  while (at < end) {
    // What is settled by words stays so within a long text with a few other characters in it.
    uint64_t word;
    if (static_cast<std::size_t>(end - at) >= sizeof word) {
      std::memcpy(&word, at, sizeof word);
      if (QVBusIsPlainWord(word)) {
        at += sizeof word;
        continue;
      }
    }
    std::size_t length = 1;
    if (*at >= 0x80) {
      length = lengthOfSequence(at, static_cast<std::size_t>(end - at));
      if (length == 0) return false;
    } else if (*at == 0) {
      return false;
    }
    at += length;
  }
  return true;
}
