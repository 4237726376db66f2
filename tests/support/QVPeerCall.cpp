#include "tests/support/QVPeerCall.h"

#include <string_view>
#include <utility>

namespace {

QVPeerCall callWithReporter(std::string member, int64_t reporterID) {
  return {.member = std::move(member), .signature = "x", .body = [reporterID](QVBusWriter& writer) {
            writer.writeNumber(reporterID);
          }};
}

// The same with an argument before the reporter ID.
QVPeerCall callWithReporter(std::string member, int64_t reporterID, std::string_view signature,
                            std::function<void(QVBusWriter&)> writeArgument) {
  QVPeerCall call = callWithReporter(std::move(member), reporterID);
  call.signature.insert(0, signature);
  call.body = [writeArgument = std::move(writeArgument),
               writeReporter = std::move(call.body)](QVBusWriter& writer) {
    writeArgument(writer);
    writeReporter(writer);
  };
  return call;
}

QVPeerCall messageCall(const QVDictionary& message, uint32_t category, uint16_t type,
                       bool everySession, std::vector<int64_t> reporterIDs) {
  return {.member = "SendMessage",
          .signature = "a{sv}uqbax",
          .body = [message, category, type, everySession,
                   reporterIDs = std::move(reporterIDs)](QVBusWriter& writer) {
            writer.writeDictionary(message);
            writer.writeNumber(category);
            writer.writeNumber(type);
            writer.writeBoolean(everySession);
            const auto array = writer.beginArray(8);
            for (const int64_t reporterID : reporterIDs) writer.writeNumber(reporterID);
            writer.endArray(array);
          }};
}

}  // namespace

std::string QVPeerCall::bytes(uint32_t serial) const {
  std::string out;
  QVBusWriter writer(out);
  writer.beginMessage({.type = QVBusMessageType::methodCall,
                       .flags = flags,
                       .serial = serial,
                       .path = path,
                       .interface = interface,
                       .member = member,
                       .signature = signature});
  if (body) body(writer);
  writer.endMessage();
  return out;
}

QVPeerCall pingCall() {
  return {.member = "Ping", .interface = "org.freedesktop.DBus.Peer"};
}

QVPeerCall createCall(int64_t reporterID) {
  return callWithReporter("CreateReportingSession", reporterID);
}

QVPeerCall setServiceTypeCall(uint16_t serviceType, int64_t reporterID) {
  return callWithReporter("SetServiceType", reporterID, "q",
                          [serviceType](QVBusWriter& writer) { writer.writeNumber(serviceType); });
}

QVPeerCall getServiceTypeCall(int64_t reporterID) {
  return callWithReporter("GetServiceNameForReporterID", reporterID);
}

QVPeerCall configureCall(const QVDictionary& configuration, int64_t reporterID) {
  return callWithReporter(
      "SetConfiguration", reporterID, "a{sv}",
      [configuration](QVBusWriter& writer) { writer.writeDictionary(configuration); });
}

QVPeerCall startCall(int64_t reporterID) {
  return callWithReporter("StartReportingSessionForID", reporterID);
}

QVPeerCall sendCall(const QVDictionary& message, std::vector<int64_t> reporterIDs,
                    uint32_t category, uint16_t type) {
  return messageCall(message, category, type, false, std::move(reporterIDs));
}

QVPeerCall sendToAllCall(const QVDictionary& message, uint32_t category, uint16_t type) {
  return messageCall(message, category, type, true, {});
}

QVPeerCall stopCall(int64_t reporterID) {
  return callWithReporter("StopReportingSessionForID", reporterID);
}

QVPeerCall destroyCall(int64_t reporterID) {
  return callWithReporter("DestroyReportingSession", reporterID);
}

QVPeerCall validateCall(int64_t reporterID) {
  return callWithReporter("ReporterIDValid", reporterID);
}

QVPeerCall listCall() {
  return {.member = "GetAllReporters"};
}

QVPeerCall killCall() {
  return {.member = "KillService"};
}
