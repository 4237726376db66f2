#pragma once

#include "platform/QVValue.h"

#include <memory>

// Reads the audio drivers' statistics channels: a snapshot of the counters, and what grew since
// one. It has no channels, so snapshots are empty and nothing ever grows.
//
// Threads: any, at once.
class QVReportingDriverUtility {
 public:
  static std::shared_ptr<QVReportingDriverUtility> init();

  // A new snapshot, maybe empty, never absent.
  QVDictionary getSnapShot() const;
  // The channels that grew since `snapShot` (may be absent); absent where none did.
  QVDictionary getDriverStatisticsRelativeToSnapShot(const QVDictionary& snapShot) const;

 private:
  QVReportingDriverUtility() = default;
};
