#pragma once

#include "platform/QVValue.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <filesystem>
#include <optional>

// The reporting switch: the preference that the service reads when it is told to, and telling it.
//
// Threads: one at a time. Failures: QVToolFailure, notPermitted where the files are not this
// user's to change; nothing has been changed then.
class QVSwitchControl {
 public:
  explicit QVSwitchControl(const QVToolPlaces& places) : places_(places) {}

  // What the preference says; nothing where it cannot be read.
  std::optional<bool> isOn() const;

  // Writes the preference, leaving the domain's other keys as they are, and posts the notification.
  // Where the preference is a symbolic link, the file that it leads to is written, and it stays;
  // below another root directory, out of which it might lead, that fails. False where there is
  // nobody to post to: the service does not run.
  bool set(bool on) const;

 private:
  QVDictionary read() const;
  // The file itself, which need not be there.
  std::filesystem::path target() const;
  void checkPermission(const std::filesystem::path& file) const;
  void write(const std::filesystem::path& path, const QVDictionary& values) const;
  bool post() const;

  const QVToolPlaces& places_;
};
