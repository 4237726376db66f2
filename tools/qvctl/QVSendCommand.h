#pragma once

#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstdint>
#include <string>
#include <vector>

// qvctl send and qvctl session send: one message to sessions, whoever created them, or to every
// started session.
//
// Threads: one.
class QVSendCommand {
 public:
  // The environment variable that names the session of `qvctl session run`, for what it runs.
  static constexpr const char* kSessionVariable = "QUIETVOX_SESSION";

  struct Options {
    std::vector<int64_t> sessions;
    bool toAll = false;
    std::string category = "Session.Generic";
    std::string type = "Generic";
    std::string json;  // as QVMakePayload() takes it
    std::vector<std::string> entries;
  };

  static QVToolStatus run(const QVToolContext& context, Options options);
};
