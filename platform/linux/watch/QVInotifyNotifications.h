#pragma once

#include "platform/QVLog.h"
#include "platform/QVNotifications.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/watch/QVDirectoryWatcher.h"

#include <map>
#include <memory>
#include <string>

// Named notifications as files: a post of NAME is whatever makes, touches, writes to or replaces
// DIRECTORY/NAME. The directory is made when a name is first registered. Whoever may do that to the
// file may post.
//
// Posts are folded while a delivery is enqueued and has not begun; a post after that enqueues
// another. Where the kernel cannot say what was posted (its queue overflowed, the directory was
// away), everything was.
//
// Threads: as QVNotifications; posts arrive on the watcher's thread. Nothing is enqueued once the
// object is destroyed; deliveries that are enqueued may outlive it. Log and watcher outlive it.
// Failures: a name that can name no file is kStatusInvalidName, a directory that cannot be made or
// watched kStatusFailed; one error line says which and why. A delivery that cannot be enqueued is
// an error line of the watcher, and is tried again as it says.
class QVInotifyNotifications final : public QVNotifications {
 public:
  QVInotifyNotifications(QVLog& log, std::shared_ptr<QVDirectoryWatcher> watcher,
                         std::string directory);
  ~QVInotifyNotifications() override;
  QVInotifyNotifications(const QVInotifyNotifications&) = delete;
  QVInotifyNotifications& operator=(const QVInotifyNotifications&) = delete;

  [[nodiscard]] uint32_t registerDispatch(std::string_view name, int32_t& token,
                                          const std::shared_ptr<QVWorkQueue>& queue,
                                          Handler handler) override;
  void cancel(int32_t token) override;

 private:
  struct Registration;

  std::shared_ptr<Registration> add(const std::shared_ptr<QVWorkQueue>& queue, Handler handler);
  std::shared_ptr<Registration> take(int32_t token);
  void end(Registration& registration);

  QVLog& log_;
  const std::shared_ptr<QVDirectoryWatcher> watcher_;
  const std::string directory_;

  QVMutex mutex_;
  int32_t lastToken_ QV_GUARDED_BY(mutex_) = 0;
  // By token.
  std::map<int32_t, std::shared_ptr<Registration>> registrations_ QV_GUARDED_BY(mutex_);
};
