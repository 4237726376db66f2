#include "tests/support/QVServiceLog.h"

#include <fstream>
#include <utility>

QVServiceLog::QVServiceLog(std::filesystem::path file)
    : file_(std::move(file)), watch_(file_.parent_path()) {}

std::vector<std::string> QVServiceLog::lines() const {
  return lines({});
}

std::vector<std::string> QVServiceLog::lines(std::string_view text) const {
  std::vector<std::string> found;
  std::ifstream stream(file_);
  for (std::string line; std::getline(stream, line);) {
    if (line.find(text) != std::string::npos) found.push_back(std::move(line));
  }
  return found;
}

bool QVServiceLog::await(std::string_view text, std::size_t count) const {
  return watch_.await([this, text, count] { return this->count(text) >= count; });
}
