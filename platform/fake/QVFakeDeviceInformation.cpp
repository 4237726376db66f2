#include "platform/fake/QVFakeDeviceInformation.h"

#include "platform/QVPreferences.h"

#include <algorithm>
#include <limits>
#include <utility>

std::optional<bool> QVFakeDeviceInformation::booleanAnswer(std::string_view key) {
  const std::lock_guard lock(mutex_);
  const QVValue* value = ask(key);
  if (value == nullptr) return std::nullopt;
  return QVPreferences::booleanReading(value);
}

std::optional<int32_t> QVFakeDeviceInformation::integerAnswer(std::string_view key) {
  using Limits = std::numeric_limits<int32_t>;
  const std::lock_guard lock(mutex_);
  const QVValue* value = ask(key);
  if (value == nullptr || !value->isNumber()) return std::nullopt;
  return static_cast<int32_t>(
      std::clamp<int64_t>(value->integerValue(), Limits::min(), Limits::max()));
}

void QVFakeDeviceInformation::setAnswer(std::string_view key, QVValue value) {
  const std::lock_guard lock(mutex_);
  answers_.insert_or_assign(std::string(key), std::move(value));
}

void QVFakeDeviceInformation::removeAnswer(std::string_view key) {
  const std::lock_guard lock(mutex_);
  if (const auto found = answers_.find(key); found != answers_.end()) answers_.erase(found);
}

std::size_t QVFakeDeviceInformation::questionsAbout(std::string_view key) const {
  const std::lock_guard lock(mutex_);
  const auto found = questions_.find(key);
  return found == questions_.end() ? 0 : found->second;
}

const QVValue* QVFakeDeviceInformation::ask(std::string_view key) {
  ++questions_[std::string(key)];
  const auto found = answers_.find(key);
  return found == answers_.end() ? nullptr : &found->second;
}
