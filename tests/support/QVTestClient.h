#pragma once

#include "QVServices/Statistics/Service/QVReportingServerInstance.h"
#include "platform/fake/QVFakeIPCConnection.h"
#include "tests/support/QVJournal.h"

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

// What tests send where it does not matter what is sent.
inline constexpr uint32_t kSessionPlayback = 0x08000003;
inline constexpr uint16_t kStart = 1;

// A client process, as the tests speak of it. Verbs hand a call to the connection's exported
// object as the transport would; the work waits on the server queue until the test runs it. Every
// reply is noted in the journal: "reply 42 create 7: YES" (client 42, operation, reporter ID).
//
// Threads: the test's.
class QVTestClient {
 public:
  QVTestClient(std::shared_ptr<QVFakeIPCConnection> connection, QVJournal& journal)
      : connection_(std::move(connection)), journal_(&journal) {}

  void create(int64_t reporterID);
  void setServiceType(uint16_t serviceType, int64_t reporterID);
  void getServiceType(int64_t reporterID);
  void setConfiguration(const QVDictionary& configuration, int64_t reporterID);
  void start(int64_t reporterID);
  void send(const QVDictionary& message, std::vector<int64_t> reporterIDs,
            uint32_t category = kSessionPlayback, uint16_t type = kStart);
  // Lists no reporter IDs at all.
  void sendToAll(const QVDictionary& message, uint32_t category = kSessionPlayback,
                 uint16_t type = kStart);
  void stop(int64_t reporterID);
  void destroy(int64_t reporterID);
  void validate(int64_t reporterID);
  void listReporters();
  void killService();

  // The peer broke the protocol; the invalidation follows when the test says so.
  void interrupt() { connection_->interrupt(); }
  void disconnect() { connection_->invalidate(); }

  int32_t pid() const { return connection_->processIdentifier(); }
  QVFakeIPCConnection& connection() { return *connection_; }
  // Null once the connection has been invalidated.
  std::shared_ptr<QVReportingServerInstance> instance() const;
  // Null where there is no such session.
  std::shared_ptr<QVReportingSession> session(int64_t reporterID) const;

 private:
  Reply<bool> booleanReply(std::string operation);
  void send(const QVDictionary& message, uint32_t category, uint16_t type,
            QVReportingServiceProtocol::ReporterIDs reporterIDs);

  std::shared_ptr<QVFakeIPCConnection> connection_;
  QVJournal* journal_;
};
