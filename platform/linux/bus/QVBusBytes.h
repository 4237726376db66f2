#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <type_traits>

// Loads of numbers from message bytes, which lie at any address. Pure; any thread.

template <class Number>
Number QVBusSwap(Number number) noexcept {
  if constexpr (sizeof(Number) == 2) {
    return static_cast<Number>(__builtin_bswap16(static_cast<uint16_t>(number)));
  } else if constexpr (sizeof(Number) == 4) {
    return static_cast<Number>(__builtin_bswap32(static_cast<uint32_t>(number)));
  } else if constexpr (sizeof(Number) == 8) {
    return static_cast<Number>(__builtin_bswap64(static_cast<uint64_t>(number)));
  } else {
    return number;
  }
}

template <class Number>
Number QVBusLoad(const char* at, bool bigEndian) noexcept {
  static_assert(std::is_integral_v<Number>);
  Number number;
  std::memcpy(&number, at, sizeof number);
  return bigEndian == (std::endian::native == std::endian::big) ? number : QVBusSwap(number);
}

// `position` rounded up to a multiple of `alignment`, which is a power of 2.
constexpr std::size_t QVBusAlign(std::size_t position, std::size_t alignment) noexcept {
  return (position + alignment - 1) & ~(alignment - 1);
}
