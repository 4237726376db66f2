#include "platform/fake/QVFakePlatform.h"

namespace {

// Puts a new fake into a member of the platform and answers it under its own type.
template <class Fake, class Interface, class... Arguments>
Fake* fill(std::unique_ptr<Interface>& member, Arguments&... arguments) {
  auto fake = std::make_unique<Fake>(arguments...);
  Fake* const typed = fake.get();
  member = std::move(fake);
  return typed;
}

}  // namespace

QVFakePlatform::QVFakePlatform()
    : log_(fill<QVFakeLog>(platform_.log)),
      clock_(fill<QVFakeClock>(platform_.clock)),
      random_(fill<QVFakeRandom>(platform_.random)),
      process_(fill<QVFakeProcess>(platform_.process)),
      tracePoints_(fill<QVFakeTracePoints>(platform_.tracePoints)),
      preferences_(fill<QVFakePreferences>(platform_.preferences)),
      deviceInformation_(fill<QVFakeDeviceInformation>(platform_.deviceInformation)),
      fileSystem_(fill<QVFakeFileSystem>(platform_.fileSystem)),
      jsonOutput_(fill<QVFakeJSONOutput>(platform_.jsonOutput)),
      queues_(fill<QVFakeWorkQueues>(platform_.queues, *clock_, *log_)),
      conditions_(fill<QVFakeConditions>(platform_.conditions, *queues_, *clock_)),
      beacon_(fill<QVFakeBeacon>(platform_.beacon)),
      countwise_(fill<QVFakeCountwise>(platform_.countwise)),
      joulewell_(fill<QVFakeJoulewell>(platform_.joulewell)),
      tally_(fill<QVFakeTally>(platform_.tally)),
      orientation_(fill<QVFakeOrientation>(platform_.orientation, *log_)),
      notifications_(fill<QVFakeNotifications>(platform_.notifications)),
      runLoopThreads_(
          fill<QVFakeRunLoopThreads>(platform_.runLoopThreads, *queues_, *clock_, *log_)),
      listener_(fill<QVFakeIPCListener>(platform_.listener)) {
  QVPlatform::install(&platform_);
}

QVFakePlatform::~QVFakePlatform() {
  // What connections, callbacks and items capture may log, enqueue and send on its way out.
  listener_->abandonConnections();
  orientation_->abandonRegistrations();
  runLoopThreads_->discard();
  queues_->discard();
  QVPlatform::install(nullptr);
}
