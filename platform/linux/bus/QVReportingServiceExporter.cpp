#include "platform/linux/bus/QVReportingServiceExporter.h"

#include "platform/QVText.h"
#include "platform/linux/bus/QVBusPendingReply.h"

#include <algorithm>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace {

// Reporter IDs that one message may list: as many as one connection may have sessions. Each is a
// send of its own, all of them in one turn of the server queue.
constexpr std::size_t kMostReporterIDs = 65'536;

Reply<bool> booleanReply(const QVBusCall& call) {
  return [reply = QVBusPendingReply(call)](bool value) { reply->giveBoolean(value); };
}

// The service type is 16 bits wide by contract, which the value itself does not tell.
void writeValidity(QVBusWriter& writer, const QVDictionary& dictionary) {
  const auto array = writer.beginArray(8);
  for (const auto& entry : dictionary) {
    if (entry.value.isAbsent()) continue;
    writer.beginStruct();
    writer.writeString(entry.key);
    if (entry.key == "serviceType") {
      writer.beginVariant("q");
      writer.writeNumber(static_cast<uint16_t>(entry.value.integerValue()));
    } else {
      writer.writeVariant(entry.value);
    }
  }
  writer.endArray(array);
}

void giveErrorObject(const QVBusReply& reply, const QVError& error) {
  auto name = QVText(error.domain, ".Code", error.code);
  // A negative code: an error's name may hold no "-".
  std::replace(name.begin(), name.end(), '-', '_');
  const bool switchedOff =
      error.domain == kQVReportingErrorDomain && error.code == kQVReportingErrorSwitchedOff;
  reply.giveError(name, switchedOff ? std::string(kReportingSwitchedOffText) : error.description());
}

// Why a body that had the expected signature is not in order; null if it is.
const char* failureOf(const QVBusReader& reader) {
  if (!reader.ok()) return reader.failure();
  return reader.atEnd() ? nullptr : "body longer than its signature";
}

}  // namespace

const char* QVReportingServiceExporter::handle(const QVBusCall& call) {
  const QVBusMessage& message = call.message;
  if (message.path() == kReportingServicePath &&
      (message.interface() == kReportingServiceInterface || message.interface().empty())) {
    const auto* member = std::find_if(
        kReportingServiceMembers.begin(), kReportingServiceMembers.end(),
        [&message](const auto& candidate) { return candidate.member == message.member(); });
    if (member != kReportingServiceMembers.end() && call.object != nullptr) {
      // A body of the expected signature is checked while it is read.
      if (message.signature() == member->in) {
        return perform(
            static_cast<QVReportingServiceOperation>(member - kReportingServiceMembers.begin()),
            call);
      }
      if (const char* reason = message.checkBody()) return reason;
      QVBusExpectSignature(call, member->in);
      return nullptr;
    }
  }
  return standardInterfaces_.handle(call);
}

const char* QVReportingServiceExporter::perform(QVReportingServiceOperation operation,
                                                const QVBusCall& call) {
  using Operation = QVReportingServiceOperation;
  switch (operation) {
    case Operation::sendMessage:
      return sendMessage(call);
    case Operation::setConfiguration:
      return setConfiguration(call);
    case Operation::setServiceType:
      return setServiceType(call);
    case Operation::getAllReporters:
      if (const char* reason = failureOf(call.message.bodyReader())) return reason;
      call.object->getAllReporters(
          [reply = QVBusPendingReply(call)](const std::vector<int64_t>& reporterIDs) {
            reply->give("ax", [&reporterIDs](QVBusWriter& writer) {
              const auto array = writer.beginArray(8);
              for (const int64_t reporterID : reporterIDs) writer.writeNumber(reporterID);
              writer.endArray(array);
            });
          });
      return nullptr;
    case Operation::killService:
      if (const char* reason = failureOf(call.message.bodyReader())) return reason;
      call.object->killService(booleanReply(call));
      return nullptr;
    default:
      return performOnReporter(operation, call);
  }
}

