#include "platform/linux/watch/QVInotifyNotifications.h"

#include <climits>
#include <cstdint>
#include <utility>

namespace {

constexpr const char* kFunction = "-[QVInotifyNotifications registerDispatch:token:queue:handler:]";

bool canNameAFile(std::string_view name) {
  return !name.empty() && name.size() <= NAME_MAX && name != "." && name != ".." &&
         name.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

}  // namespace

// Shared by the watch, the deliveries and the table.
struct QVInotifyNotifications::Registration {
  const int32_t token;
  Handler handler;  // the queue's

  QVMutex mutex;
  // Null once it is over: a delivery that is enqueued then must not keep its own queue.
  std::shared_ptr<QVWorkQueue> queue QV_GUARDED_BY(mutex);
  QVDirectoryWatcher::Token watch QV_GUARDED_BY(mutex) = QVDirectoryWatcher::kNoToken;
  bool isEnqueued QV_GUARDED_BY(mutex) = false;

  Registration(int32_t itsToken, std::shared_ptr<QVWorkQueue> itsQueue, Handler itsHandler)
      : token(itsToken), handler(std::move(itsHandler)), queue(std::move(itsQueue)) {}

  // Enqueues with the lock held, so that nothing is enqueued once the end has been noted. Nothing
  // runs there, nor does the item hold the last reference.
  static void post(const std::shared_ptr<Registration>& self) {
    const QVMutexLock lock(self->mutex);
    if (!self->queue || std::exchange(self->isEnqueued, true)) return;
    try {
      self->queue->async([self] { self->deliver(); });
    } catch (...) {
      // The watcher tells of the post again.
      self->isEnqueued = false;
      throw;
    }
  }

  void deliver() {
    {
      const QVMutexLock lock(mutex);
      isEnqueued = false;
    }
    handler(token);
  }
};

QVInotifyNotifications::QVInotifyNotifications(QVLog& log,
                                               std::shared_ptr<QVDirectoryWatcher> watcher,
                                               std::string directory)
    : log_(log), watcher_(std::move(watcher)), directory_(std::move(directory)) {}

QVInotifyNotifications::~QVInotifyNotifications() {
  std::map<int32_t, std::shared_ptr<Registration>> registrations;
  {
    const QVMutexLock lock(mutex_);
    registrations.swap(registrations_);
  }
  for (const auto& [token, registration] : registrations) end(*registration);
}

uint32_t QVInotifyNotifications::registerDispatch(std::string_view name, int32_t& token,
                                                  const std::shared_ptr<QVWorkQueue>& queue,
                                                  Handler handler) {
  if (!canNameAFile(name)) {
    log_.error(nullptr, kFunction, "no file can be called \"", name, "\"");
    return kStatusInvalidName;
  }
  const auto registration = add(queue, std::move(handler));
  std::string reason;
  {
    // A post that comes at once waits until the token is written.
    const QVMutexLock lock(registration->mutex);
    registration->watch = watcher_->watch(
        {directory_, std::string(name), QVDirectoryWatcher::Kind::posts},
        [registration] { Registration::post(registration); }, reason);
    if (registration->watch != QVDirectoryWatcher::kNoToken) {
      token = registration->token;
      return kStatusOK;
    }
  }
  take(registration->token);
  log_.error(nullptr, kFunction, "cannot watch for notifications: ", reason);
  return kStatusFailed;
}

void QVInotifyNotifications::cancel(int32_t token) {
  if (const auto registration = take(token)) end(*registration);
}

std::shared_ptr<QVInotifyNotifications::Registration> QVInotifyNotifications::add(
    const std::shared_ptr<QVWorkQueue>& queue, Handler handler) {
  const QVMutexLock lock(mutex_);
  do {
    lastToken_ = lastToken_ == INT32_MAX ? 1 : lastToken_ + 1;
  } while (registrations_.contains(lastToken_));
  const auto registration = std::make_shared<Registration>(lastToken_, queue, std::move(handler));
  registrations_.emplace(lastToken_, registration);
  return registration;
}

// Takes a registration out of the table; null where there is none.
std::shared_ptr<QVInotifyNotifications::Registration> QVInotifyNotifications::take(int32_t token) {
  const QVMutexLock lock(mutex_);
  const auto found = registrations_.find(token);
  if (found == registrations_.end()) return nullptr;
  const auto registration = std::move(found->second);
  registrations_.erase(found);
  return registration;
}

void QVInotifyNotifications::end(Registration& registration) {
  QVDirectoryWatcher::Token watch = QVDirectoryWatcher::kNoToken;
  std::shared_ptr<QVWorkQueue> queue;  // may be the last handle: let go without the lock
  {
    const QVMutexLock lock(registration.mutex);
    queue.swap(registration.queue);
    watch = registration.watch;
  }
  watcher_->unwatch(watch);
}
