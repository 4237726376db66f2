#pragma once

#include "client/QVClient.h"
#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <utility>
#include <vector>

// A connection to the service, for commands that ask or tell it something and wait for the answer.
// Where the service runs on demand, connecting starts it.
//
// Threads: one at a time; the client library has its own. Failures: QVToolFailure, notRunning where
// the service cannot be reached or is lost, notPermitted where the socket is closed to this user.
class QVServiceConnection {
 public:
  // An answer that takes longer is no answer; the service answers in microseconds unless its queue
  // is long.
  static constexpr std::chrono::milliseconds kTimeLimit{30'000};

  // `lost` runs on the library's thread when the connection is lost; may be empty.
  explicit QVServiceConnection(const QVToolPlaces& places, std::function<void()> lost = {});

  QVClient& client() { return *client_; }

  // The answer, or the failure that came instead.
  template <class Value>
  static Value answer(QVClientResult<Value> result) {
    if (!result) throw failure(result.error());
    return std::move(result.value());
  }
  static void expectTaken(const QVClientError& error) {
    if (error) throw failure(error);
  }
  static QVClientTargets noSession() { return QVClientTargets(std::span<const int64_t>()); }

  std::vector<int64_t> reporters();
  // The session's service type; nothing where there is no such session.
  std::optional<uint16_t> serviceType(int64_t reporterID);
  // Whether messages are taken in: asked with one that goes to no session.
  bool isReporting();

 private:
  static QVToolFailure failure(const QVClientError& error);

  std::unique_ptr<QVClient> client_;
};
