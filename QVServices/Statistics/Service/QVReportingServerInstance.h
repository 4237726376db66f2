#pragma once

#include "QVServices/Statistics/Service/QVReportingServiceDelegateProtocol.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "platform/QVDate.h"
#include "platform/QVReportingServiceProtocol.h"
#include "platform/QVWorkQueue.h"

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

// One connected client process: the exported object of its connection, and the owner of its
// sessions.
//
//   Created --registration--> Registered --connection ends--> Removed --last reference--> Destroyed
//
// Threads: the operations of QVReportingServiceProtocol come on the IPC thread, write at most a
// debug line there and enqueue their work on the server queue, where sessions and session map are
// touched. Handlers of the connection call handleConnectionError() on the IPC thread.
// Ownership: held by its connection and, while registered, by the delegate's list; work under way
// holds it too. The delegate is held weakly.
// Limits: kMaximumSessions sessions.
class QVReportingServerInstance final
    : public QVReportingServiceProtocol,
      public std::enable_shared_from_this<QVReportingServerInstance> {
 public:
  using SessionMap = std::map<int64_t, std::shared_ptr<QVReportingSession>>;

  // Sessions of one connection: far above any honest client, low enough that one that creates in
  // a loop cannot take the memory of all.
  static constexpr std::size_t kMaximumSessions = 65536;

  static std::shared_ptr<QVReportingServerInstance> initWithPID(
      int32_t pid, std::weak_ptr<QVReportingServiceDelegateProtocol> delegate);
  ~QVReportingServerInstance() override;
  QVReportingServerInstance(const QVReportingServerInstance&) = delete;
  QVReportingServerInstance& operator=(const QVReportingServerInstance&) = delete;

  // QVReportingServiceProtocol; IPC thread. Boolean replies are always YES.
  void createReportingSession(int64_t reporterID, Reply<bool> reply) override;
  void setServiceType(uint16_t serviceType, int64_t reportingSession, Reply<bool> reply) override;
  void getServiceNameForReporterID(int64_t reporterID, Reply<uint16_t> reply) override;
  void setConfiguration(QVDictionary configuration, int64_t forReporterID,
                        Reply<bool> reply) override;
  void startReportingSessionForID(int64_t reporterID, Reply<bool> reply) override;
  void sendMessage(QVDictionary message, uint32_t withCategory, uint16_t andType,
                   ReporterIDs forReportingIDs, Reply<std::optional<QVError>> reply) override;
  void stopReportingSessionForID(int64_t reporterID, Reply<bool> reply) override;
  void destroyReportingSession(int64_t reporterID, Reply<bool> reply) override;
  void reporterID(int64_t reporterID, Reply<QVDictionary> valid) override;
  void getAllReporters(Reply<std::vector<int64_t>> reply) override;
  // Ends the process with status 2; the reply is never called.
  void killService(Reply<bool> reply) override;

  // The own map first; then, if asked for, all clients. Server queue.
  std::shared_ptr<QVReportingSession> findReportingSessionForID(int64_t reporterID,
                                                                bool acrossAllClients) const;

  // The connection broke: stops the started sessions and leaves the client list, on the server
  // queue. Any thread, also several times.
  void handleConnectionError();

  int32_t processIdentifier() const { return processIdentifier_; }
  // Set by the registration; absent until then. Any thread.
  std::optional<QVDate> clientStartDate() const;
  void setClientStartDate(QVDate date);
  std::optional<std::string> clientProcessName() const;
  void setClientProcessName(std::optional<std::string> name);
  // From reporter ID to session, ascending. Server queue.
  const SessionMap& clientReportingSessionMap() const { return clientReportingSessionMap_; }

 private:
  QVReportingServerInstance(int32_t pid,
                            std::weak_ptr<QVReportingServiceDelegateProtocol> delegate);

  std::shared_ptr<QVReportingSession> sessionOfAnyClient(const QVLogSite& site,
                                                         int64_t reporterID) const;

  // The work of the operations, on the server queue.
  void create(int64_t reporterID, Reply<bool>& reply);
  void start(int64_t reporterID, Reply<bool> reply);
  void stop(int64_t reporterID, Reply<bool>& reply);
  void destroy(int64_t reporterID, Reply<bool>& reply);
  void answerServiceType(int64_t reporterID, Reply<uint16_t>& reply) const;
  void answerValidity(int64_t reporterID, Reply<QVDictionary>& reply) const;
  void answerAllReporters(Reply<std::vector<int64_t>>& reply) const;
  void route(const QVDictionary& message, uint32_t category, uint16_t type,
             const ReporterIDs& reporterIDs, Reply<std::optional<QVError>>& reply) const;
  void routeToListed(const QVDictionary& message, uint32_t category, uint16_t type,
                     const std::vector<int64_t>& reporterIDs) const;
  void routeToAllStarted(const QVDictionary& message, uint32_t category, uint16_t type,
                         const QVReportingServiceDelegateProtocol& delegate) const;
  void sendDriverStatistics(QVReportingSession& session, const QVLogSite& site) const;
  void removeFromService();

  // Constant after creation.
  const int32_t processIdentifier_;
  const std::weak_ptr<QVReportingServiceDelegateProtocol> delegate_;

  mutable std::mutex mutex_;
  std::optional<QVDate> clientStartDate_;         // guarded by mutex_
  std::optional<std::string> clientProcessName_;  // guarded by mutex_

  SessionMap clientReportingSessionMap_;  // server queue only
};
