#pragma once

#include "platform/QVError.h"
#include "platform/QVFunction.h"
#include "platform/QVValue.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

// Keys of session information and user information.
inline constexpr const char* kBeaconSessionInfoClientType = "kBeaconSessionInfoClientType";
inline constexpr const char* kBeaconSessionInfoClientVersion = "kBeaconSessionInfoClientVersion";
inline constexpr const char* kBeaconSessionInfoSessionID = "kBeaconSessionInfoSessionID";
inline constexpr const char* kBeaconSessionInfoBatchEvent = "kBeaconSessionInfoBatchEvent";
inline constexpr const char* kBeaconSessionInfoHierarchyToken = "kBeaconSessionInfoHierarchyToken";
inline constexpr const char* kBeaconSessionInfoContainsRealtimeEvents =
    "kBeaconSessionInfoContainsRealtimeEvents";
inline constexpr const char* kBeaconUserInfoClientName = "kBeaconUserInfoClientName";
inline constexpr const char* kBeaconUserInfoServiceName = "kBeaconUserInfoServiceName";

// Names one session within the framework's hierarchy of sessions. Immutable.
class BeaconSecureHierarchyToken {
 public:
  virtual ~BeaconSecureHierarchyToken() = default;
  // The token's text: unique, the same at every call.
  virtual std::string description() const = 0;
};

// One session of the real-time reporting framework.
//
// Threads: one at a time (a session's own queue). No call waits for the store. Dropping a session
// without a flush sends what was sent all the same.
class QVBeaconSession {
 public:
  using BackendsCompletion = QVFunction<void(std::optional<QVArray> backends)>;
  using FlushCompletion = QVFunction<void(std::optional<QVError> error)>;

  virtual ~QVBeaconSession() = default;
  // The session's text for log lines.
  virtual std::string description() const = 0;
  // Looks for backends. The completion runs exactly once, on any thread, maybe before this
  // returns, with the list of backends or, where there are none to be had, nothing.
  virtual void startConfigurationWithCompletionHandler(BackendsCompletion completion) = 0;
  // Hands one message over. False where it was refused; `error` then says why.
  [[nodiscard]] virtual bool sendMessageWithCategory(uint16_t category, uint16_t type,
                                                     const QVDictionary& payload,
                                                     std::optional<QVError>& error) = 0;
  // Sees to it that everything sent so far is stored. The completion runs exactly once, on any
  // thread, with an error where that failed.
  virtual void flushMessagesWithCompletion(FlushCompletion completion) = 0;
};

// Beacon, the real-time reporting framework.
//
// Threads: any, at once. No call waits for the store.
class QVBeacon {
 public:
  virtual ~QVBeacon() = default;
  virtual std::shared_ptr<BeaconSecureHierarchyToken> newSecureHierarchyTokenFromParentToken(
      const std::shared_ptr<BeaconSecureHierarchyToken>& parent) = 0;
  // A new session. The dictionaries hold the keys above; the token is in there as its text.
  virtual std::shared_ptr<QVBeaconSession> initWithSessionInfo(
      const QVDictionary& sessionInfo, const QVDictionary& userInfo,
      const QVArray& frameworksToCheck) = 0;
  // One message without a session. False where it was refused; `error` says why, if it is known.
  [[nodiscard]] virtual bool sendOneMessageWithSessionInfo(const QVDictionary& sessionInfo,
                                                           const QVDictionary& userInfo,
                                                           uint16_t category, uint16_t type,
                                                           const QVDictionary& payload,
                                                           std::optional<QVError>& error) = 0;
};
