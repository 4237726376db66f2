#include "platform/linux/log/QVSystemLog.h"

#include "platform/linux/log/QVJournalLogSink.h"
#include "platform/linux/log/QVStandardErrorLogSink.h"

#include <cstdlib>
#include <cstring>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

namespace {

const char* withoutDirectories(const char* path) {
  const char* const slash = std::strrchr(path, '/');
  return slash == nullptr ? path : slash + 1;
}

bool continuesCharacter(char byte) {
  return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
}

// Longer texts are a client's doing; the journal itself would take no more than three times that.
void limitText(std::string& text) {
  if (text.size() <= QVLog::kMaximumTextBytes) return;
  std::size_t end = QVLog::kMaximumTextBytes;
  while (end > 0 && continuesCharacter(text[end])) --end;
  const std::size_t rest = text.size() - end;
  text.resize(end);
  text += QVText(" ... (", rest, " bytes more)");
  text.shrink_to_fit();
}

}  // namespace

QVSystemLog::QVSystemLog(std::unique_ptr<QVLogSink> sink, std::chrono::milliseconds patience)
    : scopes_(std::make_shared<Scopes>()),
      writer_(std::make_shared<QVLogWriter>(std::move(sink), scopes_, patience)) {}

QVSystemLog::~QVSystemLog() {
  writer_->stop();
}

std::unique_ptr<QVLogSink> QVSystemLog::standardSink() {
  struct stat status {};
  // Asked once, before there are other threads.
  const char* const stream = std::getenv("JOURNAL_STREAM");  // NOLINT(concurrency-mt-unsafe)
  if (fstat(STDERR_FILENO, &status) == 0 &&
      QVIsJournalStream(stream, status.st_dev, status.st_ino)) {
    return std::make_unique<QVJournalLogSink>();
  }
  return std::make_unique<QVStandardErrorLogSink>(STDERR_FILENO);
}

QVLogScope* QVSystemLog::registerScope(bool, uint32_t code, std::string_view name,
                                       std::string_view domain, std::string_view verboseKey,
                                       int32_t) {
  // Without a lock: a file that cannot be read is logged by whoever reads it.
  bool verbose = false;
  if (QVPreferences* const preferences = preferences_) {
    const QVDictionary values = preferences->valuesInDomain(domain);
    verbose = QVPreferences::booleanReading(values.find(verboseKey));
  }
  const QVMutexLock lock(scopes_->mutex);
  const auto [entry, isNew] = scopes_->byName.try_emplace(std::string(name));
  QVLogScope& scope = entry->second;
  if (isNew) {
    scope.name = name;
    scope.code = code;
    scope.subsystem = domain;
  }
  scope.verbose.store(verbose, std::memory_order_relaxed);
  return &scope;
}

void QVSystemLog::write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
                        std::string text) {
  limitText(text);
  writer_->enqueue(
      {scope, level, site.function, withoutDirectories(site.file), site.line, std::move(text)});
}

void QVSystemLog::flush() {
  writer_->flush();
}
