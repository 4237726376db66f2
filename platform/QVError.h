#pragma once

#include "platform/QVValue.h"

#include <cstdint>
#include <string>

// An error object: a domain, a code within it, and whatever the domain adds. A value; immutable
// by convention.
struct QVError {
  std::string domain;
  int64_t code = 0;
  QVDictionary userInfo;

  // Key of `userInfo` under which a text for people lies, where there is one.
  static constexpr const char* kFailureReason = "failureReason";

  // The failure reason, else domain and code.
  std::string description() const;

  bool operator==(const QVError&) const = default;
};
