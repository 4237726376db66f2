#pragma once

#include "platform/QVValue.h"
#include "platform/linux/bus/QVBusProtocol.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// A message that the service sent, its bytes its own. The readings throw where the body is of
// another signature, so that a test that expects something else fails with what came instead.
//
// Threads: one at a time.
struct QVPeerMessage {
  QVBusMessageType type = QVBusMessageType::invalid;
  uint32_t replySerial = 0;
  std::string errorName;
  std::string signature;
  std::string body;

  // Takes one whole message in. Throws where the service broke a rule of the protocol.
  static QVPeerMessage fromBytes(std::string_view bytes);

  bool isReturn() const { return type == QVBusMessageType::methodReturn; }
  bool boolean() const;
  uint16_t unsigned16() const;
  std::string string() const;
  std::vector<int64_t> integers() const;
  QVDictionary dictionary() const;
  // For failures' texts.
  std::string description() const;

 private:
  void expect(std::string_view expectedSignature) const;
};
