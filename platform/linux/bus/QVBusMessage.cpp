#include "platform/linux/bus/QVBusMessage.h"

#include "platform/linux/bus/QVBusNames.h"

#include <algorithm>

namespace {

// Bytes. Enough for all fields of a call, with names of usual length.
constexpr std::size_t kLongestRememberedHeader = kBusFixedHeaderBytes + 256;

// Reserved for a library's messages to itself; never to be sent.
constexpr std::string_view kLocalPath = "/org/freedesktop/DBus/Local";
constexpr std::string_view kLocalInterface = "org.freedesktop.DBus.Local";

// The type of a known field's value; 0 for an unknown field.
char typeOfField(unsigned code) noexcept {
  switch (static_cast<QVBusField>(code)) {
    case QVBusField::path:
      return 'o';
    case QVBusField::interface:
    case QVBusField::member:
    case QVBusField::errorName:
    case QVBusField::destination:
    case QVBusField::sender:
      return 's';
    case QVBusField::replySerial:
    case QVBusField::unixFDs:
      return 'u';
    case QVBusField::signature:
      return 'g';
  }
  return 0;
}

}  // namespace

const char* QVBusMessage::parse(std::string_view bytes) noexcept {
  *this = QVBusMessage();
  if (const char* reason = takeFixedPart(bytes)) return reason;
  if (type_ == QVBusMessageType::invalid) return "message of type 0";

  QVBusReader reader(bytes.substr(0, bytes.size() - body_.size()), bigEndian_);
  reader.readNumber<uint64_t>();  // what was taken above
  reader.readNumber<uint32_t>();
  const std::size_t end = reader.enterArray(8);
  while (reader.position() < end) readField(reader);
  reader.leaveArray(end);
  reader.align(8);
  if (!reader.ok()) return reader.failure();
  if (!reader.atEnd()) return "header longer than its fields";
  return checkFields();
}

const char* QVBusMessage::parse(std::string_view bytes, QVBusKnownHeader& known) {
  const std::size_t bodyLength = QVBusLoad<uint32_t>(bytes.data() + 4, bytes[0] == 'B');
  const auto header = bytes.substr(0, bytes.size() - bodyLength);
  if (known.matches(header)) {
    *this = known.message();
    if (const char* reason = takeFixedPart(bytes)) return reason;
    return checkBodyIsNamed();
  }
  const char* reason = parse(bytes);
  if (reason == nullptr && type_ == QVBusMessageType::methodCall) known.remember(header);
  return reason;
}

// Order, type, flags, serial and where the body lies.
const char* QVBusMessage::takeFixedPart(std::string_view bytes) noexcept {
  bigEndian_ = bytes[0] == 'B';
  type_ = static_cast<QVBusMessageType>(bytes[1]);
  flags_ = static_cast<uint8_t>(bytes[2]);
  const std::size_t bodyLength = QVBusLoad<uint32_t>(bytes.data() + 4, bigEndian_);
  body_ = bytes.substr(bytes.size() - bodyLength);
  serial_ = QVBusLoad<uint32_t>(bytes.data() + 8, bigEndian_);
  return serial_ == 0 ? "message without a serial" : nullptr;
}

