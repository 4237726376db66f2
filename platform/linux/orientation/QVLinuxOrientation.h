#pragma once

#include "platform/QVLog.h"
#include "platform/QVOrientation.h"
#include "platform/linux/QVBell.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/orientation/QVFileOrientation.h"
#include "platform/linux/orientation/QVOrientationRegistrations.h"
#include "platform/linux/orientation/QVSensorProxyOrientation.h"
#include "platform/linux/watch/QVDirectoryWatcher.h"

#include <atomic>
#include <filesystem>
#include <memory>
#include <thread>

// Orientation on Linux: the device's from the sensor daemon on the system bus
// (QVSensorProxyOrientation), the user interface's from a file (QVFileOrientation). Each source is
// used only while somebody is registered for it.
//
// The last known value, from which a change is told, is what the source says when the first
// registration begins to use it. The user interface's file is read by that registration itself,
// which waits for nothing: every change after its return is told. The sensor daemon is asked; while
// it has not answered, nothing is known. Later registrations share it.
//
// Threads: as QVOrientation. One thread of its own works both sources and calls the callbacks; it
// begins with the first registration and sleeps without a time limit while there is none.
// Ownership: log and watcher outlive it. Callbacks that are still registered are destroyed with
// it, after its thread has ended. It is not destroyed by a callback.
// Failures: those of the sources are "undefined"; where no thread can be had, one error line, and
// the next registration tries again. An exception of a callback is one error line.
class QVLinuxOrientation final : public QVOrientation {
 public:
  QVLinuxOrientation(QVLog& log, std::shared_ptr<QVDirectoryWatcher> watcher,
                     std::filesystem::path uiFile, QVSensorProxyOptions sensorOptions);
  ~QVLinuxOrientation() override;
  QVLinuxOrientation(const QVLinuxOrientation&) = delete;
  QVLinuxOrientation& operator=(const QVLinuxOrientation&) = delete;

  void QVRegisterDeviceOrientation(std::string_view callbackID, Callback callback) override;
  void QVRegisterUIOrientation(std::string_view callbackID, Callback callback) override;
  void QVUnregisterDeviceOrientation(std::string_view callbackID) override;
  void QVUnregisterUIOrientation(std::string_view callbackID) override;

 private:
  void demandChanged();
  void run();
  void rest() const;

  QVLog& log_;
  const std::shared_ptr<const QVBell> bell_;
  std::atomic<bool> isEnding_{false};
  // Before the sources, which report to them.
  QVOrientationRegistrations device_;
  QVOrientationRegistrations ui_;
  // The thread's.
  QVSensorProxyOrientation sensor_;
  QVFileOrientation file_;

  QVMutex mutex_;
  std::thread thread_ QV_GUARDED_BY(mutex_);
};
