#include "tools/qvctl/QVEventRowReader.h"

#include "platform/QVBeacon.h"
#include "platform/QVText.h"
#include "platform/linux/files/QVJSONFile.h"

#include <algorithm>
#include <array>
#include <iterator>
#include <limits>
#include <memory>
#include <utility>

namespace {

using Kind = QVStoredEvent::Kind;

// Each kind's table and columns: the row's number, its time, then what is taken by take().
struct Table {
  const char* name;
  const char* columns;
};
constexpr std::array<Table, QVStoredEvent::kKinds> kTables{
    {{"beacon_session", "id, opened_at, session_id, user_info"},
     {"beacon_message", "id, sent_at, session_id, service_name, category, type, payload"},
     {"countwise_event", "id, sent_at, name, payload"},
     {"joulewell_event", "id, sent_at, name, payload"},
     {"beacon_session", "id, flushed_at, session_id, user_info"},
     {"loss", "id, at, cause, count"}}};

const Table& tableOf(Kind kind) {
  return kTables[static_cast<std::size_t>(kind)];
}

// What the service puts behind a service type's name where a session runs.
constexpr std::string_view kSessionSuffix = "_session";
// And before an analytics event's category.
constexpr std::string_view kEventPrefix = "net.quillon.quietvox.";

std::string serviceOf(std::string_view name) {
  if (name.ends_with(kSessionSuffix)) name.remove_suffix(kSessionSuffix.size());
  return std::string(name);
}

std::string serviceInUserInfo(std::string_view userInfo) {
  QVJSONFailure failure;
  const auto value = QVJSONFile::parse(userInfo, failure);
  if (!value || value->kind() != QVValue::Kind::dictionary) return {};
  const QVDictionary entries = value->dictionary();
  const QVValue* const name = entries.find(kBeaconUserInfoServiceName);
  return name == nullptr ? std::string() : serviceOf(QVText(*name));
}

// Category and type as they stand in an analytics event's name.
void takeNames(QVStoredEvent& event) {
  std::string_view rest = event.name;
  if (!rest.starts_with(kEventPrefix)) return;
  rest.remove_prefix(kEventPrefix.size());
  const std::size_t dot = rest.find('.');
  if (dot == std::string_view::npos) return;
  event.category = QVParseCategory(rest.substr(0, dot));
  event.type = QVParseMessageType(rest.substr(dot + 1));
}

QVEventRowReader::Session sessionIn(const QVStoreQuery& row) {
  QVEventRowReader::Session session;
  session.row = row.integer(0);
  if (!row.isNull(1)) session.stopped = row.integer(1);
  return session;
}

}  // namespace

QVEventRowReader::QVEventRowReader(std::filesystem::path store, QVEventFilter filter)
    : path_(std::move(store)), filter_(std::move(filter)) {}

QVEventRowReader::Range QVEventRowReader::range(Kind kind) const {
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return {};
  // Two queries: each is answered by one look at an end of the table.
  const std::string table = tableOf(kind).name;
  return {store->number("SELECT min(id) FROM " + table),
          store->number("SELECT max(id) FROM " + table)};
}

QVEventRowReader::Span QVEventRowReader::spanOf(const Range& range) {
  constexpr int64_t kLeast = std::numeric_limits<int64_t>::min();
  return {range.first > kLeast ? range.first - 1 : kLeast, range.last};
}

void QVEventRowReader::read(Kind kind, Span& span, Events& events) const {
  read(kind, Direction::forwards, span, events);
}

void QVEventRowReader::readBackwards(Kind kind, Span& span, Events& events) const {
  read(kind, Direction::backwards, span, events);
}

