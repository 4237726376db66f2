#pragma once

#include "tests/support/QVRawPeer.h"

#include <cstdint>
#include <filesystem>
#include <vector>

// What tests send where it does not matter what is sent.
inline constexpr uint32_t kSessionPlayback = 0x08000003;
inline constexpr uint16_t kStart = 1;

// A well-behaved client process, as the tests speak of it: verbs make a call, wait for its reply
// and expect it to be what the operation always answers.
//
// Threads: one at a time.
class QVPeerClient : public QVRawPeer {
 public:
  explicit QVPeerClient(const std::filesystem::path& socket) : QVRawPeer(socket) {}

  void create(int64_t reporterID);
  void create(int64_t reporterID, uint16_t serviceType);
  void setServiceType(uint16_t serviceType, int64_t reporterID);
  uint16_t serviceType(int64_t reporterID);
  void configure(const QVDictionary& configuration, int64_t reporterID);
  // The reply comes when the session stops: its serial. The start has been carried out.
  uint32_t start(int64_t reporterID);
  void sendMessage(const QVDictionary& message, const std::vector<int64_t>& reporterIDs,
                   uint32_t category = kSessionPlayback, uint16_t type = kStart);
  void sendToAll(const QVDictionary& message, uint32_t category = kSessionPlayback,
                 uint16_t type = kStart);
  void stop(int64_t reporterID);
  void destroy(int64_t reporterID);
  bool isValid(int64_t reporterID);
  std::vector<int64_t> reporters();

  // Waits until everything that this client asked for before has been carried out.
  void awaitOperations();
};
