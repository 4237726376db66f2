#include "platform/linux/orientation/QVFileOrientation.h"

#include "platform/linux/files/QVRegularFile.h"

#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace {

constexpr std::string_view kBlanks = " \t\r\n";

std::string_view withoutBlanks(std::string_view text) {
  const auto begin = text.find_first_not_of(kBlanks);
  if (begin == std::string_view::npos) return {};
  return text.substr(begin, text.find_last_not_of(kBlanks) + 1 - begin);
}

// Nothing where the file is empty.
std::optional<int32_t> read(const std::filesystem::path& path) {
  const QVRegularFile file(path, QVRegularFile::Links::refuse);
  std::string text;
  if (file.error() != 0 || file.read(QVFileOrientation::kMaximumBytes, text) != 0) {
    return QVOrientation::kUndefined;
  }
  const std::string_view word = withoutBlanks(text);
  if (word.empty()) return std::nullopt;
  return QVOrientation::orientationNamed(word);
}

}  // namespace

QVFileOrientation::QVFileOrientation(QVLog& log, std::shared_ptr<QVDirectoryWatcher> watcher,
                                     std::filesystem::path file, std::shared_ptr<const QVBell> bell,
                                     QVOrientationRegistrations& registrations)
    : log_(log),
      watcher_(std::move(watcher)),
      file_(std::move(file)),
      changes_(std::make_shared<Changes>()),
      registrations_(registrations) {
  changes_->bell = std::move(bell);
}

QVFileOrientation::~QVFileOrientation() {
  endWatch();
}

void QVFileOrientation::work() {
  const auto period = registrations_.period();
  if (std::exchange(period_, period) != period) {
    if (period == QVOrientationRegistrations::kNoDemand) {
      endWatch();
    } else {
      // First, so that no change goes unseen between the reading and the watch.
      beginWatch();
      changes_->isPending = true;
    }
  }
  if (period != QVOrientationRegistrations::kNoDemand && changes_->isPending.exchange(false)) {
    if (const auto value = read(file_)) registrations_.report(period, *value);
  }
}

int32_t QVFileOrientation::valueIn(const std::filesystem::path& file) {
  return read(file).value_or(QVOrientation::kUndefined);
}

void QVFileOrientation::beginWatch() {
  if (watch_ != QVDirectoryWatcher::kNoToken) return;
  std::string reason;
  watch_ = watcher_->watch(
      {file_.parent_path(), file_.filename(), QVDirectoryWatcher::Kind::contents},
      [changes = changes_] {
        changes->isPending = true;
        changes->bell->ring();
      },
      reason);
  if (watch_ == QVDirectoryWatcher::kNoToken) {
    log_.error(nullptr, "-[QVFileOrientation beginWatch]",
               "cannot watch the user interface's orientation: ", reason);
  }
}

void QVFileOrientation::endWatch() {
  if (watch_ == QVDirectoryWatcher::kNoToken) return;
  watcher_->unwatch(std::exchange(watch_, QVDirectoryWatcher::kNoToken));
}
