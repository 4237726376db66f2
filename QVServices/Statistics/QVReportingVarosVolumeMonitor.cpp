#include "QVServices/Statistics/QVReportingVarosVolumeMonitor.h"

QVReportingVarosVolumeMonitor::Monitor QVReportingVarosVolumeMonitor::init() {
  return nullptr;
}

void QVReportingVarosVolumeMonitor::addSession([[maybe_unused]] const Monitor& monitor,
                                               [[maybe_unused]] const Session& session) {}

void QVReportingVarosVolumeMonitor::removeSession([[maybe_unused]] const Monitor& monitor,
                                                  [[maybe_unused]] const Session& session) {}

void QVReportingVarosVolumeMonitor::stop([[maybe_unused]] const Monitor& monitor) {}
