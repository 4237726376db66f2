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

bool QVBusIsValidText(std::string_view text) noexcept {
  constexpr uint64_t kOnes = 0x0101010101010101;
  constexpr uint64_t kHighs = 0x8080808080808080;
  const auto* at = reinterpret_cast<const unsigned char*>(text.data());
  std::size_t left = text.size();
  while (left != 0) {
    // Eight bytes at once where none has its high bit set and none is 0 (a 0 borrows in the
    // subtraction, which sets the high bit). Nearly every text is done here.
    while (left >= sizeof(uint64_t)) {
      uint64_t word;
      std::memcpy(&word, at, sizeof word);
      if (((word | (word - kOnes)) & kHighs) != 0) break;
      at += sizeof word;
      left -= sizeof word;
    }
    // The rest, or up to the end of what the word could not settle.
    std::size_t together = left < sizeof(uint64_t) ? left : sizeof(uint64_t);
    while (together != 0) {
      std::size_t length = 1;
      if (*at >= 0x80) {
        length = lengthOfSequence(at, left);
        if (length == 0) return false;
      } else if (*at == 0) {
        return false;
      }
      at += length;
      left -= length;
      together -= length < together ? length : together;
    }
  }
  return true;
}
