#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <system_error>

QVToolFailure QVToolFailure::ofSystem(const std::string& path, int number, QVToolStatus status) {
  const bool isRefused = number == EACCES || number == EPERM || number == EROFS;
  std::string text = path;
  text.append(": ").append(std::generic_category().message(number));
  return {isRefused ? QVToolStatus::notPermitted : status, text};
}
