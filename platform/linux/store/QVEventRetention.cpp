#include "platform/linux/store/QVEventRetention.h"

#include "platform/QVText.h"
#include "platform/linux/store/QVEventStoreSchema.h"

#include <algorithm>
#include <limits>
#include <string>

#include <sqlite3.h>

namespace {

constexpr std::array<const char*, QVEventRetention::kTables> kNames{
    "beacon_message", "countwise_event", "joulewell_event"};

// The least limit: some pages for each table, in bytes.
constexpr int64_t kLeastLimit = int64_t{1024} * 1024;
// Kept free for inner pages of the trees, sessions and losses, in bytes.
constexpr int64_t kReserveBytes = 8 * QVEventStoreSchema::kPageBytes;
// What is removed at a time at least: enough rows for the search of their ends to cost little,
// few enough for one transaction to fill their pages again.
constexpr int64_t kRemovalBytes = int64_t{256} * 1024;
// Sessions looked at with each removal.
constexpr int64_t kSessionWindow = 64;
// A row's header, ids and times, in bytes.
constexpr int64_t kRowOverhead = 40;
// From this size on a row may leave much of its last page unused.
constexpr int64_t kLargeRow = QVEventStoreSchema::kPageBytes / 4;

// Bytes of pages that a row of so many bytes may take, at the most.
int64_t cost(std::size_t bytes) {
  const int64_t size = static_cast<int64_t>(bytes) + kRowOverhead;
  constexpr int64_t kPage = QVEventStoreSchema::kPageBytes;
  if (size < kLargeRow) return size + size / 3;
  return (size / (kPage - 64) + 2) * kPage;
}

}  // namespace

QVEventRetention::QVEventRetention(int64_t limit) {
  setLimit(limit);
}

void QVEventRetention::setLimit(int64_t limit) {
  limit_ = std::max(limit, kLeastLimit);
}

int QVEventRetention::prepare(const QVSQLiteDatabase& database, int64_t openedAt) {
  database_ = &database;
  openedAt_ = openedAt;
  int result = SQLITE_OK;
  const auto prepare = [&](QVSQLiteStatement& statement, const std::string& text) {
    if (result == SQLITE_OK) result = statement.prepare(database, text);
  };
  for (std::size_t i = 0; i < kTables; ++i) {
    const std::string name = kNames[i];
    prepare(tables_[i].bounds,
            QVText("SELECT (SELECT min(id) FROM ", name, "), (SELECT max(id) FROM ", name, ")"));
    prepare(tables_[i].timeAt,
            QVText("SELECT sent_at FROM ", name, " WHERE id >= ? ORDER BY id LIMIT 1"));
    prepare(tables_[i].remove, QVText("DELETE FROM ", name, " WHERE id <= ?"));
  }
  prepare(pages_, "PRAGMA page_count");
  prepare(freePages_, "PRAGMA freelist_count");
  prepare(sessionsAfter_,
          "SELECT id, opened_at, flushed_at FROM beacon_session WHERE id > ? ORDER BY id LIMIT ?");
  prepare(removeSession_, "DELETE FROM beacon_session WHERE id = ?");
  prepare(removeSessions_,
          "DELETE FROM beacon_session WHERE id IN"
          " (SELECT id FROM beacon_session ORDER BY id LIMIT ?)");
  if (result != SQLITE_OK) return result;
  QVSQLiteStatement lastSession;
  result = lastSession.prepare(database, "SELECT max(id) FROM beacon_session");
  lastEarlierSession_ = 0;
  sessionCursor_ = 0;
  if (result == SQLITE_OK) result = lastSession.read(lastEarlierSession_);
  QVSQLiteStatement pageSize;
  if (result == SQLITE_OK) result = pageSize.prepare(database, "PRAGMA page_size");
  if (result == SQLITE_OK) result = pageSize.read(pageBytes_);
  return result == SQLITE_OK ? readBounds() : result;
}

void QVEventRetention::release() {
  for (Rows& rows : tables_) {
    rows.bounds.finalize();
    rows.timeAt.finalize();
    rows.remove.finalize();
  }
  for (QVSQLiteStatement* statement :
       {&pages_, &freePages_, &sessionsAfter_, &removeSession_, &removeSessions_}) {
    statement->finalize();
  }
  database_ = nullptr;
}

int QVEventRetention::begin() {
  removed_ = 0;
  if (stale_) {
    if (const int result = readBounds(); result != SQLITE_OK) return result;
  }
  return measure();
}

int QVEventRetention::makeRoom(std::size_t bytes) {
  const int64_t needed = cost(bytes);
  if (needed > room_) {
    if (needed > limit_ - kReserveBytes) return SQLITE_TOOBIG;
    // The estimate is on the safe side; rows only go when the pages themselves say so.
    int result = measure();
    while (result == SQLITE_OK && needed > room_) {
      const int64_t atLeast = std::min(kRemovalBytes, limit_ / 16);
      result =
          rowCount() > 0 ? removeOldest(std::max(needed - room_, atLeast)) : removeOldestSessions();
      if (result == SQLITE_OK) result = measure();
    }
    if (result != SQLITE_OK) return result;
  }
  room_ -= needed;
  return SQLITE_OK;
}

