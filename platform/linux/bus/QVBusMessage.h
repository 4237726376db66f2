#pragma once

#include "platform/linux/bus/QVBusProtocol.h"
#include "platform/linux/bus/QVBusReader.h"

#include <cstdint>
#include <string>
#include <string_view>

class QVBusKnownHeader;

// One message: its header, checked, and its body, to be read. Views of the message's bytes; as
// short-lived as those.
//
// Used by both sides: the service for calls, the client library for replies. The header is checked
// as a whole by parse(). The body's signature and the body are checked by whoever reads the body as
// the types it expects (a signature that equals the expected text needs no further check), and by
// checkBody() in all other cases; every message goes through one of the two.
//
// Threads: one at a time. Made on the stack, may be parsed into again.
class QVBusMessage {
 public:
  // Takes in one message as QVBusFrameDecoder cut it out. Null where its header is in order, else
  // the reason why it is not.
  [[nodiscard]] const char* parse(std::string_view bytes) noexcept;
  // The same, quicker for one of a row of calls to the same member: fields that equal those in
  // `known` byte by byte are known to be in order. The views may then lie in `known`.
  [[nodiscard]] const char* parse(std::string_view bytes, QVBusKnownHeader& known);

  // Checks the signature and every value of the body. Null or the reason.
  [[nodiscard]] const char* checkBody() const noexcept;

  // May be a type that is not defined yet.
  QVBusMessageType type() const noexcept { return type_; }
  bool noReplyExpected() const noexcept { return (flags_ & kBusNoReplyExpected) != 0; }
  uint32_t serial() const noexcept { return serial_; }
  uint32_t replySerial() const noexcept { return replySerial_; }

  // Header fields; empty where there is none.
  std::string_view path() const noexcept { return path_; }
  std::string_view interface() const noexcept { return interface_; }
  std::string_view member() const noexcept { return member_; }
  std::string_view errorName() const noexcept { return errorName_; }
  std::string_view destination() const noexcept { return destination_; }
  std::string_view sender() const noexcept { return sender_; }
  std::string_view signature() const noexcept { return signature_; }

  QVBusReader bodyReader() const noexcept { return {body_, bigEndian_}; }
  std::string_view body() const noexcept { return body_; }

 private:
  void readField(QVBusReader& reader) noexcept;
  const char* takeFixedPart(std::string_view bytes) noexcept;
  const char* checkFields() const noexcept;
  const char* checkBodyIsNamed() const noexcept;
  bool has(QVBusField field) const noexcept {
    return (fields_ & (1U << static_cast<unsigned>(field))) != 0;
  }

  std::string_view path_, interface_, member_, errorName_, destination_, sender_, signature_, body_;
  uint32_t serial_ = 0;
  uint32_t replySerial_ = 0;
  uint32_t fields_ = 0;  // a bit for each known field that was there
  QVBusMessageType type_ = QVBusMessageType::invalid;
  uint8_t flags_ = 0;
  bool bigEndian_ = false;
};

// The fields of the last call that a connection took in, and what they say. A client's calls differ
// in serial and body, seldom in the fields, and checking their names takes longer than all the rest
// of a message.
//
// Threads: one at a time. One per connection.
// Limits: only fields of up to 256 bytes are remembered.
class QVBusKnownHeader {
 public:
  QVBusKnownHeader() = default;
  QVBusKnownHeader(const QVBusKnownHeader&) = delete;
  QVBusKnownHeader& operator=(const QVBusKnownHeader&) = delete;

  // Does the message that begins with `header` have these fields, in the same byte order and type?
  bool matches(std::string_view header) const noexcept;
  const QVBusMessage& message() const noexcept { return message_; }
  void remember(std::string_view header);

 private:
  std::string header_;
  QVBusMessage message_;  // views of header_
};
