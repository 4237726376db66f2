#pragma once

#include <filesystem>
#include <optional>
#include <string>

// Where the service's files are: the directories that the service manager hands over, else the
// usual ones. A value; made by the composition root.
struct QVServiceDirectories {
  std::filesystem::path runtime;
  std::filesystem::path state;
  std::filesystem::path configuration;
  std::filesystem::path logs;

  // From RUNTIME_DIRECTORY, STATE_DIRECTORY, CONFIGURATION_DIRECTORY and LOGS_DIRECTORY. A manager
  // that was asked for several directories lists them with ":" between; the first is meant.
  static QVServiceDirectories fromEnvironment();

  std::filesystem::path socket() const { return runtime / "reporting.socket"; }
  std::filesystem::path store() const { return state / "reporting.db"; }
  std::filesystem::path preferences() const { return configuration / "preferences"; }
  std::filesystem::path deviceInformation() const { return configuration / "device.json"; }
  // Where drivers publish, and which of the kernel's files publish.
  std::filesystem::path channels() const { return runtime / "channels"; }
  std::filesystem::path channelConfiguration() const { return configuration / "channels.json"; }
  // Where notifications are posted, and the file that says how the user interface is turned.
  std::filesystem::path notifications() const { return runtime / "notify"; }
  std::filesystem::path uiOrientation() const { return runtime / "ui-orientation"; }

  // Why the service could not write into `directory`; nothing where it can.
  static std::optional<std::string> obstacle(const std::filesystem::path& directory);
};
