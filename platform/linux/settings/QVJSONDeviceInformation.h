#pragma once

#include "platform/QVDeviceInformation.h"
#include "platform/QVLog.h"
#include "platform/QVValue.h"
#include "platform/linux/settings/QVJSONConfiguration.h"

#include <string>

// Device information in a file: one JSON object, read afresh at each question. A file that is not
// there, or cannot be read, answers nothing; where descriptors or memory are short, it answers what
// was last read of it.
//
// Threads: any. The log outlives it.
class QVJSONDeviceInformation : public QVDeviceInformation {
 public:
  QVJSONDeviceInformation(QVLog& log, std::string path);

  // As preferences are read: anything but true, a number other than 0, "true", "yes" and "1" is
  // false.
  std::optional<bool> booleanAnswer(std::string_view key) override;
  // A number, limited to the range; nothing for other kinds.
  std::optional<int32_t> integerAnswer(std::string_view key) override;

 private:
  QVDictionary answers();

  QVJSONConfiguration file_;
  const std::string path_;
};
