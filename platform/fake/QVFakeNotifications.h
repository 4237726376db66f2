#pragma once

#include "platform/QVNotifications.h"
#include "platform/fake/QVFakeMisuse.h"

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

// Named notifications for tests: a post enqueues one delivery for each registration of its name,
// in the order of registration, on the queue that the registration named. Posts are not folded.
//
// A name is valid where it could name a file: not empty, neither "." nor "..", without "/" and NUL.
// Checks that a registration has a queue and a handler.
//
// Threads: any. Deliveries that are enqueued may outlive the fake.
class QVFakeNotifications final : public QVNotifications {
 public:
  [[nodiscard]] uint32_t registerDispatch(std::string_view name, int32_t& token,
                                          const std::shared_ptr<QVWorkQueue>& queue,
                                          Handler handler) override;
  void cancel(int32_t token) override;

  // Answers how many deliveries it enqueued.
  std::size_t post(std::string_view name);
  // The same, but each delivery carries a token that was never given out.
  std::size_t postWithForeignToken(std::string_view name);

  // What later registrations of valid names answer; other than kStatusOK they come to nothing.
  void setRegistrationStatus(uint32_t status);

  std::size_t registrationCount(std::string_view name) const;
  std::size_t registrationCount() const;
  // All deliveries that posts brought about.
  std::size_t enqueuedCount() const;
  std::vector<std::string> takeMisuses() { return misuse_.take(); }

 private:
  struct Registration {
    std::string name;
    int32_t token;
    std::shared_ptr<QVWorkQueue> queue;
    Handler handler;  // called on the queue alone
  };

  std::size_t enqueue(std::string_view name, bool foreign);

  QVFakeMisuse misuse_{"QVFakeNotifications"};
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  uint32_t registrationStatus_ = kStatusOK;
  int32_t lastToken_ = 0;
  std::map<int32_t, std::shared_ptr<Registration>> registrations_;  // by token: in their order
  std::size_t enqueuedCount_ = 0;
};
