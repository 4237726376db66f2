#include "tools/qvctl/QVToolPlaces.h"

#include "client/QVClientOptions.h"
#include "platform/QVText.h"

#include <cstdlib>

#include <sys/stat.h>
#include <sys/un.h>

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
    places.isOtherRoot = true;
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
  return places;
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
