#pragma once

#include "platform/QVValue.h"
#include "platform/linux/bus/QVBusProtocol.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// What a message's header says. Empty texts and 0 as reply serial are left out. The texts must keep
// to the protocol's rules; the writer does not check its own side.
struct QVBusHeader {
  QVBusMessageType type = QVBusMessageType::methodCall;
  uint8_t flags = 0;
  uint32_t serial = 0;
  uint32_t replySerial = 0;
  // Each with its initializer, so that naming some of them is no warning.
  std::string_view path{};
  std::string_view interface {};
  std::string_view member{};
  std::string_view errorName{};
  std::string_view destination{};
  std::string_view sender{};
  std::string_view signature{};
};

// Marshals messages, little endian, behind whatever the given buffer holds already.
//
//   QVBusWriter writer(buffer);
//   writer.beginMessage({.type = QVBusMessageType::methodReturn, ..., .signature = "b"});
//   writer.writeBoolean(true);
//   writer.endMessage();
//
// Threads: one at a time. Made on the stack; refers to the buffer, which nobody else changes
// meanwhile.
class QVBusWriter {
 public:
  explicit QVBusWriter(std::string& out) noexcept : out_(out), start_(out.size()) {}

  void beginMessage(const QVBusHeader& header);
  // Enters the body's length. Answers the message's length.
  std::size_t endMessage();

  void writeByte(uint8_t value) { out_.push_back(static_cast<char>(value)); }
  void writeBoolean(bool value) { writeNumber<uint32_t>(value ? 1 : 0); }
  void writeDouble(double value);
  template <class Number>
  void writeNumber(Number value) {
    static_assert(std::is_integral_v<Number>);
    align(sizeof(Number));
    char bytes[sizeof(Number)];
    store(bytes, value);
    out_.append(bytes, sizeof bytes);
  }
  // Strings and object paths. They must be valid (QVBusIsValidText).
  void writeString(std::string_view value);
  void writeSignature(std::string_view value);

  // An array: what beginArray() answers goes to endArray() after the elements.
  struct Array {
    std::size_t lengthAt;
    std::size_t begin;
  };
  Array beginArray(std::size_t elementAlignment);
  void endArray(Array array);
  // A struct or a dictionary's entry; has no end of its own.
  void beginStruct() { align(8); }
  // A variant with that signature; its value follows.
  void beginVariant(std::string_view signature) { writeSignature(signature); }

  // A variant of the value's kind: b, x, t, d, s, av or a{sv}. There is no absent value on the
  // bus: it must not be given here, and entries and items that hold one are left out.
  void writeVariant(const QVValue& value);
  // As a{sv}.
  void writeDictionary(const QVDictionary& dictionary);

  void align(std::size_t alignment) {
    const std::size_t position = out_.size() - start_;
    const std::size_t padding = (0 - position) & (alignment - 1);
    if (padding != 0) out_.append(padding, '\0');
  }

 private:
  template <class Number>
  static void store(char* at, Number value) noexcept {
    for (std::size_t i = 0; i < sizeof(Number); ++i) {
      at[i] = static_cast<char>(static_cast<uint64_t>(value) >> (8 * i));
    }
  }
  void writeField(QVBusField code, char type, std::string_view text);

  std::string& out_;
  std::size_t start_;  // where the message begins: alignment counts from there
  std::size_t bodyStart_ = 0;
};
