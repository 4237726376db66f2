#pragma once

#include "client/QVReporterCounters.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <string>

// Where the reporting switch lies unless these environment variables or the options say otherwise.
// They are the client's own: those that a service manager gives a program name the program's
// directories, not the service's.
inline constexpr const char* kQVReporterConfigurationVariable = "QUIETVOX_CONFIGURATION_DIRECTORY";
inline constexpr const char* kQVReporterDefaultConfiguration = "/etc/quietvox";
inline constexpr const char* kQVReporterRuntimeVariable = "QUIETVOX_RUNTIME_DIRECTORY";
inline constexpr const char* kQVReporterDefaultRuntime = "/run/quietvox";

// What may wait for the service: some thousand messages, about ten seconds of a busy program.
inline constexpr std::size_t kQVReporterDefaultQueuedBytes = std::size_t{1} << 20;
inline constexpr std::size_t kQVReporterDefaultQueuedMessages = 16'384;

// How a reporter is to be made. A value.
struct QVReporterOptions {
  // The service's socket. Empty: what QUIETVOX_SOCKET names, else the default path.
  std::string socketPath{};
  // Where the service's preferences and notifications are. Empty: what the variables above name,
  // else the default paths. The variables are not for programs with more rights than their caller.
  std::string configurationDirectory{};
  std::string runtimeDirectory{};

  // Above either of these, messages are dropped. A message counts with the bytes of its payload and
  // 24 more. Up to twice the bytes are held in memory.
  std::size_t maximumQueuedBytes = kQVReporterDefaultQueuedBytes;
  std::size_t maximumQueuedMessages = kQVReporterDefaultQueuedMessages;

  // After the service ended: connect again for the sake of the sessions that there are, and create,
  // configure and start them as they were. Without it they are lost; a start makes one anew.
  bool restoreSessions = true;

  // Between two attempts to connect: the first such pause, which doubles up to the longest. Up to a
  // quarter is added at random, so that not all programs come at once.
  std::chrono::milliseconds shortestReconnectDelay{250};
  std::chrono::milliseconds longestReconnectDelay{30'000};

  // How long the destructor may wait for what is still to be sent.
  std::chrono::milliseconds endTimeLimit{1'000};

  // How often real-time queues of started sessions are looked at.
  std::chrono::milliseconds realtimePeriod{20};

  // Told of dropped messages: how many since it was last told, at most once in an interval. Runs on
  // the reporter's thread; must not throw, nor wait for long: nothing is sent meanwhile. Messages
  // dropped because reporting is off are told of with the next others, when it is switched on
  // again, and at the end.
  std::function<void(const QVDropCounts& sinceLast)> dropped{};
  std::chrono::milliseconds dropReportInterval{1'000};
};
