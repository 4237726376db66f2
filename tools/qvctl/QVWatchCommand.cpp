#include "tools/qvctl/QVWatchCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVEnding.h"
#include "tools/qvctl/QVEventFollower.h"
#include "tools/qvctl/QVEventPrinter.h"
#include "tools/qvctl/QVStoreWatch.h"
#include "tools/qvctl/QVTimeText.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <optional>

#include <poll.h>

namespace {

using Clock = std::chrono::steady_clock;

// A commit first changes the file, of which the kernel tells, and a moment later becomes visible,
// of which nobody does. So after a change the store is looked at twice more, then no more until
// the next one.
constexpr std::array<std::chrono::milliseconds, 2> kSecondLooks{std::chrono::milliseconds(50),
                                                                std::chrono::milliseconds(500)};

// Nothing where none was asked for.
std::optional<std::chrono::microseconds> durationOf(const std::string& text) {
  if (text.empty()) return std::nullopt;
  const auto duration = QVParseDuration(text);
  if (!duration)
    throw QVToolFailure(QVToolStatus::wrongUsage, QVText("\"", text, "\" is no duration"));
  return duration;
}

class Watcher {
 public:
  Watcher(const QVToolContext& context, const QVWatchCommand::Options& options)
      : duration_(durationOf(options.duration)),
        // No time at all is one look, however long that takes.
        ending_(isOneLook() ? std::nullopt : duration_),
        output_(context.output),
        reader_(context.places.directories.store(), QVEventFilter(options.filter, QVTimeNow())),
        changes_(reader_.path()),
        follower_(reader_, [this] { return isEnough(); }),
        printer_(context.output, options.full),
        left_(options.count) {}

  void run() {
    // What was asked for from an earlier time on is told first.
    if (!reader_.filter().since()) follower_.skip();
    printer_.showTitles();
    output_.flush();
    do {
      look();
    } while (!isOneLook() && !isEnough() && wait());
  }

 private:
  void look() {
    changes_.drain();
    follower_.readNew([this](const QVStoredEvent& event) {
      printer_.show(event);
      if (left_) --*left_;
    });
    output_.flush();
    if (follower_.mayHaveMissed()) {
      QVToolOutput::note("events may have been missed: the store was emptied meanwhile");
    }
  }

  bool isOneLook() const { return duration_ && duration_->count() == 0; }
  bool isEnough() const { return left_ == 0U || QVEnding::isAsked(); }

  // Milliseconds until the next look that is due; -1 for none.
  int timeLimit() const {
    if (looks_ == kSecondLooks.size()) return -1;
    const auto rest = std::chrono::ceil<std::chrono::milliseconds>(changed_ + kSecondLooks[looks_] -
                                                                   Clock::now());
    return static_cast<int>(std::max<int64_t>(rest.count(), 0));
  }

  // Waits for the next time to look; false where that is the end.
  bool wait() {
    while (!QVEnding::isAsked()) {
      // Of the output, errors are always told: the reader of a pipe has gone away.
      std::array<pollfd, 2> entries{
          {{changes_.descriptor(), POLLIN, 0}, {output_.descriptor(), 0, 0}}};
      const int ready = ending_.poll(entries, timeLimit());
      if (ready < 0 && errno != EINTR) throw QVToolFailure::ofSystem("waiting", errno);
      if (ready > 0 && (entries[1].revents & POLLERR) != 0) return false;
      if (ready > 0 && entries[0].revents != 0) {
        changed_ = Clock::now();
        looks_ = 0;
        return true;
      }
      if (looks_ < kSecondLooks.size() && Clock::now() >= changed_ + kSecondLooks[looks_]) {
        ++looks_;
        return true;
      }
    }
    return false;
  }

  const std::optional<std::chrono::microseconds> duration_;
  // Before all else that is done, so that an interruption is never lost.
  const QVEnding ending_;
  QVToolOutput& output_;
  const QVEventRowReader reader_;
  const QVStoreWatch changes_;
  QVEventFollower follower_;
  QVEventPrinter printer_;
  std::optional<std::size_t> left_;
  Clock::time_point changed_ = Clock::now();
  std::size_t looks_ = kSecondLooks.size();  // second looks that were taken since the last change
};

}  // namespace

QVToolStatus QVWatchCommand::run(const QVToolContext& context, const Options& options) {
  Watcher(context, options).run();
  return QVToolStatus::done;
}
