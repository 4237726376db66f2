#pragma once

#include "platform/QVReportingServiceProtocol.h"

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// An exported object that behaves like a small service: it keeps sessions by ID with their types
// and configurations, answers truthfully, defers the reply of a start until the stop, and writes
// down every call. One thread.
class QVRecordingService final : public QVReportingServiceProtocol {
 public:
  struct Session {
    uint16_t serviceType = 0;
    QVDictionary configuration;
    Reply<bool> started;
  };
  struct Message {
    QVDictionary payload;
    uint32_t category;
    uint16_t type;
    ReporterIDs reporterIDs;
  };

  // ---- What tests look at and set.
  std::vector<std::string> calls;
  std::vector<Message> messages;
  std::map<int64_t, Session> sessions;
  bool enabled = true;
  std::vector<Reply<bool>> keptReplies;  // of killService
  std::function<void(const std::string& call)> onCall = [](const std::string&) {};

  void createReportingSession(int64_t reporterID, Reply<bool> reply) override {
    note("create", reporterID);
    sessions[reporterID];
    reply(true);
  }
  void setServiceType(uint16_t serviceType, int64_t reportingSession, Reply<bool> reply) override {
    note("setServiceType", reportingSession);
    sessions[reportingSession].serviceType = serviceType;
    reply(true);
  }
  void getServiceNameForReporterID(int64_t reporterID, Reply<uint16_t> reply) override {
    note("getServiceName", reporterID);
    if (reporterID == 0) reply(kUnknown);
    reply(serviceTypeOf(reporterID));
  }
  void setConfiguration(QVDictionary configuration, int64_t forReporterID,
                        Reply<bool> reply) override {
    note("setConfiguration", forReporterID);
    sessions[forReporterID].configuration = std::move(configuration);
    reply(true);
  }
  void startReportingSessionForID(int64_t reporterID, Reply<bool> reply) override {
    note("start", reporterID);
    sessions[reporterID].started = std::move(reply);
  }
  void sendMessage(QVDictionary message, uint32_t withCategory, uint16_t andType,
                   ReporterIDs forReportingIDs, Reply<std::optional<QVError>> reply) override {
    note("send", withCategory);
    messages.push_back({std::move(message), withCategory, andType, std::move(forReportingIDs)});
    std::optional<QVError> error;
    if (!enabled) error = QVError{"net.quillon.audio.reporting", 1, {}};
    reply(std::move(error));
  }
  void stopReportingSessionForID(int64_t reporterID, Reply<bool> reply) override {
    note("stop", reporterID);
    if (sessions[reporterID].started) sessions[reporterID].started(true);
    reply(true);
  }
  void destroyReportingSession(int64_t reporterID, Reply<bool> reply) override {
    note("destroy", reporterID);
    sessions.erase(reporterID);
    reply(true);
  }
  void reporterID(int64_t reporterID, Reply<QVDictionary> valid) override {
    note("valid", reporterID);
    const int64_t known = sessions.contains(reporterID) ? reporterID : 0;
    valid(QVDictionary{{"reporterID", known}, {"serviceType", serviceTypeOf(reporterID)}});
  }
  void getAllReporters(Reply<std::vector<int64_t>> reply) override {
    note("all", 0);
    std::vector<int64_t> reporterIDs;
    for (const auto& [reporterID, session] : sessions) reporterIDs.push_back(reporterID);
    reply(std::move(reporterIDs));
  }
  void killService(Reply<bool> reply) override {
    note("kill", 0);
    keptReplies.push_back(std::move(reply));
  }

 private:
  static constexpr uint16_t kUnknown = 65535;

  uint16_t serviceTypeOf(int64_t reporterID) const {
    const auto found = sessions.find(reporterID);
    return found == sessions.end() ? kUnknown : found->second.serviceType;
  }
  void note(const std::string& operation, int64_t argument) {
    calls.push_back(operation + " " + std::to_string(argument));
    onCall(calls.back());
  }
};
