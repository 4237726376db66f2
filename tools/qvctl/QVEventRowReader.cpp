#include "tools/qvctl/QVEventRowReader.h"

#include "platform/QVBeacon.h"
#include "platform/QVText.h"
#include "platform/linux/files/QVJSONFile.h"

#include <algorithm>
#include <array>
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

void QVEventRowReader::read(Kind kind, int64_t after, int64_t last, Events& events) const {
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return;
  QVStoreQuery rows(*store, QVText("SELECT ", tableOf(kind).columns, " FROM ", tableOf(kind).name,
                                   " WHERE id > ?1 AND id <= ?2 ORDER BY id"));
  rows.bind(1, after);
  rows.bind(2, std::min(last, after + kRowsAtATime));
  while (rows.next()) take(kind, rows, events);
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
      event.category = static_cast<uint32_t>(row.integer(4));
      event.type = static_cast<uint16_t>(row.integer(5));
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

QVEventRowReader::Stops QVEventRowReader::stops(
    const std::function<void(double part)>& progress) const {
  Stops stops;
  const Range all = range(Kind::stop);
  for (int64_t after = all.first - 1; after < all.last; after += kRowsAtATime) {
    const auto store = QVReadOnlyStore::open(path_);
    if (store == nullptr) break;
    QVStoreQuery rows(*store,
                      "SELECT flushed_at, id FROM beacon_session WHERE id > ?1 AND id <= ?2 AND "
                      "flushed_at IS NOT NULL");
    rows.bind(1, after);
    rows.bind(2, std::min(all.last, after + kRowsAtATime));
    while (rows.next()) stops.emplace_back(rows.integer(0), rows.integer(1));
    progress(static_cast<double>(after) / static_cast<double>(all.last + 1));
  }
  std::ranges::sort(stops);
  return stops;
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

std::vector<int64_t> QVEventRowReader::sessionRows(Sessions which, int64_t after,
                                                   int64_t maximum) const {
  std::vector<int64_t> found;
  const auto store = QVReadOnlyStore::open(path_);
  if (store == nullptr) return found;
  const char* const running = which == Sessions::running ? "AND flushed_at IS NULL " : "";
  QVStoreQuery rows(*store, QVText("SELECT id FROM beacon_session WHERE id > ?1 ", running,
                                   "ORDER BY id DESC LIMIT ?2"));
  rows.bind(1, after);
  rows.bind(2, maximum);
  while (rows.next()) found.push_back(rows.integer(0));
  std::ranges::reverse(found);
  return found;
}
