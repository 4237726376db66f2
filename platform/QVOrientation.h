#pragma once

#include "platform/QVFunction.h"

#include <cstdint>
#include <string>
#include <string_view>

// The orientation service: tells how the device is held, and how its user interface is turned.
//
// A callback is called with each value that differs from the last known one, on the service's own
// thread and without any of its locks. Registering delivers nothing by itself: a change is what is
// told. Where there is no source, or while it is out of order, the value is undefined.
//
// Registrations are named by an ID that the caller chooses. Several of one ID are all kept and all
// called; each unregistration ends the oldest of its ID, whoever made it: of two that share an ID,
// the one that unregisters first leaves the other with the younger registration. There may be a
// limit: a registration above it is dropped, with its callback, and one error line says so until a
// registration has ended.
//
// An exception that escapes a callback is logged once at error level on the default log; the other
// callbacks are called all the same.
//
// Threads: any, at once, also from a callback. None of the operations waits for the source. A
// callback that is running while it is unregistered ends on its own; it is destroyed after that.
class QVOrientation {
 public:
  using Callback = QVFunction<void(int32_t orientation)>;

  static constexpr int32_t kUndefined = 0;
  static constexpr int32_t kNormal = 1;
  static constexpr int32_t kBottomUp = 2;
  static constexpr int32_t kLeftUp = 3;
  static constexpr int32_t kRightUp = 4;

  virtual ~QVOrientation() = default;
  virtual void QVRegisterDeviceOrientation(std::string_view callbackID, Callback callback) = 0;
  virtual void QVRegisterUIOrientation(std::string_view callbackID, Callback callback) = 0;
  // An ID that is not registered is ignored.
  virtual void QVUnregisterDeviceOrientation(std::string_view callbackID) = 0;
  virtual void QVUnregisterUIOrientation(std::string_view callbackID) = 0;

  // "undefined" (every value that is none of the above, too), "normal", "bottom-up", "left-up",
  // "right-up". The same words name the values in the sources.
  static std::string_view textOfOrientation(int32_t orientation);
  // The value that a word names; kUndefined for any other word.
  static int32_t orientationNamed(std::string_view word);
};
