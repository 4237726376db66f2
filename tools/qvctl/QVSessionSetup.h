#pragma once

#include "client/QVClientPayload.h"
#include "tools/qvctl/QVServiceConnection.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

// How a session that qvctl creates is to be: its ID, service type and configuration, as the command
// line has them. A value.
//
// Failures: QVToolFailure, wrongUsage for words that are none, failed where the service has a
// session of that ID already.
struct QVSessionSetup {
  std::optional<int64_t> reporterID;  // else the number of the process that creates it
  std::string service = "generic";
  std::string configuration;         // as QVMakePayload() takes it
  std::vector<std::string> entries;  // over it

  // Whether all of it can be understood; before anything is begun.
  void check() const;
  // Creates the session over this connection, to which it belongs; answers its ID.
  int64_t create(QVServiceConnection& connection) const;

 private:
  QVClientPayload values() const;
};
