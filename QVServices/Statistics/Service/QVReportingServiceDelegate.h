#pragma once

#include "QVServices/Statistics/QVReportingDriverUtility.h"
#include "QVServices/Statistics/Service/QVReportingServiceDelegateProtocol.h"
#include "platform/QVIPC.h"

#include <memory>
#include <mutex>

// The service's one host object: accepts every client, gives each a QVReportingServerInstance,
// keeps the list of clients and the service-wide state, and tells the analytics event service how
// long a client was there.
//
// Threads: created before the listener is resumed. New connections come on the listener's thread,
// the handlers of connections on their IPC threads, everything else on the server queue, which this
// object makes. The recursive lock covers setting up a connection and looking through all clients;
// no other lock is taken inside it.
// Ownership: held by the entry point for the life of the process.
class QVReportingServiceDelegate final
    : public QVIPCListenerDelegate,
      public QVReportingServiceDelegateProtocol,
      public std::enable_shared_from_this<QVReportingServiceDelegate> {
 public:
  static std::shared_ptr<QVReportingServiceDelegate> init();
  ~QVReportingServiceDelegate() override;
  QVReportingServiceDelegate(const QVReportingServiceDelegate&) = delete;
  QVReportingServiceDelegate& operator=(const QVReportingServiceDelegate&) = delete;

  // Accepts; nothing about the peer is examined.
  bool listener(QVIPCListener& listener,
                const std::shared_ptr<QVIPCConnection>& shouldAcceptNewConnection) override;

  QVDictionary getDefaults() const override { return defaults_; }
  const Clients& getAllClients() const override { return clients_; }
  bool isReportingEnabled() const override { return reportingEnabled_; }
  std::shared_ptr<QVReportingSession> findReportingSessionForID(int64_t reporterID) const override;
  QVDictionary getSnapShot() const override { return driverUtility_->getSnapShot(); }
  QVDictionary getDriverStatisticsRelativeToSnapShot(const QVDictionary& snapShot) const override {
    return driverUtility_->getDriverStatisticsRelativeToSnapShot(snapShot);
  }
  void removeClient(const QVReportingServerInstance& client) override;

  // The reporting switch and the service-wide preferences. Server queue.
  void setReportingEnabled(bool enabled) { reportingEnabled_ = enabled; }
  void setDefaults(QVDictionary defaults) { defaults_ = std::move(defaults); }

 private:
  QVReportingServiceDelegate();

  void registerClient(const std::shared_ptr<QVReportingServerInstance>& client, int32_t pid);

  mutable std::recursive_mutex mutex_;

  // Server queue only, but for the time of creation.
  Clients clients_;
  bool reportingEnabled_ = true;
  QVDictionary defaults_;
  std::shared_ptr<QVReportingDriverUtility> driverUtility_;
};
