#pragma once

#include "platform/QVFunction.h"
#include "platform/QVLog.h"
#include "platform/linux/QVBell.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

// Tells when named files of a directory change. One inotify descriptor and one thread serve all
// directories; the thread begins with the first watch and sleeps without a time limit while nothing
// changes.
//
// A directory that is missing is made (its parent has to be there) with kDirectoryMode. When it is
// deleted or moved away it is made anew, with one log line, and all of its watches are told once.
// Where that fails, which is another line, it is tried again after the first pause, which doubles
// up to kLongestRetry, and once it is there they are told again. When the kernel's queue overflows,
// all watches are told. So no change goes unheard, but one may be told of that was none, and
// changes in quick succession may be told of once.
//
// Used by QVInotifyNotifications and QVFileOrientation. Threads: any, at once; callbacks run on the
// watcher's own thread, one at a time, without a lock. It is not destroyed by a callback.
// Ownership: a callback is destroyed without a lock, after it has run if it runs.
// Failures: an exception of a callback is one error line, and the others are called; after the
// first pause, all watches are told again. So they are where there was no memory to say what
// changed.
class QVDirectoryWatcher {
 public:
  // The service's user and group post. Everybody may wait for posts, as clients do that go by the
  // reporting switch; all that they see is names. A directory that is there keeps its mode.
  static constexpr unsigned kDirectoryMode = 0775;

  enum class Kind {
    posts,     // the file is made, touched, written to or replaced
    contents,  // it is made, has been written, is replaced or taken away
  };
  struct File {
    std::string directory;  // always called by the same path
    std::string name;
    Kind kind;
  };
  using Callback = QVFunction<void()>;
  using Token = uint64_t;
  static constexpr Token kNoToken = 0;

  static constexpr std::chrono::minutes kLongestRetry{1};

  explicit QVDirectoryWatcher(QVLog& log,
                              std::chrono::milliseconds firstRetry = std::chrono::seconds(1));
  ~QVDirectoryWatcher();
  QVDirectoryWatcher(const QVDirectoryWatcher&) = delete;
  QVDirectoryWatcher& operator=(const QVDirectoryWatcher&) = delete;

  // Calls back after every change of the file from now on. Where the directory cannot be watched
  // the answer is kNoToken and `reason` says why, the path included.
  [[nodiscard]] Token watch(File file, Callback callback, std::string& reason);
  // Begins no further call of the watch's callback; one that runs ends on its own.
  void unwatch(Token token);

 private:
  struct Watch;
  struct News;
  struct Directory {
    int descriptor = -1;      // of its inotify watch; -1 while it cannot be followed
    bool isRegained = false;  // by a new watch: the others have still to be told
    std::vector<std::shared_ptr<Watch>> watches;
  };

  bool start(std::string& reason) QV_REQUIRES(mutex_);
  int follow(const std::string& directory, std::string& reason) const QV_REQUIRES(mutex_);
  void run();
  bool tell(const News& news);
  News readNews(bool isBehind);
  void take(int descriptor, uint32_t events, std::string_view name, News& news) QV_REQUIRES(mutex_);
  void addAll(News& news) const QV_REQUIRES(mutex_);
  void followAnew(const std::string& path, Directory& directory, News& news) QV_REQUIRES(mutex_);
  void regain(News& news) QV_REQUIRES(mutex_);

  QVLog& log_;
  const std::chrono::milliseconds firstRetry_;
  const QVBell bell_;  // rung at the end, and when a watch has regained a directory
  std::atomic<bool> isEnding_{false};
  int inotify_ = -1;  // opened before the thread begins

  QVMutex mutex_;
  std::map<std::string, Directory> directories_ QV_GUARDED_BY(mutex_);  // by path
  Token lastToken_ QV_GUARDED_BY(mutex_) = kNoToken;
  std::thread thread_ QV_GUARDED_BY(mutex_);
};
