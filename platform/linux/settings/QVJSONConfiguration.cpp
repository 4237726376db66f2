#include "platform/linux/settings/QVJSONConfiguration.h"

#include "platform/linux/files/QVJSONFile.h"

#include <optional>
#include <utility>

QVJSONConfiguration::QVJSONConfiguration(QVLog& log, std::string contents)
    : log_(log), contents_(std::move(contents)) {}

QVDictionary QVJSONConfiguration::read(const std::string& path, const QVLogSite& site) {
  QVJSONFailure failure;
  std::optional<QVDictionary> values = QVJSONFile::readDictionary(path, failure);
  if (!values && !failure.missing) {
    report(path, failure.description(), site);
    return QVDictionary::assemble({});
  }
  forgetReport(path);
  return values ? *std::move(values) : QVDictionary();
}

void QVJSONConfiguration::report(const std::string& path, const std::string& reason,
                                 const QVLogSite& site) {
  {
    const QVMutexLock lock(mutex_);
    // Some files are read again and again; one broken file is one line.
    std::string& last = reported_[path];
    if (last == reason) return;
    last = reason;
  }
  log_.error(nullptr, site, "cannot read ", contents_, " ", path, ": ", reason);
}

void QVJSONConfiguration::forgetReport(const std::string& path) {
  const QVMutexLock lock(mutex_);
  reported_.erase(path);
}
