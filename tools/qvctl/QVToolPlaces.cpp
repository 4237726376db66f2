#include "tools/qvctl/QVToolPlaces.h"

#include "client/QVClientOptions.h"

#include <cstdlib>

QVToolPlaces QVToolPlaces::find(const std::string& socket, const std::string& root) {
  QVToolPlaces places;
  if (root.empty()) {
    places.directories = QVServiceDirectories::fromEnvironment();
  } else {
    const std::filesystem::path top(root);
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
