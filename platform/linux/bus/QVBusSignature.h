#pragma once

#include "platform/linux/bus/QVBusProtocol.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

// A checked signature: which types lie one after the other in a body or a variant.
//
// Borrows its text. Made on the stack while a message is read; knows where each complete type ends,
// so that walking a message takes time in proportion to its bytes, whatever its types.
class QVBusSignature {
 public:
  // Takes `text` in; false where it breaks a rule (the object is of no use then).
  [[nodiscard]] bool parse(std::string_view text) noexcept;

  std::string_view text() const noexcept { return text_; }
  std::size_t length() const noexcept { return text_.size(); }
  char typeAt(std::size_t index) const noexcept { return text_[index]; }
  // The index behind the complete type that begins at `index`.
  std::size_t endOf(std::size_t index) const noexcept { return ends_[index]; }
  bool isSingleType() const noexcept { return !text_.empty() && endOf(0) == text_.size(); }

  // A type of one character that holds no other: numbers, booleans, texts, descriptors.
  static bool isBasic(char type) noexcept;
  // 1, 2, 4 or 8; 0 for what is no type at all.
  static std::size_t alignmentOf(char type) noexcept;
  // The size of a type whose every value of that size is valid; 0 for all others.
  static std::size_t fixedSizeOf(char type) noexcept;

 private:
  std::size_t parseType(std::size_t index, unsigned arrays, unsigned structs) noexcept;
  std::size_t parseArray(std::size_t index, unsigned arrays, unsigned structs) noexcept;
  std::size_t parseStruct(std::size_t index, unsigned arrays, unsigned structs) noexcept;

  std::string_view text_;
  std::array<uint8_t, kBusMaximumSignatureLength> ends_;  // set where a complete type begins
};
