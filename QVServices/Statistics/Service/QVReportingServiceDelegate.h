#pragma once

#include "QVServices/Statistics/QVReportingDriverUtility.h"
#include "QVServices/Statistics/Service/QVReportingServiceDelegateProtocol.h"
#include "platform/QVIPC.h"

#include <cstdint>
#include <memory>
#include <mutex>

// The service's one host object: accepts every client, gives each a QVReportingServerInstance,
// keeps the list of clients and the service-wide state, and tells the analytics event service how
// long a client was there.
//
// Preferences and the reporting switch change when the notification about them is posted, at no
// other time: until the first one there are no defaults and reporting is enabled.
//
// Threads: created before the listener is resumed. New connections come on the listener's thread,
// the handlers of connections on their IPC threads, everything else on the server queue, which this
// object makes. The recursive lock covers setting up a connection and looking through all clients;
// inside it no other lock is taken but the log's, which nobody holds for long.
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
  SnapShot getSnapShot() const override { return driverUtility_->getSnapShot(); }
  QVDictionary getDriverStatisticsRelativeToSnapShot(const SnapShot& snapShot) const override {
    return driverUtility_->getDriverStatisticsRelativeToSnapShot(snapShot);
  }
  void removeClient(const QVReportingServerInstance& client) override;

  // The service-wide preferences, read afresh: "disable_reporting" always, "device_name" where it
  // is set. Any thread.
  // NOLINTNEXTLINE(readability-identifier-naming): the name of the dictionary is its own.
  static QVDictionary QVReportingDefaults();

 private:
  QVReportingServiceDelegate() = default;

  // Reads the preferences, hands them to every session and sets the switch whenever the
  // notification is posted; never by itself.
  void listenForDefaultsNotification();
  void handleDefaultsNotification(int32_t token);
  void registerClient(const std::shared_ptr<QVReportingServerInstance>& client, int32_t pid);

  mutable std::recursive_mutex mutex_;

  // Constant after creation.
  int32_t defaultsToken_ = 0;  // of the registered notification; 0 where there is none
  std::shared_ptr<QVReportingDriverUtility> driverUtility_;

  // Server queue only, but for the time of creation.
  Clients clients_;
  bool reportingEnabled_ = true;
  QVDictionary defaults_;
};
