#include "client/QVClientRequest.h"

#include "platform/linux/bus/QVBusBytes.h"
#include "platform/linux/bus/QVBusProtocol.h"
#include "platform/linux/bus/QVBusWriter.h"

#include <array>
#include <bit>
#include <cstring>
#include <memory>

namespace {

constexpr const char* kPath = "/net/quillon/quietvox/ReportingService";
constexpr const char* kInterface = "net.quillon.quietvox.ReportingService";

// Where a header holds its flags, the body's length and the serial.
constexpr std::size_t kFlagsAt = 2;
constexpr std::size_t kBodyLengthAt = 4;
constexpr std::size_t kSerialAt = 8;

struct Member {
  const char* name;
  const char* signature;
};

constexpr std::array<Member, 11> kMembers{{{"CreateReportingSession", "x"},
                                           {"SetServiceType", "qx"},
                                           {"GetServiceNameForReporterID", "x"},
                                           {"SetConfiguration", "a{sv}x"},
                                           {"StartReportingSessionForID", "x"},
                                           {"SendMessage", "a{sv}uqbax"},
                                           {"StopReportingSessionForID", "x"},
                                           {"DestroyReportingSession", "x"},
                                           {"ReporterIDValid", "x"},
                                           {"GetAllReporters", ""},
                                           {"KillService", ""}}};

// The headers of all operations, made once: calls to one operation differ only in flags, length
// and serial. Never destroyed: a reporter that a program keeps in a global sends what is left when
// the program has left main(), after constants that were made later are gone.
const std::string& headerOf(QVClientOperation operation) {
  using Headers = std::array<std::string, kMembers.size()>;
  static const Headers& kHeaders = *[] {
    auto made = std::make_unique<Headers>();
    Headers& headers = *made;
    for (std::size_t i = 0; i < kMembers.size(); ++i) {
      QVBusWriter(headers[i])
          .beginMessage({.path = kPath,
                         .interface = kInterface,
                         .member = kMembers[i].name,
                         .signature = kMembers[i].signature});
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
    case QVClientOperation::getAllReporters:
    case QVClientOperation::killService:
      return 0;
    case QVClientOperation::setServiceType:
      return 16;
    case QVClientOperation::setConfiguration:
      return QVBusAlign(kBeforeEntries + entryBytes(request), 8) + 8;
    case QVClientOperation::sendMessage: {
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
    case QVClientOperation::getAllReporters:
    case QVClientOperation::killService:
      break;
    case QVClientOperation::setServiceType:
      writer.writeNumber(static_cast<uint16_t>(serviceType));
      writer.writeNumber(targets.reporterIDs().front());
      break;
    case QVClientOperation::setConfiguration:
      appendPayload(out, *payload);
      writer.writeNumber(targets.reporterIDs().front());
      break;
    case QVClientOperation::sendMessage:
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
