#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

// Facts about the device that the service runs on.
//
// Threads: any, at once. May read a file. A question without an answer yields nothing; the adapter
// logs a file that it cannot read.
class QVDeviceInformation {
 public:
  virtual ~QVDeviceInformation() = default;
  // "InternalBuild": is this a build for the maker's own people?
  virtual std::optional<bool> booleanAnswer(std::string_view key) = 0;
  // "DeviceClassNumber".
  virtual std::optional<int32_t> integerAnswer(std::string_view key) = 0;
};
