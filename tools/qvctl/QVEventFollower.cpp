#include "tools/qvctl/QVEventFollower.h"

#include <algorithm>
#include <vector>

#include <sys/stat.h>

namespace {

using Kind = QVStoredEvent::Kind;

constexpr std::array<Kind, 5> kKindsWithRows{Kind::start, Kind::message, Kind::analytics,
                                             Kind::energy, Kind::loss};

}  // namespace

void QVEventFollower::skip() {
  noticeOtherStore();
  // Sessions that are started meanwhile lie above the mark, and are looked at then.
  for (const Kind kind : kKindsWithRows) {
    marks_[static_cast<std::size_t>(kind)] = markAt(kind, reader_.range(kind));
  }
  marks_[static_cast<std::size_t>(Kind::stop)] = marks_[static_cast<std::size_t>(Kind::start)];
  for (const int64_t row : reader_.running(kMaximumOpen)) open_.insert(row);
}

void QVEventFollower::noticeOtherStore() {
  struct stat file {};
  if (::stat(reader_.path().c_str(), &file) != 0 || file.st_ino == inode_) return;
  if (inode_ != 0) {
    marks_.fill({});
    open_.clear();
  }
  inode_ = file.st_ino;
}

QVEventFollower::Mark QVEventFollower::markAt(Kind kind,
                                              const QVEventRowReader::Range& range) const {
  // The time of a stop may yet change, that of its start does not.
  const auto time = reader_.timeOf(kind == Kind::stop ? Kind::start : kind, range.last);
  if (!time && range.last == 0) return {};
  return {range.last, time};
}

bool QVEventFollower::goesOn(Kind kind, const QVEventRowReader::Range& range) const {
  const Mark& mark = marks_[static_cast<std::size_t>(kind)];
  if (range.last < *mark.row) return false;
  // The oldest rows go first, and of sessions some: that it is gone says nothing.
  const auto time = reader_.timeOf(kind == Kind::stop ? Kind::start : kind, *mark.row);
  return !time || !mark.time || *time == *mark.time;
}

QVEventRowReader::Span QVEventFollower::advance(Kind kind) {
  Mark& mark = marks_[static_cast<std::size_t>(kind)];
  const QVEventRowReader::Range range = reader_.range(kind);
  QVEventRowReader::Span span = QVEventRowReader::spanOf(range);
  if (mark.row) {
    if (goesOn(kind, range)) {
      if (span.after > *mark.row) mayHaveMissed_ = true;
      span.after = *mark.row;
    } else {
      mayHaveMissed_ = true;
      if (kind == Kind::stop) open_.clear();
    }
  }
  mark = markAt(kind, range);
  return span;
}

void QVEventFollower::take(const QVEventRowReader::Sessions& sessions,
                           QVEventHistory::Stops& stops) {
  for (const auto& session : sessions) {
    if (session.stopped) {
      stops.emplace_back(*session.stopped, session.row);
      open_.erase(session.row);
    } else {
      open_.insert(session.row);
    }
  }
  while (open_.size() > kMaximumOpen) open_.erase(open_.begin());
}

QVEventHistory::Stops QVEventFollower::newStops() {
  QVEventHistory::Stops stops;
  QVEventRowReader::Span rows = advance(Kind::stop);
  take(reader_.sessions(std::vector<int64_t>(open_.begin(), open_.end())), stops);
  // Those that were started and stopped meanwhile, too.
  while (!rows.isEmpty() && !enough_()) take(reader_.sessions(rows), stops);
  std::ranges::sort(stops);
  return stops;
}

void QVEventFollower::readNew(const QVEventHistory::Receiver& receiver) {
  noticeOtherStore();
  QVEventHistory::Part part;
  // Before the rows: what a session has sent is there when its stop is.
  if (reader_.filter().wants(Kind::stop)) part.stops = newStops();
  for (const Kind kind : kKindsWithRows) {
    if (reader_.filter().wants(kind)) part.rows[static_cast<std::size_t>(kind)] = advance(kind);
  }
  QVEventHistory(reader_, enough_).read(std::move(part), receiver);
}
