#pragma once

#include "QVServices/Statistics/QVReportingDriverSnapShot.h"
#include "platform/QVValue.h"

#include <cstdint>
#include <memory>
#include <vector>

class QVReportingServerInstance;
class QVReportingSession;

// What a client's server instance may ask of the service as a whole. Implemented by the one
// QVReportingServiceDelegate.
//
// Threads: the server queue.
class QVReportingServiceDelegateProtocol {
 public:
  using Clients = std::vector<std::shared_ptr<QVReportingServerInstance>>;
  using SnapShot = std::shared_ptr<const QVReportingDriverSnapShot>;

  virtual ~QVReportingServiceDelegateProtocol() = default;

  // The service-wide preferences; absent until they were read for the first time.
  virtual QVDictionary getDefaults() const = 0;
  // The connected clients in order of registration: the live list, not a copy.
  virtual const Clients& getAllClients() const = 0;
  virtual bool isReportingEnabled() const = 0;
  // Looks through all clients, in order. Null for ID 0, while reporting is switched off, and where
  // no client has such a session.
  virtual std::shared_ptr<QVReportingSession> findReportingSessionForID(
      int64_t reporterID) const = 0;
  // What the drivers count now, never absent; and what grew since a snapshot, or in all where the
  // snapshot is absent (absent: nothing did).
  virtual SnapShot getSnapShot() const = 0;
  virtual QVDictionary getDriverStatisticsRelativeToSnapShot(const SnapShot& snapShot) const = 0;
  // Takes the client off the list; no effect where it is not on it.
  virtual void removeClient(const QVReportingServerInstance& client) = 0;
};
