#pragma once

#include "tools/qvctl/QVServiceState.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

// qvctl sessions: all reporters that the service knows, with type, and owner where it is known.
//
// The service tells IDs and types alone. When a session was started, and the application that it
// reports for, is what the store says of its latest start. The owning process is known where all
// clients are one.
//
// Threads: one.
class QVSessionsCommand {
 public:
  struct Options {
    bool start = false;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  struct Session {
    int64_t reporterID = 0;
    std::optional<uint16_t> serviceType;  // none where it has gone meanwhile
    std::optional<int64_t> since;         // of its start; none where it is not started
    std::string application;
    std::optional<QVServiceState::Client> owner;
  };

  static std::vector<Session> find(const QVToolContext& context, const Options& options);
  static void addStored(const QVToolContext& context, int64_t serviceStart,
                        std::vector<Session>& sessions);
  static QVValue json(const Session& session);
};