const char* QVReportingServiceExporter::performOnReporter(QVReportingServiceOperation operation,
                                                          const QVBusCall& call) {
  auto reader = call.message.bodyReader();
  const auto reporterID = reader.readNumber<int64_t>();
  if (const char* reason = failureOf(reader)) return reason;

  using Operation = QVReportingServiceOperation;
  switch (operation) {
    case Operation::createReportingSession:
      call.object->createReportingSession(reporterID, booleanReply(call));
      break;
    case Operation::startReportingSessionForID:
      call.object->startReportingSessionForID(reporterID, booleanReply(call));
      break;
    case Operation::stopReportingSessionForID:
      call.object->stopReportingSessionForID(reporterID, booleanReply(call));
      break;
    case Operation::destroyReportingSession:
      call.object->destroyReportingSession(reporterID, booleanReply(call));
      break;
    case Operation::getServiceNameForReporterID:
      call.object->getServiceNameForReporterID(reporterID, [reply = QVBusPendingReply(call)](
                                                               uint16_t serviceType) {
        reply->give("q", [serviceType](QVBusWriter& writer) { writer.writeNumber(serviceType); });
      });
      break;
    case Operation::reporterIDValid:
      call.object->reporterID(reporterID, [reply = QVBusPendingReply(call)](
                                              const QVDictionary& validity) {
        reply->give("a{sv}", [&validity](QVBusWriter& writer) { writeValidity(writer, validity); });
      });
      break;
    default:
      break;
  }
  return nullptr;
}

const char* QVReportingServiceExporter::setServiceType(const QVBusCall& call) {
  auto reader = call.message.bodyReader();
  const auto serviceType = reader.readNumber<uint16_t>();
  const auto reporterID = reader.readNumber<int64_t>();
  if (const char* reason = failureOf(reader)) return reason;
  call.object->setServiceType(serviceType, reporterID, booleanReply(call));
  return nullptr;
}

const char* QVReportingServiceExporter::setConfiguration(const QVBusCall& call) {
  auto reader = call.message.bodyReader();
  auto configuration = decoder_.readDictionary(reader, call.charge);
  const auto reporterID = reader.readNumber<int64_t>();
  if (const char* reason = failureOf(reader)) return reason;
  if (const char* refusal = decoder_.refusal()) {
    call.reply.giveError(kBusErrorInvalidArgs, refusal);
    return nullptr;
  }
  call.object->setConfiguration(std::move(configuration), reporterID, booleanReply(call));
  return nullptr;
}

const char* QVReportingServiceExporter::sendMessage(const QVBusCall& call) {
  auto reader = call.message.bodyReader();
  auto message = decoder_.readDictionary(reader, call.charge);
  const auto category = reader.readNumber<uint32_t>();
  const auto type = reader.readNumber<uint16_t>();
  const bool everySession = reader.readBoolean();
  const std::size_t end = reader.enterArray(8);
  QVReportingServiceProtocol::ReporterIDs reporterIDs(std::in_place);
  reporterIDs->reserve((end - reader.position()) / sizeof(int64_t));
  while (reader.position() < end) reporterIDs->push_back(reader.readNumber<int64_t>());
  reader.leaveArray(end);
  if (const char* reason = failureOf(reader)) return reason;

  if (everySession && !reporterIDs->empty()) {
    call.reply.giveError(kBusErrorInvalidArgs,
                         "SendMessage to every session takes no list of reporter IDs");
    return nullptr;
  }
  if (const char* refusal = decoder_.refusal()) {
    call.reply.giveError(kBusErrorInvalidArgs, refusal);
    return nullptr;
  }
  if (reporterIDs->size() > kMostReporterIDs) {
    call.reply.giveError(kBusErrorInvalidArgs, "SendMessage takes no more than 65536 reporter IDs");
    return nullptr;
  }
  QVBusPendingReply pending(call, reporterIDs->size() * sizeof(int64_t));
  if (everySession) reporterIDs.reset();
  call.object->sendMessage(std::move(message), category, type, std::move(reporterIDs),
                           [reply = std::move(pending)](const std::optional<QVError>& error) {
                             if (error.has_value()) {
                               giveErrorObject(*reply, *error);
                             } else {
                               reply->giveNothing();
                             }
                           });
  return nullptr;
}
