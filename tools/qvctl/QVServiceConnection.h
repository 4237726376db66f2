#pragma once

#include "client/QVClient.h"
#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVToolPlaces.h"
#include "tools/qvctl/QVWaitNotice.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <utility>
#include <vector>

// A connection to the service, for commands that ask or tell it something and wait for the answer.
// Where the service runs on demand, connecting starts it. Whoever sits at a terminal is told when
// that takes longer than a moment.
//
// Threads: one at a time; the client library has its own. Failures: QVToolFailure, notRunning where
// the service cannot be reached, does not answer or is lost, notPermitted where the socket is
// closed to this user.
class QVServiceConnection {
 public:
  // An answer that takes longer is no answer. The service answers in microseconds, unless its queue
  // is long or somebody else's session keeps it: a stop waits for a start's backends, 9 s at most.
  static constexpr std::chrono::milliseconds kTimeLimit{15'000};
  // When somebody begins to wonder.
  static constexpr std::chrono::milliseconds kMoment{1000};

  struct Patience {
    std::chrono::milliseconds moment = kMoment;
    std::chrono::milliseconds limit = kTimeLimit;
  };

  // `lost` runs on the library's thread when the connection is lost; may be empty.
  explicit QVServiceConnection(const QVToolPlaces& places, std::function<void()> lost = {},
                               Patience patience = {kMoment, kTimeLimit});

  // Makes one of the client's waiting calls, `ask(&QVClient::killServiceAndWait)`: its answer, or
  // the failure that came instead. A call that answers nothing but an error throws that.
  template <class Value, class... Parameters, class... Arguments>
  Value ask(QVClientResult<Value> (QVClient::*call)(Parameters...), Arguments&&... arguments) {
    auto result = wait(call, std::forward<Arguments>(arguments)...);
    if (!result) throw failure(result.error());
    return std::move(result.value());
  }
  template <class... Parameters, class... Arguments>
  void ask(QVClientError (QVClient::*call)(Parameters...), Arguments&&... arguments) {
    expectTaken(wait(call, std::forward<Arguments>(arguments)...));
  }
  // The same, and what came, whatever it is.
  template <class Result, class... Parameters, class... Arguments>
  Result wait(Result (QVClient::*call)(Parameters...), Arguments&&... arguments) {
    const std::unique_ptr<QVWaitNotice> notice = notify();
    Result result = (client_.get()->*call)(std::forward<Arguments>(arguments)..., patience_.limit);
    isSaid_ = isSaid_ || (notice != nullptr && notice->end());
    return result;
  }
  // Makes one of the client's calls that do not wait: the reply comes on the library's thread.
  template <class... Parameters, class... Arguments>
  void send(QVClientError (QVClient::*call)(Parameters...), Arguments&&... arguments) {
    expectTaken((client_.get()->*call)(std::forward<Arguments>(arguments)...));
  }

  std::vector<int64_t> reporters();
  // The session's service type; nothing where there is no such session.
  std::optional<uint16_t> serviceType(int64_t reporterID);
  // Whether messages are taken in: asked with one that goes to no session.
  bool isReporting();

 private:
  // Says that the service is waited for, once; null where that has been said.
  std::unique_ptr<QVWaitNotice> notify() const;
  void expectTaken(const QVClientError& error) const {
    if (error) throw failure(error);
  }
  QVToolFailure failure(const QVClientError& error) const;

  const Patience patience_;
  bool isSaid_ = false;
  std::unique_ptr<QVClient> client_;
};
