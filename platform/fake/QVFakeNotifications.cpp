#include "platform/fake/QVFakeNotifications.h"

#include <algorithm>
#include <utility>

namespace {

// Tokens count up from 1 and never get there.
constexpr int32_t kForeignToken = -1;

bool isValidName(std::string_view name) {
  return !name.empty() && name != "." && name != ".." &&
         name.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

}  // namespace

uint32_t QVFakeNotifications::registerDispatch(std::string_view name, int32_t& token,
                                               const std::shared_ptr<QVWorkQueue>& queue,
                                               Handler handler) {
  if (queue == nullptr) misuse_.note("a registration without a queue");
  if (!handler) misuse_.note("a registration without a handler");
  if (queue == nullptr || !handler) return kStatusFailed;
  if (!isValidName(name)) return kStatusInvalidName;
  const std::lock_guard lock(mutex_);
  if (registrationStatus_ != kStatusOK) return registrationStatus_;
  token = ++lastToken_;
  registrations_.emplace(
      token, std::make_shared<Registration>(std::string(name), token, queue, std::move(handler)));
  return kStatusOK;
}

void QVFakeNotifications::cancel(int32_t token) {
  // The handler's captures are destroyed without the lock.
  std::shared_ptr<Registration> cancelled;
  const std::lock_guard lock(mutex_);
  const auto found = registrations_.find(token);
  if (found == registrations_.end()) return;
  cancelled = std::move(found->second);
  registrations_.erase(found);
}

std::size_t QVFakeNotifications::post(std::string_view name) {
  return enqueue(name, false);
}

std::size_t QVFakeNotifications::postWithForeignToken(std::string_view name) {
  return enqueue(name, true);
}

// Enqueues with the lock held, so that nothing is enqueued once cancel() has returned; enqueueing
// runs nothing.
std::size_t QVFakeNotifications::enqueue(std::string_view name, bool foreign) {
  const std::lock_guard lock(mutex_);
  std::size_t count = 0;
  for (const auto& [token, registration] : registrations_) {
    if (registration->name != name) continue;
    registration->queue->async([registration, delivered = foreign ? kForeignToken : token] {
      registration->handler(delivered);
    });
    ++count;
  }
  enqueuedCount_ += count;
  return count;
}

void QVFakeNotifications::setRegistrationStatus(uint32_t status) {
  const std::lock_guard lock(mutex_);
  registrationStatus_ = status;
}

std::size_t QVFakeNotifications::registrationCount(std::string_view name) const {
  const std::lock_guard lock(mutex_);
  return static_cast<std::size_t>(std::ranges::count_if(
      registrations_, [name](const auto& entry) { return entry.second->name == name; }));
}

std::size_t QVFakeNotifications::registrationCount() const {
  const std::lock_guard lock(mutex_);
  return registrations_.size();
}

std::size_t QVFakeNotifications::enqueuedCount() const {
  const std::lock_guard lock(mutex_);
  return enqueuedCount_;
}
