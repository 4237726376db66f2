#include "platform/linux/output/QVPosixFileSystem.h"

#include "platform/linux/QVPosixError.h"
#include "platform/linux/output/QVPosixAtomicFile.h"

#include <cstddef>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Directories are passed through: that takes no permission to read them.
constexpr int kDirectoryFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;

// Of a directory that has just been made, so that what it stands for is what is changed. Nobody got
// in before: mkdir() takes the umask from permissions, so they come after it.
bool setPermissions(int parent, const char* name, mode_t permissions) {
  const QVDescriptor made(::openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  return made.isOpen() && ::fchmod(made.get(), permissions) == 0;
}

// Makes one directory. False, with errno set, where it cannot be; another may have been faster.
bool makeDirectory(int parent, const char* name, mode_t permissions) {
  if (::mkdirat(parent, name, S_IRWXU) != 0) return errno == EEXIST;
  return setPermissions(parent, name, permissions);
}

bool isLink(int parent, const char* name) {
  struct stat status {};
  return ::fstatat(parent, name, &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISLNK(status.st_mode);
}

// The directory of that name, which is no link; not open, with errno set, where there is none.
QVDescriptor openChild(int parent, const std::string& name) {
  if (name.empty() || name == "." || name == ".." || name.find('\0') != std::string::npos) {
    errno = EINVAL;
    return {};
  }
  QVDescriptor child(::openat(parent, name.c_str(), kDirectoryFlags | O_NOFOLLOW));
  // The kernel says "not a directory" of a link, too.
  if (!child.isOpen() && errno == ENOTDIR) errno = isLink(parent, name.c_str()) ? ELOOP : ENOTDIR;
  return child;
}

// The root, whose path is the administrator's, links and all.
QVDescriptor openRoot(const std::string& root, std::optional<uint32_t> permissions,
                      std::string& failed) {
  failed = root;
  QVDescriptor directory(::open(root.c_str(), kDirectoryFlags));
  if (directory.isOpen() || errno != ENOENT || !permissions) return directory;
  for (std::size_t end = 0; end != std::string::npos;) {
    end = root.find('/', end + 1);
    failed = root.substr(0, end);
    directory = QVDescriptor(::open(failed.c_str(), kDirectoryFlags));
    if (directory.isOpen()) continue;
    if (errno != ENOENT || !makeDirectory(AT_FDCWD, failed.c_str(), *permissions)) return {};
    directory = QVDescriptor(::open(failed.c_str(), kDirectoryFlags));
    if (!directory.isOpen()) return {};
  }
  return directory;
}

// The part of the path below the root, empty for the root itself; nothing where it lies elsewhere.
std::optional<std::string_view> partBelow(std::string_view root, std::string_view path) {
  if (!path.starts_with(root)) return std::nullopt;
  const std::string_view below = path.substr(root.size());
  if (below.empty()) return below;
  if (below.front() != '/') return std::nullopt;
  return below.substr(1);
}

}  // namespace

QVDescriptor QVPosixFileSystem::openDirectory(std::string_view below,
                                              std::optional<uint32_t> permissions,
                                              std::string& failed) const {
  QVDescriptor directory = openRoot(diagnosticLogRoot_, permissions, failed);
  for (bool isLast = below.empty(); directory.isOpen() && !isLast;) {
    const std::size_t end = below.find('/');
    const std::string name(below.substr(0, end));
    isLast = end == std::string_view::npos;
    below.remove_prefix(isLast ? below.size() : end + 1);
    failed.append("/").append(name);
    QVDescriptor child = openChild(directory.get(), name);
    if (!child.isOpen() && errno == ENOENT && permissions &&
        makeDirectory(directory.get(), name.c_str(), *permissions)) {
      child = openChild(directory.get(), name);
    }
    directory = std::move(child);
  }
  return directory;
}

std::optional<QVError> QVPosixFileSystem::createDirectory(const std::string& path,
                                                          uint32_t permissions) {
  const auto below = partBelow(diagnosticLogRoot_, path);
  if (!below) return QVMakePosixError(path, EINVAL);
  std::string failed;
  if (!openDirectory(*below, permissions, failed).isOpen()) return QVMakePosixError(failed);
  return std::nullopt;
}

std::unique_ptr<QVAtomicFile> QVPosixFileSystem::makeAtomicFile(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  const auto below = partBelow(
      diagnosticLogRoot_, std::string_view(path).substr(0, slash == std::string::npos ? 0 : slash));
  QVDescriptor directory;
  if (below) {
    std::string failed;
    directory = openDirectory(*below, std::nullopt, failed);
  } else {
    errno = EINVAL;
  }
  return std::make_unique<QVPosixAtomicFile>(path, std::move(directory));
}
