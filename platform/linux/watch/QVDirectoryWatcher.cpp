#include "platform/linux/watch/QVDirectoryWatcher.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/QVThreads.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstring>
#include <system_error>
#include <utility>

#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Nothing that is told here is urgent.
constexpr int kNiceness = 5;

constexpr const char* kThreadName = "qv-watch";

// Events read at a time: some hundred with short names, one at least with the longest.
constexpr std::size_t kEventBytes = 4096;
static_assert(kEventBytes >= sizeof(inotify_event) + NAME_MAX + 1);

// A post is whatever leaves a trace at the file. It may be heard of several times.
constexpr uint32_t kPosts = IN_CREATE | IN_ATTRIB | IN_MODIFY | IN_CLOSE_WRITE | IN_MOVED_TO;
// Who reads the contents does not want them half written.
constexpr uint32_t kContents = IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE;
// The directory itself is not where it was any more.
constexpr uint32_t kGone = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

}  // namespace

struct QVDirectoryWatcher::Watch {
  const Token token;
  const std::string name;
  const uint32_t events;
  Callback callback;  // the thread's
  std::atomic<bool> isOver{false};

  Watch(Token itsToken, std::string itsName, uint32_t itsEvents, Callback itsCallback)
      : token(itsToken),
        name(std::move(itsName)),
        events(itsEvents),
        callback(std::move(itsCallback)) {}
};

// What one reading of the descriptor brought.
struct QVDirectoryWatcher::News {
  std::vector<std::shared_ptr<Watch>> changed;
  std::vector<std::pair<QVLogLevel, std::string>> lines;
  bool lacksDirectories = false;

  void add(const std::shared_ptr<Watch>& watch) {
    if (std::ranges::find(changed, watch) == changed.end()) changed.push_back(watch);
  }
  void add(const Directory& directory) {
    for (const auto& watch : directory.watches) add(watch);
  }
  void addReturn(const std::string& path) {
    lines.emplace_back(QVLogLevel::standard,
                       QVText(path, " was deleted or moved away: it is there again"));
  }
};

QVDirectoryWatcher::QVDirectoryWatcher(QVLog& log, std::chrono::milliseconds firstRetry)
    : log_(log), firstRetry_(firstRetry) {}

QVDirectoryWatcher::~QVDirectoryWatcher() {
  std::thread thread;
  {
    const QVMutexLock lock(mutex_);
    thread.swap(thread_);
  }
  if (thread.joinable()) {
    isEnding_ = true;
    bell_.ring();
    thread.join();
  }
  if (inotify_ >= 0) close(inotify_);
}

QVDirectoryWatcher::Token QVDirectoryWatcher::watch(File file, Callback callback,
                                                    std::string& reason) {
  const QVMutexLock lock(mutex_);
  if (!start(reason)) return kNoToken;
  Directory& directory = directories_[file.directory];
  if (directory.descriptor < 0) {
    directory.descriptor = follow(file.directory, reason);
    if (directory.descriptor < 0) {
      if (directory.watches.empty()) directories_.erase(file.directory);
      return kNoToken;
    }
    directory.isRegained = !directory.watches.empty();
    if (directory.isRegained) bell_.ring();
  }
  directory.watches.push_back(std::make_shared<Watch>(++lastToken_, std::move(file.name),
                                                      file.kind == Kind::posts ? kPosts : kContents,
                                                      std::move(callback)));
  return lastToken_;
}

void QVDirectoryWatcher::unwatch(Token token) {
  std::shared_ptr<Watch> over;  // goes after the lock, with its callback
  const QVMutexLock lock(mutex_);
  for (auto entry = directories_.begin(); entry != directories_.end(); ++entry) {
    auto& watches = entry->second.watches;
    const auto found =
        std::ranges::find(watches, token, [](const auto& watch) { return watch->token; });
    if (found == watches.end()) continue;
    over = std::move(*found);
    over->isOver = true;
    watches.erase(found);
    if (watches.empty()) {
      inotify_rm_watch(inotify_, entry->second.descriptor);
      directories_.erase(entry);
    }
    return;
  }
}

bool QVDirectoryWatcher::start(std::string& reason) {
  if (thread_.joinable()) return true;
  if (inotify_ < 0) inotify_ = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (inotify_ < 0) {
    reason = "inotify: " + std::generic_category().message(errno);
    return false;
  }
  try {
    thread_ = std::thread([this] { run(); });
  } catch (const std::system_error& failure) {
    reason = failure.what();
    return false;
  }
  return true;
}

