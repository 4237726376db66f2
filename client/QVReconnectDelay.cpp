#include "client/QVReconnectDelay.h"

#include <algorithm>

QVReconnectDelay::QVReconnectDelay(std::chrono::milliseconds shortest,
                                   std::chrono::milliseconds longest, uint32_t seed)
    : shortest_(shortest), longest_(longest), random_(seed), pause_(shortest) {}

void QVReconnectDelay::connected(TimePoint now) {
  connectedAt_ = now;
}

void QVReconnectDelay::failed(TimePoint now) {
  if (connectedAt_ != TimePoint::max() && now - connectedAt_ >= longest_) pause_ = shortest_;
  connectedAt_ = TimePoint::max();
  std::uniform_int_distribution<std::chrono::milliseconds::rep> more(0, pause_.count() / 4);
  nextAttempt_ = now + pause_ + std::chrono::milliseconds(more(random_));
  pause_ = std::min(2 * pause_, longest_);
}
