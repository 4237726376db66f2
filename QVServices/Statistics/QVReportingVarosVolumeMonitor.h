#pragma once

#include "QVServices/Statistics/QVReportingSessionInformation.h"
#include "platform/QVRunLoop.h"
#include "platform/QVRunLoopThread.h"

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <set>
#include <string>

// Follows the volume of audio devices for the sessions that are running, on the maker's desktop
// system. Elsewhere, and so here, there is only the interface: a monitor cannot be had, and its
// operations do nothing.
//
// Operations are functions of a monitor that may be absent (null), as it always is, so that whoever
// has asked for one need not look whether there is one.
//
// Threads: any. Properties other than the timer are synchronised: they are read and replaced as a
// whole, while what they share is not to be changed.
class QVReportingVarosVolumeMonitor {
 public:
  using Monitor = std::shared_ptr<QVReportingVarosVolumeMonitor>;
  using Session = std::shared_ptr<const QVReportingSessionInformation>;
  using DeviceID = uint32_t;

  // Always null.
  static Monitor init();

  static void addSession(const Monitor& monitor, const Session& session);
  static void removeSession(const Monitor& monitor, const Session& session);
  static void stop(const Monitor& monitor);

  std::shared_ptr<QVRunLoopTimer> timer() const { return timer_; }
  std::shared_ptr<QVRunLoopThread> timerThread() const { return timerThread_; }
  std::shared_ptr<std::set<DeviceID>> deviceIDs() const { return deviceIDs_; }
  // "to" here and "To" below belong to the interface.
  std::shared_ptr<std::map<DeviceID, std::string>> deviceIDtoName() const {
    return deviceIDtoName_;
  }
  std::shared_ptr<std::map<DeviceID, double>> deviceIDToVolume() const { return deviceIDToVolume_; }
  std::shared_ptr<std::set<Session>> sessions() const { return sessions_; }

 private:
  QVReportingVarosVolumeMonitor() = default;

  std::shared_ptr<QVRunLoopTimer> timer_;
  std::atomic<std::shared_ptr<QVRunLoopThread>> timerThread_;
  std::atomic<std::shared_ptr<std::set<DeviceID>>> deviceIDs_;
  std::atomic<std::shared_ptr<std::map<DeviceID, std::string>>> deviceIDtoName_;
  std::atomic<std::shared_ptr<std::map<DeviceID, double>>> deviceIDToVolume_;
  std::atomic<std::shared_ptr<std::set<Session>>> sessions_;
};
