#pragma once

#include "platform/QVDeviceInformation.h"
#include "platform/QVValue.h"

#include <cstddef>
#include <map>
#include <mutex>
#include <string>

// Device information for tests: a map that a test fills, read as the device's file is. Counts the
// questions.
//
// Threads: any.
class QVFakeDeviceInformation : public QVDeviceInformation {
 public:
  std::optional<bool> booleanAnswer(std::string_view key) override;
  std::optional<int32_t> integerAnswer(std::string_view key) override;

  void setAnswer(std::string_view key, QVValue value);
  void removeAnswer(std::string_view key);
  std::size_t questionsAbout(std::string_view key) const;

 private:
  // Counts the question; null where there is no answer. With mutex_ held.
  const QVValue* ask(std::string_view key);

  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::map<std::string, QVValue, std::less<>> answers_;
  std::map<std::string, std::size_t, std::less<>> questions_;
};
