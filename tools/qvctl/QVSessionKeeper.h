#pragma once

#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVSessionSetup.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>

#include <sys/types.h>
#include <sys/un.h>

// Keeps a session for scripts: a session belongs to the connection that created it and goes with
// it, so `qvctl session create` leaves a process behind that holds the connection, and does what
// nobody else may, stop and destroy it, when `qvctl session stop` and `destroy` ask for it.
//
// The process ends with the session, with the service, and when it is asked to end (SIGTERM). It is
// reached at an abstract unix socket, named after the service's socket and the session; only the
// user who made it, and root, are listened to, others' connections are closed at once. Who says
// nothing holds nobody up. No file is left behind.
//
// Until somebody knows of the session the process ends with the one that made it, and the session
// with both: whoever ends `qvctl session create` while it waits is left with nothing.
//
// Threads: one at a time; start() has to come before there are others.
class QVSessionKeeper {
 public:
  // How long either side waits for the other: for the service's answer, and a little.
  static constexpr std::chrono::milliseconds kPatience =
      QVServiceConnection::kTimeLimit + std::chrono::seconds(5);

  explicit QVSessionKeeper(const QVToolPlaces& places,
                           std::chrono::milliseconds patience = kPatience)
      : places_(places), patience_(patience) {}

  struct Kept {
    int64_t reporterID = 0;
    pid_t keeper = 0;
  };
  // Creates a session and its keeper, which are there for good once `tell` has said so to whoever
  // asked; where it throws, they end first. Failures: as QVSessionSetup and QVServiceConnection;
  // notPermitted where another user has taken the keeper's place; what `tell` throws.
  void start(const QVSessionSetup& setup, bool startSession,
             const std::function<void(const Kept& kept)>& tell) const;

  enum class Request : char { stop = 's', destroy = 'd' };
  // Has a session's keeper do it. Failures: QVToolFailure, failed where the session has none,
  // notPermitted where it is another user's, notRunning where it does not answer.
  void ask(int64_t reporterID, Request request) const;

 private:
  sockaddr_un address(int64_t reporterID) const;
  // In the keeper's process.
  [[noreturn]] void keep(const QVSessionSetup& setup, bool startSession, int creator) const;
  QVDescriptor listenFor(int64_t reporterID) const;

  const QVToolPlaces& places_;
  const std::chrono::milliseconds patience_;
};
