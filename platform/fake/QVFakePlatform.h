#pragma once

#include "platform/QVPlatform.h"
#include "platform/fake/QVFakeBeacon.h"
#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeConditions.h"
#include "platform/fake/QVFakeCountwise.h"
#include "platform/fake/QVFakeDeviceInformation.h"
#include "platform/fake/QVFakeFileSystem.h"
#include "platform/fake/QVFakeIPCListener.h"
#include "platform/fake/QVFakeJSONOutput.h"
#include "platform/fake/QVFakeJoulewell.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakeNotifications.h"
#include "platform/fake/QVFakeOrientation.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/fake/QVFakeProcess.h"
#include "platform/fake/QVFakeRandom.h"
#include "platform/fake/QVFakeRunLoopThreads.h"
#include "platform/fake/QVFakeTally.h"
#include "platform/fake/QVFakeTracePoints.h"
#include "platform/fake/QVFakeWorkQueues.h"

// A platform of fakes, installed while it exists. Queues, conditions, threads and clock share one
// virtual time. A test makes it first and drops it last: work that is still enqueued, and what open
// connections and orientation callbacks hold, is destroyed with it, while the platform can still be
// asked.
//
// Threads: made and destroyed while no other thread uses the core.
class QVFakePlatform {
 public:
  QVFakePlatform();
  ~QVFakePlatform();
  QVFakePlatform(const QVFakePlatform&) = delete;
  QVFakePlatform& operator=(const QVFakePlatform&) = delete;

  QVFakeLog& log() { return *log_; }
  QVFakeClock& clock() { return *clock_; }
  QVFakeRandom& random() { return *random_; }
  QVFakeProcess& process() { return *process_; }
  QVFakeTracePoints& tracePoints() { return *tracePoints_; }
  QVFakePreferences& preferences() { return *preferences_; }
  QVFakeDeviceInformation& deviceInformation() { return *deviceInformation_; }
  QVFakeFileSystem& fileSystem() { return *fileSystem_; }
  QVFakeJSONOutput& jsonOutput() { return *jsonOutput_; }
  QVFakeConditions& conditions() { return *conditions_; }
  QVFakeWorkQueues& queues() { return *queues_; }
  QVFakeBeacon& beacon() { return *beacon_; }
  QVFakeCountwise& countwise() { return *countwise_; }
  QVFakeJoulewell& joulewell() { return *joulewell_; }
  QVFakeTally& tally() { return *tally_; }
  QVFakeOrientation& orientation() { return *orientation_; }
  QVFakeNotifications& notifications() { return *notifications_; }
  QVFakeRunLoopThreads& runLoopThreads() { return *runLoopThreads_; }
  QVFakeIPCListener& listener() { return *listener_; }

 private:
  QVPlatform platform_;
  // Into platform_.
  QVFakeLog* log_;
  QVFakeClock* clock_;
  QVFakeRandom* random_;
  QVFakeProcess* process_;
  QVFakeTracePoints* tracePoints_;
  QVFakePreferences* preferences_;
  QVFakeDeviceInformation* deviceInformation_;
  QVFakeFileSystem* fileSystem_;
  QVFakeJSONOutput* jsonOutput_;
  QVFakeWorkQueues* queues_;
  QVFakeConditions* conditions_;
  QVFakeBeacon* beacon_;
  QVFakeCountwise* countwise_;
  QVFakeJoulewell* joulewell_;
  QVFakeTally* tally_;
  QVFakeOrientation* orientation_;
  QVFakeNotifications* notifications_;
  QVFakeRunLoopThreads* runLoopThreads_;
  QVFakeIPCListener* listener_;
};
