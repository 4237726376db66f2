#include "client/QVReportingSwitch.h"

#include "platform/QVPreferences.h"
#include "platform/linux/files/QVJSONFile.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>
#include <string_view>
#include <system_error>

#include <sys/inotify.h>
#include <unistd.h>

namespace {

constexpr const char* kPreferences = "/preferences/net.quillon.quietvox.json";
constexpr std::string_view kPreference = "disable_reporting";
constexpr std::string_view kNotifications = "notify";
constexpr std::string_view kNotification = "net.quillon.quietvox.reporting";

constexpr uint32_t kPosts = IN_CREATE | IN_ATTRIB | IN_MODIFY | IN_CLOSE_WRITE | IN_MOVED_TO;
constexpr uint32_t kAppearances = IN_CREATE | IN_ATTRIB | IN_MOVED_TO;
constexpr uint32_t kGone = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

// Bytes; holds some hundred events.
constexpr std::size_t kBufferBytes = std::size_t{16} << 10;

std::vector<std::filesystem::path> levelsOf(const std::filesystem::path& directory) {
  std::error_code withoutCurrentDirectory;
  std::filesystem::path level = std::filesystem::absolute(directory, withoutCurrentDirectory);
  std::vector<std::filesystem::path> levels{level};
  for (; level.has_relative_path(); levels.push_back(level)) level = level.parent_path();
  std::ranges::reverse(levels);
  return levels;
}

}  // namespace

QVReportingSwitch::QVReportingSwitch(const std::string& configurationDirectory,
                                     const std::string& runtimeDirectory)
    : preferences_(configurationDirectory + kPreferences),
      levels_(levelsOf(std::filesystem::path(runtimeDirectory) / kNotifications)),
      inotify_(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  // In this order: a post in between is a second reading.
  watch();
  readPreference();
}

void QVReportingSwitch::readPreference() {
  // Why a file cannot be read is for the service to say.
  QVJSONFailure failure;
  try {
    const auto values = QVJSONFile::readDictionary(preferences_, failure);
    if (failure.passing) return;
    isOff_.store(values && QVPreferences::booleanReading(values->find(kPreference)),
                 std::memory_order_relaxed);
  } catch (const std::bad_alloc&) {
    // As where descriptors are short.
  }
}

int QVReportingSwitch::add(std::size_t level) const {
  const bool isLast = level + 1 == levels_.size();
  return inotify_add_watch(inotify_.get(), levels_[level].c_str(),
                           (isLast ? kPosts : kAppearances) | kGone | IN_ONLYDIR);
}

void QVReportingSwitch::remove(int watch) const {
  static_cast<void>(inotify_rm_watch(inotify_.get(), watch));
}

void QVReportingSwitch::watch() {
  watch_ = -1;
  for (level_ = levels_.size(); level_ > 0; --level_) {
    watch_ = add(level_ - 1);
    if (watch_ >= 0) break;
  }
  // What was missing may have been made in between.
  while (watch_ >= 0 && !hearsPosts()) {
    const int below = add(level_);
    if (below < 0) break;
    if (below != watch_) remove(watch_);
    watch_ = below;
    ++level_;
  }
}

void QVReportingSwitch::lookAgain() {
  const int before = watch_;
  watch();
  // One directory has one watch.
  if (before >= 0 && before != watch_) remove(before);
  readPreference();
}

void QVReportingSwitch::readNews() {
  alignas(inotify_event) std::array<char, kBufferBytes> buffer;
  bool isNews = false;
  bool isAnew = false;
  for (;;) {
    const ssize_t count = read(inotify_.get(), buffer.data(), buffer.size());
    if (count <= 0) break;
    for (std::size_t at = 0; at < static_cast<std::size_t>(count);) {
      inotify_event event;
      std::memcpy(&event, buffer.data() + at, sizeof event);
      const char* name = event.len != 0 ? buffer.data() + at + sizeof event : "";
      at += sizeof event + event.len;
      // What was lost may have been the end of the directory, or its beginning.
      if ((event.mask & IN_Q_OVERFLOW) != 0) isAnew = true;
      // Others are of watches that are over.
      if (event.wd != watch_) continue;
      if ((event.mask & kGone) != 0) {
        isAnew = true;
      } else if (hearsPosts()) {
        isNews = isNews || name == kNotification;
      } else {
        isAnew = isAnew || name == levels_[level_].filename();
      }
    }
  }
  if (isAnew) {
    lookAgain();
  } else if (isNews) {
    readPreference();
  }
}
