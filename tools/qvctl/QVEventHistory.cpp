#include "tools/qvctl/QVEventHistory.h"

#include <algorithm>
#include <array>
#include <iterator>
#include <ranges>
#include <tuple>
#include <utility>
#include <vector>

namespace {

using Kind = QVStoredEvent::Kind;

constexpr std::array<Kind, QVStoredEvent::kKinds> kAllKinds{
    Kind::start, Kind::message, Kind::analytics, Kind::energy, Kind::stop, Kind::loss};

bool isEarlier(const QVStoredEvent& one, const QVStoredEvent& other) {
  return std::tie(one.time, one.kind, one.id) < std::tie(other.time, other.kind, other.id);
}

}  // namespace

QVEventHistory::Source QVEventHistory::sourceOf(Kind kind) {
  Source source{.kind = kind};
  if (!reader_.filter().wants(kind)) return source;
  if (kind == Kind::stop) {
    source.stops = reader_.stops([this](double part) { progress_.show(part); });
    source.last = static_cast<int64_t>(source.stops.size());
    return source;
  }
  const QVEventRowReader::Range range = reader_.range(kind);
  source.first = source.after = range.first - 1;
  source.last = range.last;
  return source;
}

QVEventRowReader::Events QVEventHistory::read(const Source& source, int64_t after,
                                              int64_t last) const {
  QVEventRowReader::Events events;
  if (source.kind != Kind::stop) {
    reader_.read(source.kind, after, last, events);
    return events;
  }
  std::vector<int64_t> rows;
  for (int64_t i = after; i < last; ++i) {
    rows.push_back(source.stops[static_cast<std::size_t>(i)].second);
  }
  reader_.readStops(rows, events);
  return events;
}

void QVEventHistory::refill(Source& source) const {
  while (source.waiting.empty() && source.after < source.last) {
    const int64_t next = std::min(source.last, source.after + QVEventRowReader::kRowsAtATime);
    std::ranges::move(read(source, source.after, next), std::back_inserter(source.waiting));
    source.after = next;
  }
}

double QVEventHistory::partOf(const Source& source) {
  if (source.last <= source.first) return 1;
  return static_cast<double>(source.after - source.first) /
         static_cast<double>(source.last - source.first);
}

void QVEventHistory::readAll(const Receiver& receiver) {
  std::vector<Source> sources;
  for (const Kind kind : kAllKinds) sources.push_back(sourceOf(kind));
  while (true) {
    Source* earliest = nullptr;
    double part = 1;
    for (Source& source : sources) {
      if (source.waiting.empty()) refill(source);
      part = std::min(part, partOf(source));
      if (source.waiting.empty()) continue;
      const bool isFirst =
          earliest == nullptr || isEarlier(source.waiting.front(), earliest->waiting.front());
      if (isFirst) earliest = &source;
    }
    progress_.show(part);
    if (earliest == nullptr) break;
    progress_.makeRoom();
    receiver(earliest->waiting.front());
    earliest->waiting.pop_front();
  }
  progress_.clear();
}

std::vector<QVStoredEvent> QVEventHistory::lastOf(Kind kind, std::size_t count) {
  const Source source = sourceOf(kind);
  std::vector<QVStoredEvent> found;
  for (int64_t end = source.last; end > source.after && found.size() < count;) {
    const int64_t begin = std::max(source.after, end - QVEventRowReader::kRowsAtATime);
    QVEventRowReader::Events part = read(source, begin, end);
    std::ranges::move(std::views::reverse(part), std::back_inserter(found));
    progress_.show(static_cast<double>(source.last - begin) /
                   static_cast<double>(source.last - source.after));
    end = begin;
  }
  found.resize(std::min(found.size(), count));
  return found;
}

void QVEventHistory::readLast(std::size_t count, const Receiver& receiver) {
  std::vector<QVStoredEvent> found;
  for (const Kind kind : kAllKinds)
    std::ranges::move(lastOf(kind, count), std::back_inserter(found));
  progress_.clear();
  std::ranges::sort(found, isEarlier);
  const std::size_t tooMany = found.size() - std::min(found.size(), count);
  std::for_each(std::next(found.begin(), static_cast<std::ptrdiff_t>(tooMany)), found.end(),
                receiver);
}