void QVBusMessage::readField(QVBusReader& reader) noexcept {
  reader.enterStruct();
  const unsigned code = reader.readNumber<uint8_t>();
  const auto type = reader.enterVariantText();
  const char expected = typeOfField(code);
  if (!reader.ok()) {
    // Nothing more to be said.
  } else if (code == 0) {
    reader.fail("header field 0");
  } else if (expected == 0) {
    // Fields that we do not know are ignored, in good order.
    QVBusSignature signature;
    if (reader.parseVariantSignature(type, signature)) reader.skipValue(signature, 0);
  } else if (type.size() != 1 || type.front() != expected) {
    reader.fail("header field of the wrong type");
  } else if (has(static_cast<QVBusField>(code))) {
    reader.fail("header field given twice");
  } else {
    fields_ |= 1U << code;
    switch (static_cast<QVBusField>(code)) {
      case QVBusField::path:
        path_ = reader.readObjectPath();
        break;
      case QVBusField::interface:
        interface_ = reader.readString();
        break;
      case QVBusField::member:
        member_ = reader.readString();
        break;
      case QVBusField::errorName:
        errorName_ = reader.readString();
        break;
      case QVBusField::destination:
        destination_ = reader.readString();
        break;
      case QVBusField::sender:
        sender_ = reader.readString();
        break;
      case QVBusField::replySerial:
        replySerial_ = reader.readNumber<uint32_t>();
        break;
      case QVBusField::signature:
        signature_ = reader.readSignatureText();
        break;
      case QVBusField::unixFDs:
        // Handing over descriptors is refused during authentication.
        if (reader.readNumber<uint32_t>() != 0) reader.fail("message with file descriptors");
        break;
    }
  }
  reader.leaveVariant();
  reader.leaveStruct();
}

const char* QVBusMessage::checkFields() const noexcept {
  if (has(QVBusField::interface) && !QVBusIsValidInterfaceName(interface_)) {
    return "not an interface name";
  }
  if (has(QVBusField::member) && !QVBusIsValidMemberName(member_)) return "not a member name";
  if (has(QVBusField::errorName) && !QVBusIsValidInterfaceName(errorName_)) {
    return "not an error name";
  }
  if (has(QVBusField::destination) && !QVBusIsValidBusName(destination_)) {
    return "not a bus name as destination";
  }
  if (has(QVBusField::sender) && !QVBusIsValidBusName(sender_)) return "not a bus name as sender";
  if (has(QVBusField::replySerial) && replySerial_ == 0) return "reply to serial 0";
  if (path_ == kLocalPath || interface_ == kLocalInterface) return "message for local use only";

  switch (type_) {
    case QVBusMessageType::methodCall:
      if (!has(QVBusField::path) || !has(QVBusField::member)) {
        return "call without path or member";
      }
      break;
    case QVBusMessageType::methodReturn:
      if (!has(QVBusField::replySerial)) return "return without a reply serial";
      break;
    case QVBusMessageType::error:
      if (!has(QVBusField::replySerial) || !has(QVBusField::errorName)) {
        return "error without reply serial or error name";
      }
      break;
    case QVBusMessageType::signal:
      if (!has(QVBusField::path) || !has(QVBusField::interface) || !has(QVBusField::member)) {
        return "signal without path, interface or member";
      }
      break;
    default:
      break;
  }
  return checkBodyIsNamed();
}

const char* QVBusMessage::checkBodyIsNamed() const noexcept {
  return !body_.empty() && signature_.empty() ? "body without a signature" : nullptr;
}

const char* QVBusMessage::checkBody() const noexcept {
  QVBusSignature signature;
  if (!signature.parse(signature_)) return "not a signature";
  QVBusReader reader = bodyReader();
  for (std::size_t index = 0; index < signature.length() && reader.ok();
       index = signature.endOf(index)) {
    reader.skipValue(signature, index);
  }
  if (!reader.ok()) return reader.failure();
  return reader.atEnd() ? nullptr : "body longer than its signature";
}

bool QVBusKnownHeader::matches(std::string_view header) const noexcept {
  // Byte order and type, then from the fields' length on: what lies between differs by message.
  return header.size() == header_.size() && header[0] == header_[0] && header[1] == header_[1] &&
         header.substr(12) == std::string_view(header_).substr(12);
}

void QVBusKnownHeader::remember(std::string_view header) {
  if (header.size() > kLongestRememberedHeader) return;
  header_ = header;
  std::fill_n(header_.begin() + 4, sizeof(uint32_t), '\0');  // no body here
  if (message_.parse(header_) != nullptr) header_.clear();
}
