#include "tools/qvctl/QVOtherRoot.h"

#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>

namespace {

// Of directories that are made; the user's umask takes from it.
constexpr mode_t kDirectoryMode = 0777;

constexpr int kDirectoryFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;

enum class Missing { leave, make };

bool isLink(int directory, const std::filesystem::path& name) {
  struct stat file {};
  return ::fstatat(directory, name.c_str(), &file, AT_SYMLINK_NOFOLLOW) == 0 &&
         S_ISLNK(file.st_mode);
}

QVToolFailure linkFailure(const std::filesystem::path& link) {
  return {QVToolStatus::failed,
          link.string() + ": a symbolic link, which is not followed with --root"};
}

QVDescriptor walk(const std::filesystem::path& root, const std::filesystem::path& directory,
                  Missing missing) {
  QVDescriptor place(::open(root.c_str(), kDirectoryFlags));
  std::filesystem::path way = root;
  for (const auto& part : directory.lexically_relative(root)) {
    if (!place.isOpen()) break;
    way /= part;
    if (missing == Missing::make && ::mkdirat(place.get(), part.c_str(), kDirectoryMode) != 0 &&
        errno != EEXIST) {
      return {};
    }
    QVDescriptor next(::openat(place.get(), part.c_str(), kDirectoryFlags | O_NOFOLLOW));
    const int number = errno;
    if (!next.isOpen() && isLink(place.get(), part)) throw linkFailure(way);
    place = std::move(next);
    errno = number;
  }
  return place;
}

}  // namespace

QVDescriptor QVOtherRoot::open(const std::filesystem::path& root,
                               const std::filesystem::path& directory) {
  return walk(root, directory, Missing::leave);
}

QVDescriptor QVOtherRoot::make(const std::filesystem::path& root,
                               const std::filesystem::path& directory) {
  return walk(root, directory, Missing::make);
}

void QVOtherRoot::refuseLinks(const std::filesystem::path& root,
                              const std::filesystem::path& file) {
  const QVDescriptor directory = open(root, file.parent_path());
  if (directory.isOpen() && isLink(directory.get(), file.filename())) throw linkFailure(file);
}
