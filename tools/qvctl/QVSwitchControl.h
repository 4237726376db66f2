#pragma once

#include "platform/QVValue.h"
#include "tools/qvctl/QVToolPlaces.h"

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
  // False where there is nobody to post to: the service does not run.
  bool set(bool on) const;

 private:
  QVDictionary read() const;
  void checkPermission() const;
  void write(const QVDictionary& values) const;
  bool post() const;

  const QVToolPlaces& places_;
};
