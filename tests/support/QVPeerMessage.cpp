#include "tests/support/QVPeerMessage.h"

#include "platform/QVText.h"
#include "platform/linux/bus/QVBusMessage.h"
#include "platform/linux/bus/QVBusReader.h"
#include "platform/linux/bus/QVBusValueDecoder.h"

#include <stdexcept>

QVPeerMessage QVPeerMessage::fromBytes(std::string_view bytes) {
  QVBusMessage message;
  const char* reason = message.parse(bytes);
  if (reason == nullptr) reason = message.checkBody();
  if (reason != nullptr) throw std::runtime_error(QVText("the service sent: ", reason));
  return {.type = message.type(),
          .replySerial = message.replySerial(),
          .errorName = std::string(message.errorName()),
          .signature = std::string(message.signature()),
          .body = std::string(message.body())};
}

void QVPeerMessage::expect(std::string_view expectedSignature) const {
  if (isReturn() && signature == expectedSignature) return;
  throw std::runtime_error(QVText("not a return of ", expectedSignature, " but ", description()));
}

bool QVPeerMessage::boolean() const {
  expect("b");
  return QVBusReader(body, false).readBoolean();
}

uint16_t QVPeerMessage::unsigned16() const {
  expect("q");
  return QVBusReader(body, false).readNumber<uint16_t>();
}

std::string QVPeerMessage::string() const {
  // The text of an error, too.
  if (type != QVBusMessageType::error || signature != "s") expect("s");
  return std::string(QVBusReader(body, false).readString());
}

std::vector<int64_t> QVPeerMessage::integers() const {
  expect("ax");
  QVBusReader reader(body, false);
  const std::size_t end = reader.enterArray(8);
  std::vector<int64_t> numbers;
  while (reader.position() < end) numbers.push_back(reader.readNumber<int64_t>());
  return numbers;
}

QVDictionary QVPeerMessage::dictionary() const {
  expect("a{sv}");
  QVBusReader reader(body, false);
  return QVBusValueDecoder().readDictionary(reader, nullptr);
}

std::string QVPeerMessage::description() const {
  if (type != QVBusMessageType::error) {
    return QVText("a message of type ", static_cast<int>(type), " and signature '", signature, "'");
  }
  return signature == "s" ? QVText("error ", errorName, ": ", string())
                          : QVText("error ", errorName);
}
