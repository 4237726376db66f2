// The composition root: makes the adapters, gives them to the core, and runs the service.

#include "QVServices/Statistics/Service/QVReportingServer.h"
#include "QVServices/Statistics/Service/QVReportingServiceMain.h"
#include "platform/QVPlatform.h"
#include "platform/linux/bus/QVBusListener.h"
#include "platform/linux/log/QVSystemLog.h"
#include "platform/linux/orientation/QVLinuxOrientation.h"
#include "platform/linux/output/QVPosixFileSystem.h"
#include "platform/linux/output/QVRapidJSONOutput.h"
#include "platform/linux/queues/QVAsioRunLoopThreads.h"
#include "platform/linux/queues/QVAsioWorkQueues.h"
#include "platform/linux/queues/QVStdConditions.h"
#include "platform/linux/settings/QVJSONDeviceInformation.h"
#include "platform/linux/settings/QVJSONPreferences.h"
#include "platform/linux/settings/QVServiceDirectories.h"
#include "platform/linux/store/QVSQLiteEventStore.h"
#include "platform/linux/store/QVStoreBeacon.h"
#include "platform/linux/store/QVStoreCountwise.h"
#include "platform/linux/store/QVStoreJoulewell.h"
#include "platform/linux/system/QVLinuxProcess.h"
#include "platform/linux/system/QVSDTTracePoints.h"
#include "platform/linux/system/QVSystemClock.h"
#include "platform/linux/system/QVSystemRandom.h"
#include "platform/linux/tally/QVPublishedTally.h"
#include "platform/linux/watch/QVDirectoryWatcher.h"
#include "platform/linux/watch/QVInotifyNotifications.h"

#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <memory>
#include <mutex>
#include <stop_token>
#include <string>
#include <system_error>
#include <thread>
#include <utility>

#include <malloc.h>
#include <sys/stat.h>

namespace {

constexpr const char* kFunction = "main";

// Allocations from here on come from the kernel and go back to it when freed: what a session
// collected leaves no hole behind.
constexpr int kMappedAllocationBytes = 64 * 1024;

// When the service ends, sessions that still wait for backends get this long: enough for a store
// that is being opened, too short for anybody to mind.
constexpr std::chrono::seconds kLastBackendWait{3};

void runDry(QVStdConditions& conditions, QVAsioWorkQueues& queues, QVSQLiteEventStore& store) {
  {
    std::jthread cutter;
    try {
      cutter = std::jthread([&conditions](const std::stop_token& drained) {
        std::mutex mutex;
        std::condition_variable_any condition;
        std::unique_lock lock(mutex);
        condition.wait_for(lock, drained, kLastBackendWait, [] { return false; });
        if (!drained.stop_requested()) conditions.cutWaitsShort();
      });
    } catch (const std::system_error&) {
      // No thread is to be had: better they wait less than the end for ever.
      conditions.cutWaitsShort();
    }
    queues.drain();
  }
  store.close();
}

// Logs why the service cannot start; answers its exit status.
int giveUp(QVLog& log, const std::string& reason) {
  log.error(nullptr, kFunction, reason);
  log.flush();
  return EXIT_FAILURE;
}

// What the process is like, whoever started it.
void prepareProcess() {
  // There is one thread so far.
  // NOLINTBEGIN(concurrency-mt-unsafe)
  ::mallopt(M_MMAP_THRESHOLD, kMappedAllocationBytes);
  // What applications report is for the service's user and group alone.
  ::umask(S_IRWXO);
  // NOLINTEND(concurrency-mt-unsafe)
  // Until the listener handles them: an end that is asked for while the service starts is in good
  // order, too. Threads inherit it, so the signals come to this one.
  sigset_t ends;
  ::sigemptyset(&ends);
  ::sigaddset(&ends, SIGTERM);
  ::sigaddset(&ends, SIGINT);
  ::pthread_sigmask(SIG_BLOCK, &ends, nullptr);
}

int runService() {
  QVPlatform platform;
  auto ownedLog = std::make_unique<QVSystemLog>(QVSystemLog::standardSink());
  QVSystemLog& log = *ownedLog;
  platform.log = std::move(ownedLog);

  const auto directories = QVServiceDirectories::fromEnvironment();
  if (const auto obstacle = QVServiceDirectories::obstacle(directories.state)) {
    return giveUp(log, "cannot keep the event store in " + *obstacle);
  }

  platform.clock = std::make_unique<QVSystemClock>();
  platform.random = std::make_unique<QVSystemRandom>();
  platform.process = std::make_unique<QVLinuxProcess>();
  platform.tracePoints = std::make_unique<QVSDTTracePoints>();
  platform.preferences = std::make_unique<QVJSONPreferences>(log, directories.preferences());
  platform.deviceInformation =
      std::make_unique<QVJSONDeviceInformation>(log, directories.deviceInformation());
  platform.fileSystem = std::make_unique<QVPosixFileSystem>(directories.logs);
  platform.jsonOutput = std::make_unique<QVRapidJSONOutput>();
  log.readSwitchesFrom(platform.preferences.get());

  auto ownedConditions = std::make_unique<QVStdConditions>();
  auto ownedQueues = std::make_unique<QVAsioWorkQueues>(log);
  QVStdConditions& conditions = *ownedConditions;
  QVAsioWorkQueues& queues = *ownedQueues;
  platform.conditions = std::move(ownedConditions);
  platform.queues = std::move(ownedQueues);
  platform.runLoopThreads = std::make_unique<QVAsioRunLoopThreads>(log);

  const auto store = std::make_shared<QVSQLiteEventStore>(
      log, *platform.clock, *platform.preferences,
      QVEventStoreOptions{.path = directories.store().string()});
  platform.beacon = std::make_unique<QVStoreBeacon>(store);
  platform.countwise = std::make_unique<QVStoreCountwise>(store);
  platform.joulewell = std::make_unique<QVStoreJoulewell>(store);
  platform.tally = std::make_unique<QVPublishedTally>(log, directories.channels(),
                                                      directories.channelConfiguration());
  const auto watcher = std::make_shared<QVDirectoryWatcher>(log);
  platform.orientation = std::make_unique<QVLinuxOrientation>(
      log, watcher, directories.uiOrientation(),
      QVSensorProxyOptions{.busAddress = QVSensorProxyOrientation::systemBusAddress()});
  platform.notifications =
      std::make_unique<QVInotifyNotifications>(log, watcher, directories.notifications());

  QVPlatform::install(&platform);

  std::string error;
  platform.listener = QVBusListener::create(
      {.socketPath = directories.socket().string(),
       .afterCalls =
           [](QVFunction<void()> work) { QVReportingServer::queue().async(std::move(work)); },
       .drain = [&conditions, &queues, &store] { runDry(conditions, queues, *store); }},
      error);
  if (platform.listener == nullptr) return giveUp(log, error);

  const int status = QVReportingServiceMain();
  // While the core can still be called: what comes from outside and what runs by itself ends, and
  // lets go of the sessions that are registered for it.
  platform.orientation = nullptr;
  platform.notifications = nullptr;
  platform.runLoopThreads = nullptr;
  log.flush();
  QVPlatform::install(nullptr);
  return status;
}

}  // namespace

int main() {
  prepareProcess();
  try {
    return runService();
  } catch (const std::exception& failure) {
    // The log may be what failed.
    std::fprintf(stderr, "<3>[default] main.cpp:%d:main: cannot run: %s\n", __LINE__,
                 failure.what());
    return EXIT_FAILURE;
  }
}
