#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <thread>
#include <utility>

// How an event store works. The defaults are what the service runs with.
struct QVEventStoreOptions {
  // The database file. Its directory has to exist.
  std::string path;
  // The SQLite file system to use; empty for the usual one.
  std::string vfs{};
  // A row waits so long at the most before it is committed.
  std::chrono::nanoseconds commitInterval = std::chrono::milliseconds(250);
  // How often a store that is out of order is tried again.
  std::chrono::nanoseconds retryInterval = std::chrono::seconds(1);
  // Bytes of payload and rows held for a store that is out of order. Less than the 64 MiB that the
  // service accepts in all, so that clients go on being read while the oldest rows are given up.
  std::size_t heldBytes = std::size_t{48} * 1024 * 1024;
  // Bytes of the file where the preference "store_limit_mib" does not say otherwise.
  int64_t fileBytes = int64_t{256} * 1024 * 1024;
  // Begins the writer's thread; throws where none can be had.
  std::function<std::thread(std::function<void()>)> makeThread = [](std::function<void()> body) {
    return std::thread(std::move(body));
  };
};
