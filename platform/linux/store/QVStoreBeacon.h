#pragma once

#include "platform/QVBeacon.h"
#include "platform/linux/store/QVSQLiteEventStore.h"

#include <memory>

// Beacon on the event store. The one backend is "store"; a search for backends opens it. A session
// is a row of beacon_session, its messages and single messages are rows of beacon_message.
//
// Sessions whose information says kBeaconSessionInfoContainsRealtimeEvents have each message
// committed at once. Tokens are 128 random bits in hexadecimal. Messages are only refused when the
// store has been closed.
//
// Threads: as the interface has it. Completions run on the store's thread.
class QVStoreBeacon : public QVBeacon {
 public:
  explicit QVStoreBeacon(std::shared_ptr<QVSQLiteEventStore> store);

  std::shared_ptr<BeaconSecureHierarchyToken> newSecureHierarchyTokenFromParentToken(
      const std::shared_ptr<BeaconSecureHierarchyToken>& parent) override;
  std::shared_ptr<QVBeaconSession> initWithSessionInfo(const QVDictionary& sessionInfo,
                                                       const QVDictionary& userInfo,
                                                       const QVArray& frameworksToCheck) override;
  [[nodiscard]] bool sendOneMessageWithSessionInfo(const QVDictionary& sessionInfo,
                                                   const QVDictionary& userInfo, uint16_t category,
                                                   uint16_t type, const QVDictionary& payload,
                                                   std::optional<QVError>& error) override;

 private:
  const std::shared_ptr<QVSQLiteEventStore> store_;
};
