#pragma once

#include "platform/QVFunction.h"
#include "platform/QVReportingServiceProtocol.h"

#include <cstdint>
#include <memory>
#include <string>

// A description of the interface that a connection exports. The service has exactly one.
enum class QVIPCInterface : uint8_t { none, reportingService };

// One client's connection, as the listener's delegate sees it.
//
// Threads: the setters and resume() are called on the listener's thread, inside of the delegate's
// decision; calls and handlers come on the connection's IPC thread, never before resume().
// Ownership: the connection owns its exported object and its handlers; both go when the connection
// has been invalidated, after the invalidation handler ran.
// Handlers: a protocol violation of the peer is an interruption followed by an invalidation; end of
// stream and reset are an invalidation only. The invalidation handler runs exactly once, last, also
// when the service itself ends.
class QVIPCConnection {
 public:
  virtual ~QVIPCConnection() = default;
  // The peer's process ID as the kernel knows it; 0 where it does not.
  virtual int32_t processIdentifier() const = 0;
  virtual std::string description() const = 0;
  virtual void setExportedInterface(QVIPCInterface exportedInterface) = 0;
  virtual void setExportedObject(std::shared_ptr<QVReportingServiceProtocol> exportedObject) = 0;
  virtual std::shared_ptr<QVReportingServiceProtocol> exportedObject() const = 0;
  virtual void setInterruptionHandler(QVFunction<void()> handler) = 0;
  virtual void setInvalidationHandler(QVFunction<void()> handler) = 0;
  // Starts the delivery of calls.
  virtual void resume() = 0;
};

class QVIPCListener;

// Decides on a listener's new connections; the listener holds it weakly. Called on the listener's
// thread.
class QVIPCListenerDelegate {
 public:
  virtual ~QVIPCListenerDelegate() = default;
  // Sets up and resumes the connection and answers true; false closes it.
  virtual bool listener(QVIPCListener& listener,
                        const std::shared_ptr<QVIPCConnection>& shouldAcceptNewConnection) = 0;
};

// Listens for the clients of an on-demand service.
class QVIPCListener {
 public:
  virtual ~QVIPCListener() = default;
  // Held weakly.
  virtual void setDelegate(std::weak_ptr<QVIPCListenerDelegate> delegate) = 0;
  // Accepts and serves clients on the calling thread until the platform ends the service; then
  // every connection has been invalidated and its work has run.
  virtual void resume() = 0;
};
