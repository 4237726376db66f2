#pragma once

#include "platform/QVError.h"
#include "platform/QVFunction.h"
#include "platform/QVValue.h"

#include <cstdint>
#include <optional>
#include <vector>

// A reply callback. The transport's replies hold their connection weakly: one that is dropped
// unanswered sends nothing, one that is called after the connection closed does nothing, one that
// is called twice sends two answers. Callable from any thread, never blocks.
template <class Result>
using Reply = QVFunction<void(Result), 48>;

// The error of a message that comes while reporting is switched off.
inline constexpr const char* kQVReportingErrorDomain = "net.quillon.audio.reporting";
inline constexpr int64_t kQVReportingErrorSwitchedOff = 1;

// The IPC interface of the service: what a client may ask of its connection's exported object.
// Every operation returns at once; results come through the reply.
//
// Threads: called on the connection's IPC thread, one call at a time per connection, in the order
// of arrival.
class QVReportingServiceProtocol {
 public:
  // Reporter IDs as the client listed them; nothing where it listed none at all, which is not the
  // same as an empty list.
  using ReporterIDs = std::optional<std::vector<int64_t>>;

  virtual ~QVReportingServiceProtocol() = default;

  virtual void createReportingSession(int64_t reporterID, Reply<bool> reply) = 0;
  virtual void setServiceType(uint16_t serviceType, int64_t reportingSession,
                              Reply<bool> reply) = 0;
  virtual void getServiceNameForReporterID(int64_t reporterID, Reply<uint16_t> reply) = 0;
  virtual void setConfiguration(QVDictionary configuration, int64_t forReporterID,
                                Reply<bool> reply) = 0;
  virtual void startReportingSessionForID(int64_t reporterID, Reply<bool> reply) = 0;
  virtual void sendMessage(QVDictionary message, uint32_t withCategory, uint16_t andType,
                           ReporterIDs forReportingIDs, Reply<std::optional<QVError>> reply) = 0;
  virtual void stopReportingSessionForID(int64_t reporterID, Reply<bool> reply) = 0;
  virtual void destroyReportingSession(int64_t reporterID, Reply<bool> reply) = 0;
  virtual void reporterID(int64_t reporterID, Reply<QVDictionary> valid) = 0;
  virtual void getAllReporters(Reply<std::vector<int64_t>> reply) = 0;
  virtual void killService(Reply<bool> reply) = 0;
};