void QVEventRetention::noteRow(Table table, int64_t id) {
  Rows& rows = tables_[table];
  if (rows.count() == 0) rows.first = id;
  rows.last = id;
}

int QVEventRetention::readBounds() {
  for (Rows& rows : tables_) {
    const int state = rows.bounds.step();
    if (state == SQLITE_ROW) {
      const bool empty = rows.bounds.isNull(0);
      rows.first = empty ? 1 : rows.bounds.column(0);
      rows.last = empty ? 0 : rows.bounds.column(1);
    }
    rows.bounds.reset();
    if (state != SQLITE_ROW) return state;
  }
  stale_ = false;
  return SQLITE_OK;
}

int QVEventRetention::measure() {
  int64_t pages = 0;
  int64_t freePages = 0;
  int result = pages_.read(pages);
  if (result == SQLITE_OK) result = freePages_.read(freePages);
  used_ = (pages - freePages) * pageBytes_;
  room_ = limit_ - kReserveBytes - used_;
  return result;
}

int QVEventRetention::removeOldest(int64_t bytes) {
  // The table with the most rows says where the cut in time is; its share of the rows to go is its
  // share of all rows.
  Rows& leading = *std::ranges::max_element(tables_, {}, &Rows::count);
  const int64_t total = rowCount();
  const int64_t bytesPerRow = std::max<int64_t>(used_ / total, 1);
  const double share = static_cast<double>(leading.count()) / static_cast<double>(total);
  const auto rowsToGo =
      static_cast<int64_t>(static_cast<double>(bytes) / static_cast<double>(bytesPerRow) * share) +
      1;
  const int64_t cut = leading.first + std::min(rowsToGo, leading.count()) - 1;
  int64_t time = 0;
  int result = readTime(leading, cut, time);
  for (Rows& rows : tables_) {
    int64_t last = cut;
    if (result == SQLITE_OK && &rows != &leading) result = lastNotAfter(rows, time, last);
    if (result == SQLITE_OK) result = removeRows(rows, last);
  }
  return result == SQLITE_OK ? removeEndedSessions(time) : result;
}

int QVEventRetention::removeRows(Rows& rows, int64_t last) {
  if (last < rows.first) return SQLITE_OK;
  rows.remove.bind(1, last);
  const int result = rows.remove.run();
  if (result != SQLITE_OK) return result;
  removed_ += database_->changes();
  rows.first = last + 1;
  return SQLITE_OK;
}

int QVEventRetention::removeEndedSessions(int64_t before) {
  std::array<int64_t, kSessionWindow> ended{};
  std::size_t endedCount = 0;
  int64_t seen = 0;
  bool reachedLater = false;
  sessionsAfter_.bind(1, sessionCursor_);
  sessionsAfter_.bind(2, kSessionWindow);
  int state = SQLITE_DONE;
  while (!reachedLater && (state = sessionsAfter_.step()) == SQLITE_ROW) {
    ++seen;
    const int64_t id = sessionsAfter_.column(0);
    sessionCursor_ = id;
    reachedLater = sessionsAfter_.column(1) >= before;
    // A session of an earlier run ended when this one began, at the latest.
    const int64_t end = !sessionsAfter_.isNull(2)   ? sessionsAfter_.column(2)
                        : id <= lastEarlierSession_ ? openedAt_
                                                    : std::numeric_limits<int64_t>::max();
    if (end < before) ended[endedCount++] = id;
  }
  sessionsAfter_.reset();
  if (state != SQLITE_ROW && state != SQLITE_DONE) return state;
  if (reachedLater || seen < kSessionWindow) sessionCursor_ = 0;
  for (std::size_t i = 0; i < endedCount; ++i) {
    removeSession_.bind(1, ended[i]);
    if (const int result = removeSession_.run(); result != SQLITE_OK) return result;
  }
  return SQLITE_OK;
}

int QVEventRetention::removeOldestSessions() {
  removeSessions_.bind(1, kSessionWindow);
  const int result = removeSessions_.run();
  if (result != SQLITE_OK) return result;
  return database_->changes() > 0 ? SQLITE_OK : SQLITE_TOOBIG;
}

int QVEventRetention::readTime(Rows& rows, int64_t id, int64_t& time) {
  rows.timeAt.bind(1, id);
  return rows.timeAt.read(time);
}

int QVEventRetention::lastNotAfter(Rows& rows, int64_t time, int64_t& last) {
  // Strides double from the oldest row on, for what is looked for is near, then the last stride is
  // halved.
  last = rows.first - 1;
  int64_t stride = 1;
  bool growing = true;
  while (stride > 0) {
    int64_t at = std::numeric_limits<int64_t>::max();
    if (last + stride <= rows.last) {
      if (const int result = readTime(rows, last + stride, at); result != SQLITE_OK) return result;
    }
    if (at <= time) {
      last += stride;
    } else {
      growing = false;
    }
    stride = growing ? stride * 2 : stride / 2;
  }
  return SQLITE_OK;
}

int64_t QVEventRetention::rowCount() const {
  int64_t count = 0;
  for (const Rows& rows : tables_) count += rows.count();
  return count;
}
