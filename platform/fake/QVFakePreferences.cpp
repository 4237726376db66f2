#include "platform/fake/QVFakePreferences.h"

#include <utility>
#include <vector>

QVDictionary QVFakePreferences::valuesInDomain(std::string_view domain) {
  const std::lock_guard lock(mutex_);
  ++readings_[std::string(domain)];
  const auto found = domains_.find(domain);
  if (found == domains_.end()) return {};
  std::vector<QVDictionaryEntry> entries;
  for (const auto& [key, value] : found->second) entries.push_back({key, value});
  return QVDictionary::assemble(entries);
}

void QVFakePreferences::setValue(std::string_view domain, std::string_view key, QVValue value) {
  const std::lock_guard lock(mutex_);
  domains_[std::string(domain)].insert_or_assign(std::string(key), std::move(value));
}

void QVFakePreferences::removeValue(std::string_view domain, std::string_view key) {
  const std::lock_guard lock(mutex_);
  const auto found = domains_.find(domain);
  if (found == domains_.end()) return;
  if (const auto value = found->second.find(key); value != found->second.end()) {
    found->second.erase(value);
  }
}

void QVFakePreferences::setValues(std::string_view domain, const QVDictionary& values) {
  const std::lock_guard lock(mutex_);
  if (values.isAbsent()) {
    if (const auto found = domains_.find(domain); found != domains_.end()) domains_.erase(found);
    return;
  }
  Values& kept = domains_[std::string(domain)];
  kept.clear();
  for (const auto& [key, value] : values) kept.emplace(key, value);
}

std::size_t QVFakePreferences::readingsOfDomain(std::string_view domain) const {
  const std::lock_guard lock(mutex_);
  const auto found = readings_.find(domain);
  return found == readings_.end() ? 0 : found->second;
}
