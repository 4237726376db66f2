#include "platform/linux/store/QVStoreBeacon.h"

#include "platform/QVText.h"
#include "platform/linux/store/QVEventStoreError.h"

#include <array>
#include <cstddef>
#include <utility>

#include <sys/random.h>

namespace {

// Client and service name are repeated with each message; longer ones are cut, in bytes.
constexpr std::size_t kMaximumNameBytes = 256;

std::string newTokenText() {
  constexpr std::string_view kHex = "0123456789abcdef";
  std::array<unsigned char, 16> bytes{};
  // So few bytes come whole and without waiting, once the system has started up.
  while (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
  }
  std::string text;
  for (const unsigned char byte : bytes) {
    text.push_back(kHex[byte >> 4]);
    text.push_back(kHex[byte & 15]);
  }
  return text;
}

std::string textOf(const QVDictionary& dictionary, std::string_view key) {
  const QVValue* value = dictionary.find(key);
  return value == nullptr || value->isAbsent() ? std::string() : QVText(*value);
}

std::string nameOf(const QVDictionary& userInfo, std::string_view key) {
  std::string name = textOf(userInfo, key);
  if (name.size() <= kMaximumNameBytes) return name;
  std::size_t length = kMaximumNameBytes;
  // Not in the middle of a character.
  while (length > 0 && (static_cast<unsigned char>(name[length]) & 0xC0) == 0x80) --length;
  name.resize(length);
  return name;
}

bool flagOf(const QVDictionary& dictionary, std::string_view key) {
  const QVValue* value = dictionary.find(key);
  return value != nullptr && value->doubleValue() != 0;
}

std::shared_ptr<QVEventSession> makeSession(const QVDictionary& sessionInfo,
                                            const QVDictionary& userInfo) {
  auto session = std::make_shared<QVEventSession>();
  if (const QVValue* value = sessionInfo.find(kBeaconSessionInfoSessionID)) {
    session->sessionID = value->integerValue();
  }
  if (const QVValue* value = sessionInfo.find(kBeaconSessionInfoClientType)) {
    session->clientType = value->integerValue();
  }
  if (const QVValue* value = sessionInfo.find(kBeaconSessionInfoClientVersion)) {
    session->clientVersion = value->doubleValue();
  }
  session->token = textOf(sessionInfo, kBeaconSessionInfoHierarchyToken);
  session->batchEvent = flagOf(sessionInfo, kBeaconSessionInfoBatchEvent);
  session->containsRealtimeEvents = flagOf(sessionInfo, kBeaconSessionInfoContainsRealtimeEvents);
  session->clientName = nameOf(userInfo, kBeaconUserInfoClientName);
  session->serviceName = nameOf(userInfo, kBeaconUserInfoServiceName);
  return session;
}

class Token : public BeaconSecureHierarchyToken {
 public:
  std::string description() const override { return text_; }

 private:
  const std::string text_ = newTokenText();
};

class Session : public QVBeaconSession {
 public:
  Session(std::shared_ptr<QVSQLiteEventStore> store, std::shared_ptr<QVEventSession> session)
      : store_(std::move(store)), session_(std::move(session)) {}

  std::string description() const override {
    return QVText("beacon session ", session_->sessionID, " ", session_->token);
  }
  void startConfigurationWithCompletionHandler(BackendsCompletion completion) override {
    store_->findBackends(std::move(completion));
  }
  [[nodiscard]] bool sendMessageWithCategory(uint16_t category, uint16_t type,
                                             const QVDictionary& payload,
                                             std::optional<QVError>& error) override {
    if (store_->addMessage(session_, category, type, payload)) return true;
    error = QVEventStoreClosedError();
    return false;
  }
  void flushMessagesWithCompletion(FlushCompletion completion) override {
    store_->flush(session_, std::move(completion));
  }

 private:
  const std::shared_ptr<QVSQLiteEventStore> store_;
  const std::shared_ptr<QVEventSession> session_;
};

}  // namespace

QVStoreBeacon::QVStoreBeacon(std::shared_ptr<QVSQLiteEventStore> store)
    : store_(std::move(store)) {}

std::shared_ptr<BeaconSecureHierarchyToken> QVStoreBeacon::newSecureHierarchyTokenFromParentToken(
    const std::shared_ptr<BeaconSecureHierarchyToken>&) {
  return std::make_shared<Token>();
}

std::shared_ptr<QVBeaconSession> QVStoreBeacon::initWithSessionInfo(const QVDictionary& sessionInfo,
                                                                    const QVDictionary& userInfo,
                                                                    const QVArray&) {
  std::shared_ptr<QVEventSession> session = makeSession(sessionInfo, userInfo);
  store_->addSession(session, userInfo);
  return std::make_shared<Session>(store_, std::move(session));
}

bool QVStoreBeacon::sendOneMessageWithSessionInfo(const QVDictionary& sessionInfo,
                                                  const QVDictionary& userInfo, uint16_t category,
                                                  uint16_t type, const QVDictionary& payload,
                                                  std::optional<QVError>& error) {
  std::shared_ptr<QVEventSession> session = makeSession(sessionInfo, userInfo);
  session->single = true;
  if (store_->addMessage(session, category, type, payload)) return true;
  error = QVEventStoreClosedError();
  return false;
}
