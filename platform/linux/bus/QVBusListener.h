#pragma once

#include "platform/QVFunction.h"
#include "platform/QVIPC.h"

#include <functional>
#include <memory>
#include <string>

// Where and how a QVBusListener serves.
struct QVBusListenerOptions {
  // Of the listening socket, where the service manager hands none over.
  std::string socketPath;
  // Has something run behind all that exported objects, and the delegate for them, have been asked
  // to do so far, where they do it: on any thread. The end of a connection that is gone at once
  // waits for that, and objects are let go of there. Absent: they have done it when they return.
  QVFunction<void(QVFunction<void()>)> afterCalls{};
  // Runs in resume() after the last connection has been invalidated: waits until all work of the
  // service is done and stored.
  std::function<void()> drain{};
};

// The listener of the on-demand service, over a unix socket: accepts, serves, and ends in good
// order on SIGTERM and SIGINT.
//
// The end: accept no more, tell the service manager, take in what clients have sent so far,
// invalidate every connection, drain; then resume() returns. No exception of what it calls ends it.
//
// Threads: create(), setDelegate() and resume() on one thread, which resume() makes the IPC thread.
// Process-wide effects of resume(): SIGPIPE is ignored, SIGTERM and SIGINT are caught
// and, where they were blocked, unblocked; readiness
// and end are told to the service manager.
// Limits: as many connections as the process may have descriptors, less a few that stay for files
// (QVBusSocket::kReservedDescriptors); when they run out, one line is logged and the next clients
// wait until a connection closes.
class QVBusListener final : public QVIPCListener {
 public:
  // Opens the socket; clients may connect from here on and are answered once resume() runs. Null
  // where that fails; `error` then says why.
  static std::unique_ptr<QVBusListener> create(QVBusListenerOptions options, std::string& error);
  ~QVBusListener() override;

  void setDelegate(std::weak_ptr<QVIPCListenerDelegate> delegate) override;
  void resume() override;

 private:
  struct Inside;
  explicit QVBusListener(std::unique_ptr<Inside> inside);

  void runLoop();
  void acceptWhenReadable();
  void acceptAll();
  void serve(int descriptor) noexcept;
  void acceptLater(int error);
  void endService();

  const std::unique_ptr<Inside> inside_;
};
