#include "tools/qvctl/QVToolFailure.h"

#include "tools/qvctl/QVWhoMay.h"

#include <cerrno>
#include <system_error>

QVToolFailure QVToolFailure::ofSystem(const std::string& path, int number, QVToolStatus status) {
  const bool isRefused = number == EACCES || number == EPERM || number == EROFS;
  std::string text = path;
  text.append(": ").append(std::generic_category().message(number));
  return {isRefused ? QVToolStatus::notPermitted : status, text};
}

QVToolFailure QVToolFailure::ofFile(const std::filesystem::path& path, int mode, int number,
                                    QVToolStatus status) {
  const QVToolFailure plain = ofSystem(path.string(), number, status);
  const std::string whoMay = number == EACCES ? QVWhoMay(path, mode) : std::string();
  return {plain.status(), plain.what() + whoMay};
}
