#pragma once

#include "client/QVClientPayload.h"
#include "client/QVClientReplies.h"
#include "client/QVClientVocabulary.h"
#include "platform/linux/bus/QVReportingServiceInterface.h"

#include <cstddef>
#include <cstdint>
#include <string>

// One call as the program asked for it: an operation and those arguments that it takes. Refers to
// the program's payload and list of reporters; lives as long as the program's call.
//
// Made by QVClient, turned into bytes by QVClientConnection. Threads: one at a time.
struct QVClientRequest {
  QVReportingServiceOperation operation;
  QVClientTargets targets = QVClientTargets(0);  // the one reporter ID of most operations
  const QVClientPayload* payload = nullptr;      // of a message or a configuration
  QVClientServiceType serviceType = QVClientServiceType::unknown;
  QVClientCategory category{0U};
  QVClientMessageType messageType = QVClientMessageType::generic;

  // Bytes of the whole message.
  std::size_t messageBytes() const noexcept;
  // Why it cannot be sent: a payload that is not in order, or too many bytes in all.
  QVClientError check() const;
  // Appends the message to `out`. With `answered` false the service is asked not to answer.
  void appendTo(std::string& out, uint32_t serial, bool answered) const;
};
