#pragma once

#include "platform/QVIPC.h"
#include "platform/fake/QVFakeIPCConnection.h"

#include <memory>
#include <vector>

// A listener whose clients are the test's. Owns the connections that its delegate accepted, like
// the one over a socket. Threads: the test's.
class QVFakeIPCListener final : public QVIPCListener {
 public:
  ~QVFakeIPCListener() override { abandonConnections(); }

  void setDelegate(std::weak_ptr<QVIPCListenerDelegate> delegate) override;
  // Runs what onResume() was given, in place of the clients' traffic; then the service ends: every
  // connection is invalidated.
  void resume() override;

  // A client of this process ID connects: the delegate is asked on the spot. A connection that is
  // refused, or finds no delegate, comes back invalidated.
  std::shared_ptr<QVFakeIPCConnection> connect(int32_t processIdentifier);
  void onResume(QVFunction<void()> traffic);
  // Drops what the connections hold without running a handler: for the end of a test, when the
  // core that handlers call may be gone.
  void abandonConnections();
  bool hasResumed() const { return hasResumed_; }
  // Those accepted so far, invalidated ones included.
  const std::vector<std::shared_ptr<QVFakeIPCConnection>>& connections() const {
    return connections_;
  }

 private:
  std::weak_ptr<QVIPCListenerDelegate> delegate_;
  std::vector<std::shared_ptr<QVFakeIPCConnection>> connections_;
  QVFunction<void()> traffic_;
  bool hasResumed_ = false;
  int connectionCount_ = 0;
};
