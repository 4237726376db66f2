#include "tools/qvctl/QVSwitchControl.h"

#include "platform/QVPreferences.h"
#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "platform/linux/QVJSONText.h"
#include "platform/linux/QVPosixAtomicFile.h"
#include "platform/linux/files/QVJSONFile.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <filesystem>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr const char* kDisableKey = "disable_reporting";

// Symbolic links that lead from one to the next, as many as the kernel follows.
constexpr int kMaximumLinks = 40;

// What the file is where there was none: the service has to read it whatever this user's umask.
constexpr mode_t kPreferencesMode = 0644;
// Of the notification's file, which whoever may post may touch.
constexpr mode_t kNotificationMode = 0660;

void expectWritable(const std::filesystem::path& directory) {
  if (::access(directory.c_str(), W_OK | X_OK) != 0 && errno != ENOENT) {
    throw QVToolFailure::ofFile(directory, W_OK | X_OK, errno);
  }
}

// Whoever may post in the directory may touch the file, too. It is posted already: what this user
// may not give away stays this user's.
void letOthersPost(int file, const std::filesystem::path& directory) {
  struct stat place {};
  if (::stat(directory.c_str(), &place) == 0 && ::fchown(file, place.st_uid, place.st_gid) != 0) {
    static_cast<void>(::fchown(file, static_cast<uid_t>(-1), place.st_gid));
  }
  // Made with this user's umask.
  static_cast<void>(::fchmod(file, kNotificationMode));
}

}  // namespace

QVDictionary QVSwitchControl::read() const {
  const std::string path = places_.servicePreferences().string();
  QVJSONFailure failure;
  auto values = QVJSONFile::readDictionary(path, failure);
  if (values) return *std::move(values);
  if (failure.missing) return {};
  if (::access(path.c_str(), R_OK) != 0) throw QVToolFailure::ofFile(path, R_OK, errno);
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
  const std::filesystem::path file = target();
  checkPermission(file);
  write(file, values.merging({{kDisableKey, !on}}));
  return post();
}

std::filesystem::path QVSwitchControl::target() const {
  std::filesystem::path path = places_.servicePreferences();
  std::error_code error;
  for (int i = 0; std::filesystem::is_symlink(path, error); ++i) {
    if (places_.isOtherRoot) {
      throw QVToolFailure(QVToolStatus::failed,
                          path.string() + ": a symbolic link, which is not followed with --root");
    }
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

void QVSwitchControl::write(const std::filesystem::path& path, const QVDictionary& values) const {
  // Not that of a link's file: where that is missing, the link is wrong.
  const std::filesystem::path directory = places_.directories.preferences();
  std::error_code error;
  std::filesystem::create_directories(directory, error);
  if (error) throw QVToolFailure::ofSystem(directory.string(), error.value());
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

// With a file of its own in the place of the one that is there, which may be somebody's who lets
// nobody else touch it. Nothing is written through a link, either.
bool QVSwitchControl::post() const {
  const std::string path = places_.reportingNotification().string();
  if (::unlink(path.c_str()) != 0 && errno != ENOENT) throw QVToolFailure::ofSystem(path, errno);
  const QVDescriptor file(
      ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kNotificationMode));
  if (!file.isOpen()) {
    // Somebody else posted, after the preference was written.
    if (errno == EEXIST) return true;
    if (errno == ENOENT) return false;
    throw QVToolFailure::ofSystem(path, errno);
  }
  letOthersPost(file.get(), places_.directories.notifications());
  return true;
}
