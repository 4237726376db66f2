#pragma once

#include "platform/QVValue.h"
#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <filesystem>
#include <optional>

// The reporting switch: the preference that the service reads when it is told to, and telling it.
//
// Threads: one at a time. Failures: QVToolFailure, notPermitted where the files are not this
// user's to change; the preference is as it was then. Where it is written and its notification
// cannot be, the status is `failed`, and the text says so.
class QVSwitchControl {
 public:
  explicit QVSwitchControl(const QVToolPlaces& places) : places_(places) {}

  // What the preference says; nothing where it cannot be read.
  std::optional<bool> isOn() const;

  // Writes the preference, leaving the domain's other keys as they are, and posts the notification.
  // Where the preference is a symbolic link, the file that it leads to is written, and it stays;
  // below another root directory no link is followed. False where there is nobody to post to: the
  // service does not run.
  bool set(bool on) const;

 private:
  QVDictionary read() const;
  // The file itself, which need not be there.
  std::filesystem::path target() const;
  void checkPermission(const std::filesystem::path& file) const;
  // To be used with openat() and the like; makes that of the preference where it is missing.
  QVDescriptor preferenceDirectory(const std::filesystem::path& file) const;
  QVDescriptor notificationDirectory() const;
  // Takes away what is in the place of the notification.
  void withdraw() const;
  void write(const std::filesystem::path& path, const QVDictionary& values) const;
  bool post() const;

  const QVToolPlaces& places_;
};
