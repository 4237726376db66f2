#include "tools/qvctl/QVSwitchControl.h"

#include "platform/QVPreferences.h"
#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "platform/linux/QVJSONFile.h"
#include "platform/linux/QVJSONText.h"
#include "platform/linux/QVPosixAtomicFile.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <filesystem>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr const char* kDisableKey = "disable_reporting";

// What the file is where there was none: the service has to read it whatever this user's umask.
constexpr mode_t kPreferencesMode = 0644;
// Of the notification's file, which whoever may post may touch.
constexpr mode_t kNotificationMode = 0660;

void expectWritable(const std::filesystem::path& directory) {
  if (::access(directory.c_str(), W_OK | X_OK) != 0 && errno != ENOENT) {
    throw QVToolFailure::ofSystem("cannot change anything in " + directory.string(), errno);
  }
}

}  // namespace

QVDictionary QVSwitchControl::read() const {
  const std::string path = places_.servicePreferences().string();
  QVJSONFailure failure;
  auto values = QVJSONFile::readDictionary(path, failure);
  if (values) return *std::move(values);
  if (failure.missing) return {};
  if (::access(path.c_str(), R_OK) != 0) throw QVToolFailure::ofSystem(path, errno);
  throw QVToolFailure(QVToolStatus::failed, QVText(path, ": ", failure.description()));
}

std::optional<bool> QVSwitchControl::isOn() const {
  try {
    return !QVPreferences::booleanReading(read().find(kDisableKey));
  } catch (const QVToolFailure&) {
    return std::nullopt;
  }
}

bool QVSwitchControl::set(bool on) const {
  const QVDictionary values = read();
  checkPermission();
  write(values.merging({{kDisableKey, !on}}));
  return post();
}

// Before anything is changed: a preference without its notification would take effect some day.
void QVSwitchControl::checkPermission() const {
  expectWritable(places_.directories.preferences());
  expectWritable(places_.directories.notifications());
}

void QVSwitchControl::write(const QVDictionary& values) const {
  const std::filesystem::path path = places_.servicePreferences();
  std::error_code error;
  std::filesystem::create_directories(path.parent_path(), error);
  if (error) throw QVToolFailure::ofSystem(path.parent_path().string(), error.value());
  struct stat before {};
  const bool isNew = ::stat(path.c_str(), &before) != 0;
  QVPosixAtomicFile file(path.string(), QVDescriptor(::open(path.parent_path().c_str(),
                                                            O_PATH | O_DIRECTORY | O_CLOEXEC)));
  QVJSONText text;
  file.write(text.write(values));
  file.write("\n");
  if (const auto failure = file.commit()) {
    throw QVToolFailure::ofSystem(path.string(), static_cast<int>(failure->code));
  }
  // Who may read it stays as it was. Only root can give a file away, and need not.
  [[maybe_unused]] const bool kept =
      isNew || ::lchown(path.c_str(), before.st_uid, before.st_gid) == 0;
  if (::chmod(path.c_str(), isNew ? kPreferencesMode : before.st_mode & 07777U) != 0) {
    throw QVToolFailure::ofSystem(path.string(), errno);
  }
}

bool QVSwitchControl::post() const {
  const std::string path = places_.reportingNotification().string();
  // Nothing is written through a link, and nobody is waited for.
  const QVDescriptor file(::open(
      path.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, kNotificationMode));
  if (!file.isOpen() && errno == ENOENT) return false;
  if (!file.isOpen() || ::futimens(file.get(), nullptr) != 0) {
    throw QVToolFailure::ofSystem(path, errno);
  }
  return true;
}
