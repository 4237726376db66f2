#include "tools/qvctl/QVEnvironment.h"

#include <cstdlib>

std::string QVEnvironment(const char* name) {
  const char* const value = std::getenv(name);  // NOLINT(concurrency-mt-unsafe)
  return value == nullptr ? std::string() : std::string(value);
}