void QVEventRowReader::read(Kind kind, Direction direction, Span& span, Events& events) const {
  const auto store = QVReadOnlyStore::open(path_);
  const bool isForwards = direction == Direction::forwards;
  int64_t count = 0;
  if (store != nullptr) {
    QVStoreQuery rows(*store, QVText("SELECT ", tableOf(kind).columns, " FROM ", tableOf(kind).name,
                                     " WHERE id > ?1 AND id <= ?2 ORDER BY id ",
                                     isForwards ? "ASC" : "DESC", " LIMIT ?3"));
    rows.bind(1, span.after);
    rows.bind(2, span.last);
    rows.bind(3, kRowsAtATime);
    for (; rows.next(); ++count) {
      take(kind, rows, events);
      // Of the numbers none is below `after`, so none is the least there is.
      (isForwards ? span.after : span.last) = rows.integer(0) - (isForwards ? 0 : 1);
    }
  }
  if (count < kRowsAtATime) span.after = span.last;
}

std::optional<int64_t> QVEventRowReader::timeOf(Kind kind, int64_t row) const {
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return std::nullopt;
  QVStoreQuery rows(*store, QVText("SELECT ", tableOf(kind).columns, " FROM ", tableOf(kind).name,
                                   " WHERE id = ?1"));
  rows.bind(1, row);
  if (!rows.next()) return std::nullopt;
  return rows.integer(1);
}

void QVEventRowReader::take(Kind kind, const QVStoreQuery& row, Events& events) const {
  QVStoredEvent event;
  event.kind = kind;
  event.id = row.integer(0);
  event.time = row.integer(1);
  int payload = 3;
  switch (kind) {
    case Kind::start:
    case Kind::stop:
      event.session = row.integer(2);
      event.service = serviceInUserInfo(row.text(3));
      break;
    case Kind::message:
      event.session = row.integer(2);
      event.service = serviceOf(row.text(3));
      event.category = row.numberWithin<uint32_t>(4);
      event.type = row.numberWithin<uint16_t>(5);
      payload = 6;
      break;
    case Kind::analytics:
      event.name = row.text(2);
      takeNames(event);
      break;
    case Kind::energy:
      event.name = row.text(2);
      break;
    case Kind::loss:
      event.name = row.text(2);
      event.count = row.integer(3);
      break;
  }
  if (!filter_.wants(event)) return;
  // Only now: long ones lie elsewhere in the file.
  if (kind != Kind::stop && kind != Kind::loss) event.payload = row.text(payload);
  events.push_back(std::move(event));
}

QVEventRowReader::Sessions QVEventRowReader::sessions(Span& span) const {
  Sessions found;
  if (const auto store = QVReadOnlyStore::open(path_)) {
    QVStoreQuery rows(*store,
                      "SELECT id, flushed_at FROM beacon_session WHERE id > ?1 AND id <= ?2 "
                      "ORDER BY id LIMIT ?3");
    rows.bind(1, span.after);
    rows.bind(2, span.last);
    rows.bind(3, kRowsAtATime);
    while (rows.next()) found.push_back(sessionIn(rows));
  }
  span.after = std::ssize(found) < kRowsAtATime ? span.last : found.back().row;
  return found;
}

QVEventRowReader::Sessions QVEventRowReader::sessions(const std::vector<int64_t>& rows) const {
  Sessions found;
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return found;
  QVStoreQuery session(*store, "SELECT id, flushed_at FROM beacon_session WHERE id = ?1");
  for (const int64_t id : rows) {
    session.bind(1, id);
    if (session.next()) found.push_back(sessionIn(session));
    session.reset();
  }
  return found;
}

void QVEventRowReader::readStops(const std::vector<int64_t>& rows, Events& events) const {
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return;
  const Table& table = tableOf(Kind::stop);
  QVStoreQuery row(*store, QVText("SELECT ", table.columns, " FROM ", table.name,
                                  " WHERE id = ?1 AND flushed_at IS NOT NULL"));
  for (const int64_t id : rows) {
    row.bind(1, id);
    if (row.next()) take(Kind::stop, row, events);
    row.reset();
  }
}

std::vector<int64_t> QVEventRowReader::running(int64_t maximum) const {
  std::vector<int64_t> found;
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return found;
  QVStoreQuery rows(*store,
                    "SELECT id FROM beacon_session WHERE flushed_at IS NULL "
                    "ORDER BY id DESC LIMIT ?1");
  rows.bind(1, maximum);
  while (rows.next()) found.push_back(rows.integer(0));
  std::ranges::reverse(found);
  return found;
}
