#pragma once

#include "client/QVClientResult.h"
#include "client/QVClientVocabulary.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <vector>

// What calls are given and what they answer.
//
// A reply runs exactly once for each call that was taken in, on the thread that the client's
// options name, with a value or an error. It must not throw. An empty reply means that no answer is
// wanted: the service then sends none. Captures of up to two pointers cost no allocation.

// What the service knows of a reporter ID. reporterID is 0 where there is no such session.
struct QVClientReporter {
  int64_t reporterID = 0;
  QVClientServiceType serviceType = QVClientServiceType::unknown;
};

// The service's booleans acknowledge that an operation was handled, and are always true; they do
// not say that there is such a session.
using QVClientBooleanReply = std::function<void(const QVClientResult<bool>& handled)>;
using QVClientServiceTypeReply =
    std::function<void(const QVClientResult<QVClientServiceType>& serviceType)>;
using QVClientReporterReply = std::function<void(const QVClientResult<QVClientReporter>& reporter)>;
using QVClientReportersReply =
    std::function<void(const QVClientResult<std::vector<int64_t>>& reporterIDs)>;
// No error where the message was taken in.
using QVClientMessageReply = std::function<void(const QVClientError& error)>;

// Who gets a message: one session, those listed, or every started session of every client. Refers
// to a list that it is made from; meant to be made in place, as an argument.
class QVClientTargets {
 public:
  QVClientTargets(int64_t reporterID) noexcept : single_(reporterID), count_(1) {}
  QVClientTargets(std::span<const int64_t> reporterIDs) noexcept
      : list_(reporterIDs.data()), count_(reporterIDs.size()) {}
  static QVClientTargets everySession() noexcept {
    QVClientTargets targets{std::span<const int64_t>()};
    targets.everySession_ = true;
    return targets;
  }

  bool reachesEverySession() const noexcept { return everySession_; }
  std::span<const int64_t> reporterIDs() const noexcept {
    return {list_ != nullptr ? list_ : &single_, count_};
  }

 private:
  const int64_t* list_ = nullptr;
  int64_t single_ = 0;
  std::size_t count_;
  bool everySession_ = false;
};
