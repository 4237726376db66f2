#pragma once

#include "tests/support/QVSubprocess.h"

#include <filesystem>
#include <optional>
#include <string>

// A message bus of a test's own, on which whoever reaches its socket may do everything. It accepts
// connections as soon as the object is made, and is gone with it.
//
// Threads: one at a time.
class QVTestBus {
 public:
  // The socket and the bus's configuration are put into `directory`.
  explicit QVTestBus(const std::filesystem::path& directory);

  // The address of a bus in that directory, whether there is one or not.
  static std::string address(const std::filesystem::path& directory);

 private:
  std::optional<QVSubprocess> process_;
};
