#pragma once

#include "platform/linux/settings/QVServiceDirectories.h"

#include <filesystem>
#include <string>

// Where the service listens and keeps its files. A value.
//
//   --root DIR   the system whose root directory is DIR: DIR/run/quietvox, DIR/var/lib/quietvox,
//                and so on; else RUNTIME_DIRECTORY, STATE_DIRECTORY, CONFIGURATION_DIRECTORY and
//                LOGS_DIRECTORY, as the service takes them, else the usual ones
//   --socket     the socket; else without --root what QUIETVOX_SOCKET names, as the client library
//                takes it; else reporting.socket in the runtime directory
struct QVToolPlaces {
  std::filesystem::path socket;
  QVServiceDirectories directories;

  // Another system's root directory, below which no link is followed; empty: this system's.
  std::filesystem::path root;

  // `socket` and `root` as the command line has them; empty where it has none. Failures:
  // QVToolFailure where the root is no directory, or one of the places below it a link.
  static QVToolPlaces find(const std::string& socket, const std::string& root);

  // Why no service can be reached at the socket, whether it runs or not: what is there is no
  // socket, or its path is longer than an address. Names the path; empty where that is not so.
  std::string socketProblem() const;

  // Where sessions leave their summaries on an internal build.
  std::filesystem::path summaries() const {
    return directories.logs / "DiagnosticLogs" / "Audio" / "Reporting";
  }
  // The preferences of the service itself, and the notification that has it read them.
  std::filesystem::path servicePreferences() const {
    return directories.preferences() / "net.quillon.quietvox.json";
  }
  std::filesystem::path reportingNotification() const {
    return directories.notifications() / "net.quillon.quietvox.reporting";
  }

 private:
  void checkRoot() const;
};
