#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

// Is `text` what a string on the bus may be: UTF-8 in shortest form, no surrogates, nothing above
// U+10FFFF, no NUL? Pure; any thread. The second is the first without its quick answer.
inline bool QVBusIsValidText(std::string_view text) noexcept;
bool QVBusIsValidTextBytewise(std::string_view text) noexcept;

// Are the eight bytes of `word` all in 1..127? A 0 borrows in the subtraction, which sets its high
// bit; a borrow may also strike the byte behind it, but only where there is a 0 in any case.
constexpr bool QVBusIsPlainWord(uint64_t word) noexcept {
  return ((word | (word - 0x0101010101010101)) & 0x8080808080808080) == 0;
}

// Nearly every text is plain ASCII, which is settled eight bytes at a time; the last word overlaps
// the one before. Inline, because it runs for every key and every value.
inline bool QVBusIsValidText(std::string_view text) noexcept {
  const char* at = text.data();
  const std::size_t length = text.size();
  uint64_t word = 0;
  if (length >= sizeof word) {
    const char* last = at + length - sizeof word;
    for (; at < last; at += sizeof word) {
      std::memcpy(&word, at, sizeof word);
      if (!QVBusIsPlainWord(word)) return QVBusIsValidTextBytewise(text);
    }
    std::memcpy(&word, last, sizeof word);
  } else if (length >= sizeof(uint32_t)) {
    uint32_t first, second;
    std::memcpy(&first, at, sizeof first);
    std::memcpy(&second, at + length - sizeof second, sizeof second);
    word = uint64_t{second} << 32 | first;
  } else {
    return QVBusIsValidTextBytewise(text);
  }
  return QVBusIsPlainWord(word) || QVBusIsValidTextBytewise(text);
}
