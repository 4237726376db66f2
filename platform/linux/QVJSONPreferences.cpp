#include "platform/linux/QVJSONPreferences.h"

#include "platform/linux/QVJSONFile.h"

#include <algorithm>
#include <utility>

QVJSONPreferences::QVJSONPreferences(QVLog& log, std::string directory)
    : log_(log), directory_(std::move(directory)) {}

QVDictionary QVJSONPreferences::valuesInDomain(std::string_view domain) {
  std::string name(domain);
  std::ranges::replace_if(
      name, [](char c) { return c == '/' || c == '\0'; }, '_');
  const std::string path = directory_ + '/' + name + ".json";
  QVJSONFailure failure;
  std::optional<QVDictionary> values = QVJSONFile::readDictionary(path, failure);
  if (values) {
    forgetReport(path);
    return *std::move(values);
  }
  if (failure.missing) {
    forgetReport(path);
    return {};
  }
  report(path, failure.description());
  return QVDictionary::assemble({});
}

void QVJSONPreferences::report(const std::string& path, const std::string& reason) {
  {
    const QVMutexLock lock(mutex_);
    // The event store reads its preferences again and again; one broken file is one line.
    std::string& last = reported_[path];
    if (last == reason) return;
    last = reason;
  }
  log_.error(nullptr, "-[QVJSONPreferences valuesInDomain:]", "cannot read preferences ", path,
             ": ", reason);
}

void QVJSONPreferences::forgetReport(const std::string& path) {
  const QVMutexLock lock(mutex_);
  reported_.erase(path);
}
