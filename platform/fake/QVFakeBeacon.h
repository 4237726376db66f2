#pragma once

#include "platform/QVBeacon.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

// One call that a QVFakeBeacon saw.
struct QVFakeBeaconEvent {
  enum class Kind { session, configuration, message, singleMessage, flush, sessionEnd };

  Kind kind{};
  int session = 0;             // the session's number, from 1; 0 for a single message
  QVDictionary sessionInfo{};  // of session and singleMessage
  QVDictionary userInfo{};     // of session and singleMessage
  QVArray frameworksToCheck{};
  uint16_t category = 0;
  uint16_t type = 0;
  QVDictionary payload{};
  bool accepted = true;  // false for a message or a flush that was answered with a failure
};

// A Beacon for tests: keeps every call in one list, in order, and fails when told to.
//
// The text of the session with number N is "session N", that of the Nth token "token N".
// Completions run on the thread of the call that brings them about, with no lock held.
// Checks that a session is used by one thread at a time, is configured at most once, is sent
// nothing while its search for backends is open, and names a token that was made here.
//
// Threads: any. Sessions may outlive the fake.
class QVFakeBeacon : public QVBeacon {
 public:
  // What startConfigurationWithCompletionHandler brings.
  enum class Backends {
    atOnce,    // the list of backends, before the call returns
    noList,    // nothing, before the call returns
    whenTold,  // whatever answerBackends says, when it is called; or no answer ever
    never      // no answer, whatever is called; the completion goes unused
  };
  using Kind = QVFakeBeaconEvent::Kind;

  QVFakeBeacon();
  ~QVFakeBeacon() override;

  std::shared_ptr<BeaconSecureHierarchyToken> newSecureHierarchyTokenFromParentToken(
      const std::shared_ptr<BeaconSecureHierarchyToken>& parent) override;
  std::shared_ptr<QVBeaconSession> initWithSessionInfo(const QVDictionary& sessionInfo,
                                                       const QVDictionary& userInfo,
                                                       const QVArray& frameworksToCheck) override;
  [[nodiscard]] bool sendOneMessageWithSessionInfo(const QVDictionary& sessionInfo,
                                                   const QVDictionary& userInfo, uint16_t category,
                                                   uint16_t type, const QVDictionary& payload,
                                                   std::optional<QVError>& error) override;

  // How later searches for backends end; atOnce to begin with.
  void setBackends(Backends backends);
  // Ends every open search of kind whenTold, the oldest first; by default with the usual list.
  void answerBackends(const std::optional<QVArray>& backends = defaultBackends());
  static QVArray defaultBackends();

  // From now on messages (single ones too) are refused, with this error or without one.
  void refuseMessages(std::optional<QVError> error);
  // What later flushes complete with.
  void setFlushError(std::optional<QVError> error);

  std::vector<QVFakeBeaconEvent> events() const;
  std::vector<QVFakeBeaconEvent> events(Kind kind) const;
  std::size_t count(Kind kind) const;
  void forgetEvents();

  int liveSessions() const;
  int liveTokens() const;
  std::vector<std::string> takeMisuses();

 private:
  struct State;
  class Session;
  class Token;
  const std::shared_ptr<State> state_;
};
