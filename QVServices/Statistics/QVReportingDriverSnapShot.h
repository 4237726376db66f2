#pragma once

#include "platform/QVTally.h"

#include <map>
#include <memory>
#include <string>

// What the subscribed drivers counted at one moment. A driver that could not be sampled has no
// entry; an absent snapshot is a null pointer to one.
//
// Made by QVReportingDriverUtility, kept by the session that it was made for, not changed any more.
struct QVReportingDriverSnapShot {
  // By the driver's description.
  std::map<std::string, std::shared_ptr<const TallySampleSet>, std::less<>> sampleSets;
};
