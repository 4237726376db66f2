#pragma once

#include "platform/QVError.h"

#include <cerrno>
#include <string>
#include <system_error>

// The error of a system call that failed with `number`, which was about `path`.
inline QVError QVMakePosixError(const std::string& path, int number = errno) {
  std::string reason = path;
  reason.append(": ").append(std::generic_category().message(number));
  return {.domain = "net.quillon.posix",
          .code = number,
          .userInfo = {{QVError::kFailureReason, reason}}};
}
