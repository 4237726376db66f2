#include "tools/qvctl/QVEventHistory.h"

#include <algorithm>
#include <array>
#include <iterator>
#include <tuple>
#include <utility>
#include <vector>

namespace {

using Kind = QVStoredEvent::Kind;

constexpr std::array<Kind, QVStoredEvent::kKinds> kAllKinds{
    Kind::start, Kind::message, Kind::analytics, Kind::energy, Kind::stop, Kind::loss};

// Two numbers may be further apart than one can say.
double distance(int64_t from, int64_t to) {
  return static_cast<double>(to) - static_cast<double>(from);
}

bool isEarlier(const QVStoredEvent& one, const QVStoredEvent& other) {
  return std::tie(one.time, one.kind, one.id) < std::tie(other.time, other.kind, other.id);
}

}  // namespace

QVEventHistory::Stops QVEventHistory::allStops() {
  Stops stops;
  const auto whole = QVEventRowReader::spanOf(reader_.range(Kind::stop));
  auto rest = whole;
  while (!rest.isEmpty() && !enough_()) {
    for (const auto& session : reader_.sessions(rest)) {
      if (session.stopped) stops.emplace_back(*session.stopped, session.row);
    }
    progress_.show(distance(whole.after, rest.after) / distance(whole.after, whole.last));
  }
  std::ranges::sort(stops);
  return stops;
}

QVEventHistory::Part QVEventHistory::all() {
  Part part;
  for (const Kind kind : kAllKinds) {
    if (!reader_.filter().wants(kind)) continue;
    if (kind == Kind::stop) {
      part.stops = allStops();
    } else {
      part.rows[static_cast<std::size_t>(kind)] = QVEventRowReader::spanOf(reader_.range(kind));
    }
  }
  return part;
}

void QVEventHistory::refill(Source& source, const Stops& stops) const {
  while (source.waiting.empty() && !source.rows.isEmpty() && !enough_()) {
    QVEventRowReader::Events events;
    if (source.kind == Kind::stop) {
      std::vector<int64_t> rows;
      while (!source.rows.isEmpty() && std::ssize(rows) < QVEventRowReader::kRowsAtATime) {
        rows.push_back(stops[static_cast<std::size_t>(source.rows.after++)].second);
      }
      reader_.readStops(rows, events);
    } else {
      reader_.read(source.kind, source.rows, events);
    }
    std::ranges::move(events, std::back_inserter(source.waiting));
  }
}

double QVEventHistory::partOf(const Source& source) {
  if (source.rows.isEmpty()) return 1;
  return distance(source.first, source.rows.after) / distance(source.first, source.rows.last);
}

void QVEventHistory::read(Part part, const Receiver& receiver) {
  std::vector<Source> sources;
  part.rows[static_cast<std::size_t>(Kind::stop)] = {0, std::ssize(part.stops)};
  for (const Kind kind : kAllKinds) {
    const auto& rows = part.rows[static_cast<std::size_t>(kind)];
    sources.push_back({.kind = kind, .rows = rows, .first = rows.after});
  }
  while (!enough_()) {
    Source* earliest = nullptr;
    double done = 1;
    for (Source& source : sources) {
      if (source.waiting.empty()) refill(source, part.stops);
      done = std::min(done, partOf(source));
      if (source.waiting.empty()) continue;
      const bool isFirst =
          earliest == nullptr || isEarlier(source.waiting.front(), earliest->waiting.front());
      if (isFirst) earliest = &source;
    }
    progress_.show(done);
    if (earliest == nullptr || enough_()) break;
    progress_.makeRoom();
    receiver(earliest->waiting.front());
    earliest->waiting.pop_front();
  }
  progress_.clear();
}

void QVEventHistory::readAll(const Receiver& receiver) {
  read(all(), receiver);
}

QVEventRowReader::Events QVEventHistory::lastOf(Kind kind, const Part& part,
                                                std::size_t count) const {
  QVEventRowReader::Events found;
  if (kind != Kind::stop) {
    auto rest = part.rows[static_cast<std::size_t>(kind)];
    while (!rest.isEmpty() && found.size() < count) reader_.readBackwards(kind, rest, found);
  } else {
    for (auto stop = part.stops.rbegin(); stop != part.stops.rend() && found.size() < count;) {
      std::vector<int64_t> rows;
      for (; stop != part.stops.rend() && std::ssize(rows) < QVEventRowReader::kRowsAtATime;
           ++stop) {
        rows.push_back(stop->second);
      }
      reader_.readStops(rows, found);
    }
  }
  found.resize(std::min(found.size(), count));
  return found;
}

void QVEventHistory::readLast(std::size_t count, const Receiver& receiver) {
  QVEventRowReader::Events found;
  const Part part = all();
  for (const Kind kind : kAllKinds) {
    std::ranges::move(lastOf(kind, part, count), std::back_inserter(found));
    progress_.show(static_cast<double>(kind) / static_cast<double>(kAllKinds.size()));
  }
  progress_.clear();
  std::ranges::sort(found, isEarlier);
  const std::size_t tooMany = found.size() - std::min(found.size(), count);
  std::for_each(std::next(found.begin(), static_cast<std::ptrdiff_t>(tooMany)), found.end(),
                receiver);
}
