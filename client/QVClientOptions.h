#pragma once

#include "client/QVClientError.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>

// Where the service listens, unless the environment variable QUIETVOX_SOCKET or the options say
// otherwise.
inline constexpr const char* kQVClientDefaultSocketPath = "/run/quietvox/reporting.socket";
inline constexpr const char* kQVClientSocketVariable = "QUIETVOX_SOCKET";

// Bytes of calls that wait for a service which does not read. Some thousand messages; a reporting
// program must not grow because of its statistics.
inline constexpr std::size_t kQVClientDefaultMaximumQueuedBytes = std::size_t{1} << 20;

// Calls without an answer yet. Twice as many as one connection may have sessions, whose starts are
// answered only when they stop.
inline constexpr std::size_t kQVClientDefaultMaximumOutstandingCalls = std::size_t{1} << 17;

// How a client is to be made. A value.
struct QVClientOptions {
  enum class Callbacks : uint8_t {
    ownThread,  // on a thread of the library
    pollLoop    // inside of dispatch(), which the program's own loop calls
  };

  // The service's socket. Empty: what QUIETVOX_SOCKET names, else the default path.
  std::string socketPath{};

  // Which thread runs replies and `connectionLost`.
  Callbacks callbacks = Callbacks::ownThread;

  // Runs exactly once, after the replies of all outstanding calls, when the connection is lost; not
  // when the client is destroyed. Must not throw.
  std::function<void(const QVClientError& error)> connectionLost{};

  // How long connect() may wait for a service that has a queue of clients.
  std::chrono::milliseconds connectTimeLimit{10'000};

  // Above these, calls answer queueFull. One message of any size is always let in where nothing
  // waits.
  std::size_t maximumQueuedBytes = kQVClientDefaultMaximumQueuedBytes;
  std::size_t maximumOutstandingCalls = kQVClientDefaultMaximumOutstandingCalls;
};
