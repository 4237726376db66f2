#include "tools/qvctl/QVToolPlaces.h"

#include "client/QVClientOptions.h"
#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVOtherRoot.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <cstdlib>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

// Bytes of a socket's path; its address has a NUL besides.
constexpr std::size_t kLongestSocketPath = sizeof(sockaddr_un::sun_path) - 1;

}  // namespace

QVToolPlaces QVToolPlaces::find(const std::string& socket, const std::string& root) {
  QVToolPlaces places;
  if (root.empty()) {
    places.directories = QVServiceDirectories::fromEnvironment();
  } else {
    const std::filesystem::path top(root);
    places.root = top;
    places.directories = {.runtime = top / "run/quietvox",
                          .state = top / "var/lib/quietvox",
                          .configuration = top / "etc/quietvox",
                          .logs = top / "var/log/quietvox"};
  }
  // There is one thread so far.
  const char* const named = root.empty() ? ::secure_getenv(kQVClientSocketVariable)
                                         : nullptr;  // NOLINT(concurrency-mt-unsafe)
  if (!socket.empty()) {
    places.socket = socket;
  } else if (named != nullptr && *named != '\0') {
    places.socket = named;
  } else {
    places.socket = places.directories.socket();
  }
  if (!root.empty()) places.checkRoot();
  return places;
}

void QVToolPlaces::checkRoot() const {
  const QVDescriptor directory(::open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!directory.isOpen()) throw QVToolFailure::ofFile(root, X_OK, errno);
  const std::string store = directories.store();
  for (const std::filesystem::path& place :
       {directories.socket(), directories.channels(), directories.notifications(),
        directories.channelConfiguration(), servicePreferences(), summaries(),
        std::filesystem::path(store), std::filesystem::path(store + "-wal"),
        std::filesystem::path(store + "-shm"), std::filesystem::path(store + "-journal")}) {
    QVOtherRoot::refuseLinks(root, place);
  }
}

std::string QVToolPlaces::socketProblem() const {
  if (socket.native().size() > kLongestSocketPath) {
    return QVText(socket.string(), ": a socket's path has ", kLongestSocketPath,
                  " bytes at the most");
  }
  struct stat file {};
  if (::stat(socket.c_str(), &file) != 0 || S_ISSOCK(file.st_mode)) return {};
  return QVText(socket.string(),
                S_ISDIR(file.st_mode) ? ": a directory, not a socket" : ": not a socket");
}
