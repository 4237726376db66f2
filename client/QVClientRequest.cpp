#include "client/QVClientRequest.h"

#include "platform/linux/bus/QVBusBytes.h"
#include "platform/linux/bus/QVBusProtocol.h"
#include "platform/linux/bus/QVBusWriter.h"

#include <array>
#include <bit>
#include <cstring>
#include <memory>

namespace {

using Operation = QVReportingServiceOperation;

// Where a header holds its flags, the body's length and the serial.
constexpr std::size_t kFlagsAt = 2;
constexpr std::size_t kBodyLengthAt = 4;
constexpr std::size_t kSerialAt = 8;

// The headers of all operations, made once: calls to one operation differ only in flags, length
// and serial. Never destroyed: a reporter that a program keeps in a global sends what is left when
// the program has left main(), after constants that were made later are gone.
const std::string& headerOf(Operation operation) {
  using Headers = std::array<std::string, kReportingServiceMembers.size()>;
  static const Headers& kHeaders = *[] {
    auto made = std::make_unique<Headers>();
    Headers& headers = *made;
    for (std::size_t i = 0; i < headers.size(); ++i) {
      const QVBusMemberDescription& member = kReportingServiceMembers[i];
      QVBusWriter(headers[i])
          .beginMessage({.path = kReportingServicePath,
                         .interface = member.interface,
                         .member = member.member,
                         .signature = member.in});
    }
    return made.release();
  }();
  return kHeaders[static_cast<std::size_t>(operation)];
}

void enter(char* at, uint32_t number) noexcept {
  if constexpr (std::endian::native == std::endian::big) number = QVBusSwap(number);
  std::memcpy(at, &number, sizeof number);
}

// A dictionary's length, and the padding in front of its entries.
constexpr std::size_t kBeforeEntries = 8;

// Of a call that has a payload.
std::size_t entryBytes(const QVClientRequest& request) noexcept {
  return request.payload == nullptr ? 0 : request.payload->entries().size();
}

std::size_t bodyBytes(const QVClientRequest& request) noexcept {
  switch (request.operation) {
    case Operation::getAllReporters:
    case Operation::killService:
      return 0;
    case Operation::setServiceType:
      return 16;
    case Operation::setConfiguration:
      return QVBusAlign(kBeforeEntries + entryBytes(request), 8) + 8;
    case Operation::sendMessage: {
      const std::size_t numbers = QVBusAlign(kBeforeEntries + entryBytes(request), 4);
      const auto reporterIDs = request.targets.reporterIDs();
      // Category, type, everySession and the list's length take 4 bytes each with their padding.
      return QVBusAlign(numbers + 16, 8) + reporterIDs.size() * sizeof(int64_t);
    }
    default:
      return 8;
  }
}

// Copies a payload: the one copy between the program and the socket.
void appendPayload(std::string& out, const QVClientPayload& payload) {
  const std::string_view entries = payload.entries();
  char lengthAndPadding[kBeforeEntries] = {};
  enter(lengthAndPadding, static_cast<uint32_t>(entries.size()));
  out.append(lengthAndPadding, sizeof lengthAndPadding);
  out.append(entries);
}

void appendMessageArguments(std::string& out, QVBusWriter& writer, const QVClientRequest& request) {
  appendPayload(out, *request.payload);
  writer.writeNumber(request.category.word);
  writer.writeNumber(static_cast<uint16_t>(request.messageType));
  writer.writeBoolean(request.targets.reachesEverySession());
  const auto list = writer.beginArray(8);
  for (const int64_t reporterID : request.targets.reporterIDs()) writer.writeNumber(reporterID);
  writer.endArray(list);
}

}  // namespace

std::size_t QVClientRequest::messageBytes() const noexcept {
  return headerOf(operation).size() + bodyBytes(*this);
}

QVClientError QVClientRequest::check() const {
  if (payload != nullptr && !payload->ok()) return payload->error();
  if (messageBytes() > kBusMaximumMessageBytes) {
    return {QVClientError::Code::messageTooLarge, "the call is larger than 8 MiB"};
  }
  return {};
}

void QVClientRequest::appendTo(std::string& out, uint32_t serial, bool answered) const {
  const std::size_t start = out.size();
  const std::string& header = headerOf(operation);
  // Alignment counts from where the writer is made; a header's length is a multiple of 8.
  QVBusWriter writer(out);
  out.append(header);
  switch (operation) {
    case Operation::getAllReporters:
    case Operation::killService:
      break;
    case Operation::setServiceType:
      writer.writeNumber(static_cast<uint16_t>(serviceType));
      writer.writeNumber(targets.reporterIDs().front());
      break;
    case Operation::setConfiguration:
      appendPayload(out, *payload);
      writer.writeNumber(targets.reporterIDs().front());
      break;
    case Operation::sendMessage:
      appendMessageArguments(out, writer, *this);
      break;
    default:
      writer.writeNumber(targets.reporterIDs().front());
      break;
  }
  char* message = out.data() + start;
  if (!answered) message[kFlagsAt] = static_cast<char>(kBusNoReplyExpected);
  enter(message + kBodyLengthAt, static_cast<uint32_t>(out.size() - start - header.size()));
  enter(message + kSerialAt, serial);
}
