#pragma once

#include "tools/qvctl/QVToolPlaces.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

// Whether the service runs, found out without connecting to it: that would start one that runs on
// demand.
//
//   stopped      nobody listens at the socket
//   onDemand     somebody does, who starts the service at the first call, and it does not run
//   running      the service listens, or has connections
//   unknown      somebody listens, and this user may not see who; connecting might start it
//   unreachable  there can be no socket, see QVToolPlaces::socketProblem()
//
// The kernel says who listens at the socket's file and who is connected there, /proc says which
// process is the service: that which holds the socket or, where this user may not see who does, the
// only one of the service's name that is the socket's owner's.
struct QVServiceState {
  enum class Kind { stopped, onDemand, running, unknown, unreachable };
  struct Client {
    pid_t pid = 0;  // 0 where this user may not see it
    std::string name;
  };

  Kind kind = Kind::unknown;
  pid_t pid = 0;                 // of the service; 0 where this user may not see it
  std::optional<int64_t> since;  // microseconds since 1970
  std::vector<Client> clients;   // one for each connection

  bool isRunning() const { return kind == Kind::running; }
  // "running", "starts on demand", ...
  const char* word() const;
  // What a command that needs a running service says where there is none.
  std::string complaint(const QVToolPlaces& places) const;

  // Failures: QVToolFailure, notPermitted, where the socket's directory is closed to this user, or
  // the socket itself and who listens is not to be seen.
  static QVServiceState find(const QVToolPlaces& places);
};
