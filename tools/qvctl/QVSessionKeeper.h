#pragma once

#include "tools/qvctl/QVSessionSetup.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <cstdint>
#include <string>

#include <sys/types.h>
#include <sys/un.h>

// Keeps a session for scripts: a session belongs to the connection that created it and goes with
// it, so `qvctl session create` leaves a process behind that holds the connection, and does what
// nobody else may, stop and destroy it, when `qvctl session stop` and `destroy` ask for it.
//
// The process ends with the session, with the service, and when it is asked to end (SIGTERM). It is
// reached at an abstract unix socket, named after the service's socket and the session; only the
// user who made it, and root, are listened to, others' connections are closed at once. No file is
// left behind.
//
// Threads: one at a time; start() has to come before there are others.
class QVSessionKeeper {
 public:
  explicit QVSessionKeeper(const QVToolPlaces& places) : places_(places) {}

  struct Kept {
    int64_t reporterID = 0;
    pid_t keeper = 0;
  };
  // Creates a session and its keeper. Failures: as QVSessionSetup and QVServiceConnection.
  Kept start(const QVSessionSetup& setup, bool startSession) const;

  enum class Request : char { stop = 's', destroy = 'd' };
  // Has a session's keeper do it. Failures: QVToolFailure, failed where the session has none,
  // notPermitted where it is another user's.
  void ask(int64_t reporterID, Request request) const;

 private:
  sockaddr_un address(int64_t reporterID) const;
  // In the keeper's process.
  [[noreturn]] void keep(const QVSessionSetup& setup, bool startSession, int report) const;
  void serve(QVServiceConnection& service, int64_t reporterID, int listener, int lost) const;

  const QVToolPlaces& places_;
};
