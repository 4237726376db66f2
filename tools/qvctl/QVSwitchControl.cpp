#include "tools/qvctl/QVSwitchControl.h"

#include "platform/QVPreferences.h"
#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/output/QVPosixAtomicFile.h"
#include "platform/linux/store/QVJSONText.h"
#include "tools/qvctl/QVOtherRoot.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <filesystem>
#include <string>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr const char* kDisableKey = "disable_reporting";

// Symbolic links that lead from one to the next, as many as the kernel follows.
constexpr int kMaximumLinks = 40;

// What the file is where there was none: the service has to read it whatever this user's umask.
constexpr mode_t kPreferencesMode = 0644;
// What of a file's mode is kept: who may read and write, and no program's rights.
constexpr mode_t kAccessBits = 0777;
// Of the notification's file, which whoever may post may touch.
constexpr mode_t kNotificationMode = 0660;

void expectWritable(const std::filesystem::path& directory) {
  if (::access(directory.c_str(), W_OK | X_OK) != 0 && errno != ENOENT) {
    throw QVToolFailure::ofFile(directory, W_OK | X_OK, errno);
  }
}

// Whoever may post in the directory may touch the file, too. It is posted already: what this user
// may not give away stays this user's.
void letOthersPost(int file, int directory) {
  struct stat place {};
  if (::fstat(directory, &place) == 0 && ::fchown(file, place.st_uid, place.st_gid) != 0) {
    static_cast<void>(::fchown(file, static_cast<uid_t>(-1), place.st_gid));
  }
  // Made with this user's umask.
  static_cast<void>(::fchmod(file, kNotificationMode));
}

}  // namespace

QVDictionary QVSwitchControl::read() const {
  const std::filesystem::path path = places_.servicePreferences();
  if (!places_.root.empty()) QVOtherRoot::refuseLinks(places_.root, path);
  QVJSONFailure failure;
  auto values = QVJSONFile::readDictionary(path.string(), failure);
  if (values) return *std::move(values);
  if (failure.missing) return {};
  if (::access(path.c_str(), R_OK) != 0) throw QVToolFailure::ofFile(path, R_OK, errno);
  throw QVToolFailure(QVToolStatus::failed, QVText(path.string(), ": ", failure.description()));
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
  const std::filesystem::path file = target();
  checkPermission(file);
  withdraw();
  write(file, values.merging({{kDisableKey, !on}}));
  try {
    return post();
  } catch (const QVToolFailure& failure) {
    throw QVToolFailure(
        QVToolStatus::failed,
        QVText("the preference is written, but the service has not been told: ", failure.what()));
  }
}

std::filesystem::path QVSwitchControl::target() const {
  std::filesystem::path path = places_.servicePreferences();
  if (!places_.root.empty()) return path;
  std::error_code error;
  for (int i = 0; std::filesystem::is_symlink(path, error); ++i) {
    if (i == kMaximumLinks) {
      throw QVToolFailure::ofSystem(places_.servicePreferences().string(), ELOOP);
    }
    const auto next = std::filesystem::read_symlink(path, error);
    if (error) throw QVToolFailure::ofFile(path, R_OK, error.value());
    // One that is absolute takes the place of all of it.
    path = path.parent_path() / next;
  }
  return path;
}

// Before anything is changed: a preference without its notification would take effect some day.
void QVSwitchControl::checkPermission(const std::filesystem::path& file) const {
  expectWritable(file.parent_path());
  expectWritable(places_.directories.notifications());
}

QVDescriptor QVSwitchControl::preferenceDirectory(const std::filesystem::path& file) const {
  // Not that of a link's file: where that is missing, the link is wrong.
  const std::filesystem::path directory = places_.directories.preferences();
  if (!places_.root.empty()) {
    QVDescriptor made = QVOtherRoot::make(places_.root, directory);
    if (!made.isOpen()) throw QVToolFailure::ofSystem(directory.string(), errno);
    return made;
  }
  std::error_code error;
  std::filesystem::create_directories(directory, error);
  if (error) throw QVToolFailure::ofSystem(directory.string(), error.value());
  return QVDescriptor(::open(file.parent_path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

QVDescriptor QVSwitchControl::notificationDirectory() const {
  const std::filesystem::path directory = places_.directories.notifications();
  if (!places_.root.empty()) return QVOtherRoot::open(places_.root, directory);
  return QVDescriptor(::open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

void QVSwitchControl::write(const std::filesystem::path& path, const QVDictionary& values) const {
  QVDescriptor directory = preferenceDirectory(path);
  // Who may read it stays as it was. What is a link by now gives nothing to go by.
  struct stat before {};
  const bool isThere =
      ::fstatat(directory.get(), path.filename().c_str(), &before, AT_SYMLINK_NOFOLLOW) == 0 &&
      S_ISREG(before.st_mode);
  QVPosixAtomicFile file(path.string(), std::move(directory));
  if (isThere) {
    file.setAccess(before.st_mode & kAccessBits, before.st_uid, before.st_gid);
  } else {
    file.setAccess(kPreferencesMode, static_cast<uid_t>(-1), static_cast<gid_t>(-1));
  }
  QVJSONText text;
  file.write(text.write(values));
  file.write("\n");
  if (const auto failure = file.commit()) {
    throw QVToolFailure::ofSystem(path.string(), static_cast<int>(failure->code));
  }
}

// Before the preference is written: in a directory with the sticky bit, what is somebody else's is
// not this user's to remove.
void QVSwitchControl::withdraw() const {
  const std::filesystem::path path = places_.reportingNotification();
  const QVDescriptor directory = notificationDirectory();
  if (!directory.isOpen() || ::unlinkat(directory.get(), path.filename().c_str(), 0) == 0) return;
  if (errno != ENOENT) throw QVToolFailure::ofSystem(path.string(), errno);
}

// With a file of its own in the place of the one that was there, which may be somebody's who lets
// nobody else touch it. Nothing is written through a link, either.
bool QVSwitchControl::post() const {
  const std::filesystem::path path = places_.reportingNotification();
  const QVDescriptor directory = notificationDirectory();
  if (!directory.isOpen()) {
    if (errno == ENOENT) return false;
    throw QVToolFailure::ofSystem(path.parent_path().string(), errno);
  }
  const QVDescriptor file(::openat(directory.get(), path.filename().c_str(),
                                   O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kNotificationMode));
  if (!file.isOpen()) {
    // Somebody else posted, after the preference was written.
    if (errno == EEXIST) return true;
    if (errno == ENOENT) return false;
    throw QVToolFailure::ofSystem(path.string(), errno);
  }
  letOthersPost(file.get(), directory.get());
  return true;
}
