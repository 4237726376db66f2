#pragma once

#include "platform/linux/bus/QVBusBytes.h"
#include "platform/linux/bus/QVBusProtocol.h"
#include "platform/linux/bus/QVBusSignature.h"
#include "platform/linux/bus/QVBusText.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

// Unmarshals and checks the values of one message, in either byte order, one after the other.
//
// Failures stick: after the first broken rule every reading answers 0 or an empty text, loops over
// arrays end, and failure() says why. So code reads a whole structure and asks once at the end.
// Texts are views of the message's bytes.
//
// Threads: one at a time. Made on the stack.
class QVBusReader {
 public:
  // Alignment counts from the first of `bytes`.
  QVBusReader(std::string_view bytes, bool bigEndian) noexcept
      : bytes_(bytes), bigEndian_(bigEndian) {}

  bool ok() const noexcept { return failure_ == nullptr; }
  const char* failure() const noexcept { return failure_; }
  std::size_t position() const noexcept { return position_; }
  bool atEnd() const noexcept { return position_ == bytes_.size(); }
  [[gnu::cold]] void fail(const char* reason) noexcept;

  // Goes to the next multiple of `alignment`; the bytes between must be 0.
  void align(std::size_t alignment) noexcept {
    const std::size_t aligned = QVBusAlign(position_, alignment);
    if (aligned == position_) return;
    if (bytes_.size() - position_ >= sizeof(uint64_t)) [[likely]] {
      // All of the padding, which is less than a word, in one.
      const auto word = QVBusLoad<uint64_t>(bytes_.data() + position_, false);
      if (word << (64 - 8 * (aligned - position_)) == 0) {
        position_ = aligned;
        return;
      }
    }
    skipPadding(aligned);
  }

  template <class Number>
  Number readNumber() noexcept {
    align(sizeof(Number));
    if (bytes_.size() - position_ < sizeof(Number)) [[unlikely]] {
      fail("truncated");
      return 0;
    }
    const auto number = QVBusLoad<Number>(bytes_.data() + position_, bigEndian_);
    position_ += sizeof(Number);
    return number;
  }
  bool readBoolean() noexcept;
  double readDouble() noexcept { return std::bit_cast<double>(readNumber<uint64_t>()); }
  std::string_view readString() noexcept {
    const auto text = readTerminated(readNumber<uint32_t>());
    if (!QVBusIsValidText(text)) [[unlikely]] {
      fail("a string is not UTF-8 without NUL");
      return {};
    }
    return text;
  }
  std::string_view readObjectPath() noexcept;
  // A signature's text; its grammar is left to QVBusSignature::parse().
  std::string_view readSignatureText() noexcept { return readTerminated(readNumber<uint8_t>()); }

  // Containers. Each enter is followed by a leave, whatever fails between.
  //
  // An array: read elements while position() is below what this answers, then leaveArray() with it.
  std::size_t enterArray(std::size_t elementAlignment) noexcept;
  void leaveArray(std::size_t end) noexcept;
  // A struct or a dictionary's entry.
  void enterStruct() noexcept {
    deepen();
    align(8);
  }
  void leaveStruct() noexcept { --depth_; }
  // A variant: its signature's text, which nobody has checked. Exactly one complete type is
  // allowed: a single character of a basic type, or what parseVariantSignature() accepts.
  std::string_view enterVariantText() noexcept {
    deepen();
    return readSignatureText();
  }
  void leaveVariant() noexcept { --depth_; }
  // Checks that a variant's signature is one complete type.
  bool parseVariantSignature(std::string_view text, QVBusSignature& signature) noexcept;

  // Reads over one complete type, the one at `index` of the signature, checking every rule.
  void skipValue(const QVBusSignature& signature, std::size_t index) noexcept;
  void skipBasic(char type) noexcept;

 private:
  // A text of that length and the NUL behind it, which the length does not count.
  std::string_view readTerminated(std::size_t length) noexcept {
    if (bytes_.size() - position_ <= length) [[unlikely]] {
      fail("truncated");
      return {};
    }
    const char* text = bytes_.data() + position_;
    if (text[length] != 0) [[unlikely]] {
      fail("a text is not ended by NUL");
      return {};
    }
    position_ += length + 1;
    return {text, length};
  }
  void skipPadding(std::size_t aligned) noexcept;
  void deepen() noexcept {
    if (++depth_ > kBusMaximumDepth) [[unlikely]]
      fail("containers nested too deeply");
  }
  void skipVariant() noexcept;
  void skipArray(const QVBusSignature& signature, std::size_t element) noexcept;

  std::string_view bytes_;
  std::size_t position_ = 0;
  const char* failure_ = nullptr;
  unsigned depth_ = 0;
  bool bigEndian_;
};
