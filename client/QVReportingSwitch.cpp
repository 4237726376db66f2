#include "client/QVReportingSwitch.h"

#include "platform/QVPreferences.h"
#include "platform/linux/files/QVJSONFile.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <utility>

#include <sys/inotify.h>
#include <unistd.h>

namespace {

constexpr const char* kPreferences = "/preferences/net.quillon.quietvox.json";
constexpr std::string_view kPreference = "disable_reporting";
constexpr std::string_view kNotifications = "notify";
constexpr std::string_view kNotification = "net.quillon.quietvox.reporting";

constexpr uint32_t kPosts = IN_CREATE | IN_ATTRIB | IN_MODIFY | IN_CLOSE_WRITE | IN_MOVED_TO;
constexpr uint32_t kGone = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

// Bytes; holds some hundred events.
constexpr std::size_t kBufferBytes = std::size_t{16} << 10;

}  // namespace

QVReportingSwitch::QVReportingSwitch(const std::string& configurationDirectory,
                                     std::string runtimeDirectory)
    : preferences_(configurationDirectory + kPreferences),
      runtimeDirectory_(std::move(runtimeDirectory)),
      inotify_(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  // In this order: a post in between is a second reading.
  watch();
  readPreference();
}

void QVReportingSwitch::readPreference() {
  // Why a file cannot be read is for the service to say.
  QVJSONFailure failure;
  const auto values = QVJSONFile::readDictionary(preferences_, failure);
  isOff_.store(values && QVPreferences::booleanReading(values->find(kPreference)),
               std::memory_order_relaxed);
}

int QVReportingSwitch::add(const std::string& directory) const {
  return inotify_add_watch(inotify_.get(), directory.c_str(), kPosts | kGone | IN_ONLYDIR);
}

void QVReportingSwitch::watch() {
  const std::string notifications = runtimeDirectory_ + '/' + std::string(kNotifications);
  watched_ = Watched::notifications;
  watch_ = add(notifications);
  if (watch_ >= 0) return;
  const int above = add(runtimeDirectory_);
  // It may have been made in between.
  watch_ = add(notifications);
  if (watch_ < 0) {
    watch_ = above;
    watched_ = above >= 0 ? Watched::runtimeDirectory : Watched::nothing;
  } else if (above >= 0) {
    static_cast<void>(inotify_rm_watch(inotify_.get(), above));
  }
}

void QVReportingSwitch::lookAgain() {
  if (watched_ == Watched::notifications) return;
  if (watch_ >= 0) static_cast<void>(inotify_rm_watch(inotify_.get(), watch_));
  watch();
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
      } else if (watched_ == Watched::notifications) {
        isNews = isNews || name == kNotification;
      } else {
        isAnew = isAnew || name == kNotifications;
      }
    }
  }
  if (isAnew) {
    watched_ = Watched::nothing;
    lookAgain();
  } else if (isNews) {
    readPreference();
  }
}
