#include "platform/linux/settings/QVServiceDirectories.h"

#include <cerrno>
#include <cstdlib>
#include <string_view>
#include <system_error>

#include <unistd.h>

namespace {

std::filesystem::path directory(const char* variable, const char* usual) {
  const char* value = std::getenv(variable);
  const std::string_view listed = value == nullptr ? std::string_view() : value;
  const std::string_view first = listed.substr(0, listed.find(':'));
  return first.empty() ? std::filesystem::path(usual) : std::filesystem::path(first);
}

}  // namespace

QVServiceDirectories QVServiceDirectories::fromEnvironment() {
  return {.runtime = directory("RUNTIME_DIRECTORY", "/run/quietvox"),
          .state = directory("STATE_DIRECTORY", "/var/lib/quietvox"),
          .configuration = directory("CONFIGURATION_DIRECTORY", "/etc/quietvox"),
          .logs = directory("LOGS_DIRECTORY", "/var/log/quietvox")};
}

std::optional<std::string> QVServiceDirectories::obstacle(const std::filesystem::path& directory) {
  std::error_code error;
  if (!std::filesystem::is_directory(directory, error)) {
    return directory.string() + ": " + (error ? error.message() : "not a directory");
  }
  if (::access(directory.c_str(), W_OK | X_OK) != 0) {
    return directory.string() + ": " + std::generic_category().message(errno);
  }
  return std::nullopt;
}
