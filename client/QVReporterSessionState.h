#pragma once

#include "client/QVClientVocabulary.h"

#include <cstdint>
#include <string>

// What the reporter's thread knows of a session: as it is to be in the service, and whether it is
// there, on the connection that there is.
//
// Threads: the reporter's; the ID any. Ownership: QVReporterCore's table, until its destruction is
// worked off, so that what lies in the queue may refer to it.
struct QVReporterSessionState {
  explicit QVReporterSessionState(int64_t identifier) : reporterID(identifier) {}

  const int64_t reporterID;
  QVClientServiceType serviceType = QVClientServiceType::generic;
  std::string configuration{};  // entries, as in a QVClientPayload
  bool isOpen = false;          // its opening has been worked off
  bool isStarted = false;
  bool isPresent = false;
};
