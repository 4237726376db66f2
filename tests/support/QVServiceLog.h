#pragma once

#include "tests/support/QVDirectoryWatch.h"

#include <cstddef>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

// What a service wrote to its standard error, a file in a directory of its own.
//
// Threads: one at a time.
class QVServiceLog {
 public:
  explicit QVServiceLog(std::filesystem::path file);

  std::vector<std::string> lines() const;
  // Those that contain `text`.
  std::vector<std::string> lines(std::string_view text) const;
  std::size_t count(std::string_view text) const { return lines(text).size(); }
  // Waits until `count` lines contain `text`; false where they have not come within a minute.
  [[nodiscard]] bool await(std::string_view text, std::size_t count = 1) const;

 private:
  const std::filesystem::path file_;
  const QVDirectoryWatch watch_;
};
