#include "tools/qvctl/QVEventFollower.h"

#include <algorithm>
#include <tuple>
#include <vector>

#include <sys/stat.h>

namespace {

using Kind = QVStoredEvent::Kind;

constexpr std::array<Kind, 5> kKindsWithRows{Kind::start, Kind::message, Kind::analytics,
                                             Kind::energy, Kind::loss};

}  // namespace

void QVEventFollower::skip() {
  noticeOtherStore();
  for (const Kind kind : kKindsWithRows) {
    after_[static_cast<std::size_t>(kind)] = reader_.range(kind).last;
  }
  addSessionRows(QVEventRowReader::Sessions::running);
  // Those above the running ones have stopped, and are left out, too.
  openAfter_ = after_[static_cast<std::size_t>(Kind::start)];
}

void QVEventFollower::noticeOtherStore() {
  struct stat file {};
  if (::stat(reader_.path().c_str(), &file) != 0 || file.st_ino == inode_) return;
  if (inode_ != 0) {
    after_.fill(0);
    open_.clear();
    openAfter_ = 0;
  }
  inode_ = file.st_ino;
}

void QVEventFollower::noticeEmptiedSessions() {
  if (reader_.range(Kind::start).last >= openAfter_) return;
  open_.clear();
  openAfter_ = 0;
}

void QVEventFollower::addSessionRows(QVEventRowReader::Sessions which) {
  for (const int64_t row : reader_.sessionRows(which, openAfter_, kMaximumOpen)) {
    open_.insert(row);
    openAfter_ = std::max(openAfter_, row);
  }
  while (open_.size() > kMaximumOpen) open_.erase(open_.begin());
}

void QVEventFollower::addStops(QVEventRowReader::Events& events) {
  const std::size_t before = events.size();
  // Of those that are not wanted, too, for they need not be asked for again.
  QVEventRowReader(reader_.path(), QVEventFilter())
      .readStops(std::vector<int64_t>(open_.begin(), open_.end()), events);
  for (std::size_t i = before; i < events.size(); ++i) open_.erase(events[i].id);
  std::erase_if(events, [this](const QVStoredEvent& event) {
    return event.kind == Kind::stop && !reader_.filter().wants(event);
  });
}

void QVEventFollower::readNew(const Receiver& receiver) {
  noticeOtherStore();
  QVEventRowReader::Events events;
  for (const Kind kind : kKindsWithRows) {
    if (!reader_.filter().wants(kind)) continue;
    int64_t& after = after_[static_cast<std::size_t>(kind)];
    const int64_t last = reader_.range(kind).last;
    if (last < after) after = 0;
    while (after < last) {
      reader_.read(kind, after, last, events);
      after = std::min(last, after + QVEventRowReader::kRowsAtATime);
    }
  }
  if (reader_.filter().wants(Kind::stop)) {
    noticeEmptiedSessions();
    // Those that were started and stopped meanwhile, too.
    addSessionRows(QVEventRowReader::Sessions::all);
    addStops(events);
  }
  std::ranges::sort(events, [](const QVStoredEvent& one, const QVStoredEvent& other) {
    return std::tie(one.time, one.kind, one.id) < std::tie(other.time, other.kind, other.id);
  });
  std::ranges::for_each(events, receiver);
}