int QVDirectoryWatcher::follow(const std::string& directory, std::string& reason) const {
  const int made = mkdir(directory.c_str(), kDirectoryMode) == 0 ? 0 : errno;
  // The process's umask may have taken away what others need.
  if (made == 0) chmod(directory.c_str(), kDirectoryMode);
  const int descriptor =
      inotify_add_watch(inotify_, directory.c_str(), kPosts | kContents | kGone | IN_ONLYDIR);
  if (descriptor >= 0) return descriptor;
  const int error = made == 0 || made == EEXIST ? errno : made;
  reason = directory + ": " + std::generic_category().message(error);
  return -1;
}

void QVDirectoryWatcher::run() {
  QVPrepareThread(kThreadName, kNiceness);
  bool isBehind = false;
  bool lacksDirectories = false;
  std::chrono::milliseconds pause = firstRetry_;
  for (;;) {
    std::array<pollfd, 2> waits{{{bell_.descriptor(), POLLIN, 0}, {inotify_, POLLIN, 0}}};
    if (!lacksDirectories) pause = firstRetry_;
    const auto limit = isBehind ? firstRetry_ : pause;
    const int count = poll(waits.data(), waits.size(),
                           isBehind || lacksDirectories ? static_cast<int>(limit.count()) : -1);
    if (count == 0) pause = std::min<std::chrono::milliseconds>(2 * pause, kLongestRetry);
    bell_.hush();
    if (isEnding_) return;
    try {
      const News news = readNews(isBehind);
      lacksDirectories = news.lacksDirectories;
      isBehind = !tell(news);
    } catch (...) {
      // For want of memory: what was read is lost, so all are told of once there is some.
      QVLogException(log_, "-[QVDirectoryWatcher run]", "thread", kThreadName);
      isBehind = true;
    }
  }
}

// Have all callbacks heard of it?
bool QVDirectoryWatcher::tell(const News& news) {
  for (const auto& [level, text] : news.lines) {
    log_.write(nullptr, level, "-[QVDirectoryWatcher followAnew:]", text);
  }
  bool isTold = true;
  for (const auto& watch : news.changed) {
    if (watch->isOver) continue;
    try {
      watch->callback();
    } catch (...) {
      QVLogException(log_, "-[QVDirectoryWatcher tell:]", "the callback for", watch->name);
      isTold = false;
    }
  }
  return isTold;
}

QVDirectoryWatcher::News QVDirectoryWatcher::readNews(bool isBehind) {
  std::array<char, kEventBytes> buffer;
  const ssize_t length = read(inotify_, buffer.data(), buffer.size());
  News news;
  const QVMutexLock lock(mutex_);
  if (isBehind) addAll(news);
  regain(news);
  for (ssize_t offset = 0; offset < length;) {
    inotify_event event;
    const char* const begin = buffer.data() + offset;
    std::memcpy(&event, begin, sizeof event);
    const char* const name = begin + sizeof event;
    take(event.wd, event.mask, {name, strnlen(name, event.len)}, news);
    offset += static_cast<ssize_t>(sizeof event + event.len);
  }
  news.lacksDirectories = std::ranges::any_of(
      directories_, [](const auto& entry) { return entry.second.descriptor < 0; });
  return news;
}

void QVDirectoryWatcher::take(int descriptor, uint32_t events, std::string_view name, News& news) {
  if ((events & IN_Q_OVERFLOW) != 0) {
    addAll(news);
    return;
  }
  const auto found = std::ranges::find(directories_, descriptor,
                                       [](const auto& entry) { return entry.second.descriptor; });
  // Of a directory that was followed before.
  if (found == directories_.end()) return;
  if ((events & kGone) != 0) {
    followAnew(found->first, found->second, news);
    return;
  }
  if ((events & IN_ISDIR) != 0) return;
  for (const auto& watch : found->second.watches) {
    if (watch->name == name && (watch->events & events) != 0) news.add(watch);
  }
}

void QVDirectoryWatcher::addAll(News& news) const {
  for (const auto& [path, directory] : directories_) news.add(directory);
}

void QVDirectoryWatcher::followAnew(const std::string& path, Directory& directory, News& news) {
  // Refused where the directory is gone, which is as good.
  inotify_rm_watch(inotify_, directory.descriptor);
  directory.descriptor = -1;
  std::string reason;
  directory.descriptor = follow(path, reason);
  if (directory.descriptor >= 0) {
    news.addReturn(path);
  } else {
    news.lines.emplace_back(QVLogLevel::error,
                            QVText("cannot watch a directory any more: ", reason));
  }
  news.add(directory);
}

// Follows the directories that could not be followed before, where they can be by now.
void QVDirectoryWatcher::regain(News& news) {
  for (auto& [path, directory] : directories_) {
    std::string reason;
    if (directory.descriptor < 0) {
      directory.descriptor = follow(path, reason);
      directory.isRegained = directory.descriptor >= 0;
    }
    if (!directory.isRegained) continue;
    news.addReturn(path);
    news.add(directory);
    directory.isRegained = false;
  }
}
