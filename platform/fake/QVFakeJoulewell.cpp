#include "platform/fake/QVFakeJoulewell.h"

void QVFakeJoulewell::logEvent(int32_t agent, std::string_view name, const QVDictionary& event,
                               const QVDictionary& options) {
  if (name.empty()) misuse_.note("an event without a name");
  const std::lock_guard lock(mutex_);
  events_.push_back({agent, std::string(name), event, options});
}

std::vector<QVFakeJoulewell::Event> QVFakeJoulewell::events() const {
  const std::lock_guard lock(mutex_);
  return events_;
}

void QVFakeJoulewell::forgetEvents() {
  const std::lock_guard lock(mutex_);
  events_.clear();
}

std::vector<std::string> QVFakeJoulewell::takeMisuses() {
  return misuse_.take();
}
