#pragma once

#include "platform/QVFunction.h"
#include "platform/QVWorkQueue.h"

#include <cstdint>
#include <memory>
#include <string_view>

// Named notifications: any process posts a name, every process that registered for it is told. A
// post carries nothing but its name.
//
// A post after the registration is delivered at least once. Posts in quick succession may be
// folded into one delivery; the last one is never lost: a delivery begins after it.
//
// Threads: any, at once. Never blocks on a peer.
class QVNotifications {
 public:
  // Called with the registration's token, on the queue that the registration named.
  using Handler = QVFunction<void(int32_t token)>;

  static constexpr uint32_t kStatusOK = 0;
  static constexpr uint32_t kStatusInvalidName = 1;
  static constexpr uint32_t kStatusFailed = 1000000;

  virtual ~QVNotifications() = default;
  // Delivers posts of `name` to `handler` on `queue` until it is cancelled. Writes the
  // registration's token to `token` before anything is delivered; tokens of this process differ
  // from each other and from 0. Answers kStatusOK, or else why there is no registration: `token` is
  // not touched then, and the adapter has logged the reason.
  [[nodiscard]] virtual uint32_t registerDispatch(std::string_view name, int32_t& token,
                                                  const std::shared_ptr<QVWorkQueue>& queue,
                                                  Handler handler) = 0;
  // Ends a registration: nothing is enqueued for it any more. A delivery that is already enqueued
  // still runs. An unknown token is ignored.
  virtual void cancel(int32_t token) = 0;
};
