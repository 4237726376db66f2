#include "platform/linux/QVPosixFileSystem.h"

#include "platform/linux/QVPosixAtomicFile.h"
#include "platform/linux/QVPosixError.h"

#include <cstddef>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

bool isDirectory(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return false;
  if (S_ISDIR(status.st_mode)) return true;
  errno = ENOTDIR;
  return false;
}

// Makes one directory where there is none. False, with errno set, where it cannot be.
bool makeDirectory(const std::string& path, mode_t permissions) {
  if (isDirectory(path)) return true;
  if (errno != ENOENT) return false;
  // Nobody gets in before the permissions are the wanted ones: mkdir() takes the umask from them.
  if (::mkdir(path.c_str(), S_IRWXU) != 0) {
    // Another may have been faster.
    return errno == EEXIST && isDirectory(path);
  }
  const int directory = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (directory < 0) return false;
  const bool changed = ::fchmod(directory, permissions) == 0;
  const int number = errno;
  ::close(directory);
  errno = number;
  return changed;
}

}  // namespace

std::optional<QVError> QVPosixFileSystem::createDirectory(const std::string& path,
                                                          uint32_t permissions) {
  // Usually everything is there.
  if (isDirectory(path)) return std::nullopt;
  std::size_t end = 0;
  while (end != std::string::npos) {
    end = path.find('/', end + 1);
    const std::string part = path.substr(0, end);
    if (!makeDirectory(part, permissions)) return QVMakePosixError(part);
  }
  return std::nullopt;
}

std::unique_ptr<QVAtomicFile> QVPosixFileSystem::makeAtomicFile(const std::string& path) {
  return std::make_unique<QVPosixAtomicFile>(path);
}
