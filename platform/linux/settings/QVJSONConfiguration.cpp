#include "platform/linux/settings/QVJSONConfiguration.h"

#include "platform/linux/files/QVJSONFile.h"

#include <optional>
#include <utility>

QVJSONConfiguration::QVJSONConfiguration(QVLog& log, std::string contents)
    : log_(log), contents_(std::move(contents)) {}

QVDictionary QVJSONConfiguration::read(const std::string& path, const QVLogSite& site) {
  std::string complaint;
  QVDictionary values = read(path, complaint);
  if (!complaint.empty()) {
    log_.error(nullptr, site, "cannot read ", contents_, " ", path, ": ", complaint);
  }
  return values;
}

QVDictionary QVJSONConfiguration::read(const std::string& path, std::string& complaint) {
  QVJSONFailure failure;
  // Over the reading, too: of two at once, the later one's values are to stay.
  const QVMutexLock lock(mutex_);
  std::optional<QVDictionary> values = QVJSONFile::readDictionary(path, failure);
  if (!values && failure.missing) {
    files_.erase(path);
    return {};
  }
  File& file = files_[path];
  if (values) {
    file = {.values = *std::move(values), .reported = {}};
    return file.values;
  }
  if (!failure.passing) file.values = QVDictionary::assemble({});
  // Some files are read again and again; one broken file is one line.
  std::string reason = failure.description();
  if (file.reported != reason) complaint = file.reported = std::move(reason);
  return file.values;
}
