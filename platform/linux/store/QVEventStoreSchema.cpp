#include "platform/linux/store/QVEventStoreSchema.h"

#include "platform/QVText.h"

#include <sqlite3.h>

namespace {

// How long a transaction waits for another program that has the database locked, in milliseconds.
constexpr int kBusyMilliseconds = 1000;
// The page cache, in KiB: rows are only appended and removed at the other end, so little is read
// twice.
constexpr int kCacheKibibytes = 1024;

constexpr const char* kTables =
    "BEGIN IMMEDIATE;"
    "CREATE TABLE IF NOT EXISTS beacon_session(id INTEGER PRIMARY KEY, opened_at INTEGER,"
    " session_id INTEGER, token TEXT, client_type INTEGER, client_version REAL,"
    " batch_event INTEGER, contains_realtime_events INTEGER, user_info TEXT, flushed_at INTEGER);"
    "CREATE TABLE IF NOT EXISTS beacon_message(id INTEGER PRIMARY KEY, sent_at INTEGER,"
    " session INTEGER REFERENCES beacon_session, session_id INTEGER, client_name TEXT,"
    " service_name TEXT, category INTEGER, type INTEGER, payload TEXT);"
    "CREATE TABLE IF NOT EXISTS countwise_event(id INTEGER PRIMARY KEY, sent_at INTEGER,"
    " name TEXT, payload TEXT);"
    "CREATE TABLE IF NOT EXISTS joulewell_event(id INTEGER PRIMARY KEY, sent_at INTEGER,"
    " agent INTEGER, name TEXT, payload TEXT);"
    "CREATE TABLE IF NOT EXISTS loss(id INTEGER PRIMARY KEY, at INTEGER, cause TEXT,"
    " count INTEGER);"
    "PRAGMA user_version = 1;"
    "COMMIT";
static_assert(QVEventStoreSchema::kVersion == 1);

using Result = QVEventStoreSchema::Result;

Result failed(const QVSQLiteDatabase& database, int result, std::string& reason) {
  reason = database.message();
  return QVSQLiteDatabase::isDamage(result) ? Result::damaged : Result::refused;
}

}  // namespace

Result QVEventStoreSchema::prepare(QVSQLiteDatabase& database, std::string& reason) {
  sqlite3_busy_timeout(database.handle(), kBusyMilliseconds);
  int64_t version = 0;
  int result = SQLITE_OK;
  {
    QVSQLiteStatement question;
    result = question.prepare(database, "PRAGMA user_version");
    if (result == SQLITE_OK) result = question.read(version);
  }
  if (result != SQLITE_OK) return failed(database, result, reason);
  if (version > kVersion) {
    reason = QVText("its version ", version, " is newer than ", kVersion);
    return Result::refused;
  }
  if (database.isReadOnly()) {
    reason = "it cannot be written";
    return Result::refused;
  }
  // The page size counts for a new file only. Freed pages are not overwritten: the same data lies
  // in the pages still in use. Shrinking the log each time would cost more than it is worth.
  const std::string settings =
      QVText("PRAGMA page_size = ", kPageBytes, "; PRAGMA journal_mode = WAL;",
             "PRAGMA synchronous = NORMAL; PRAGMA cache_size = -", kCacheKibibytes,
             "; PRAGMA wal_autocheckpoint = ", kCheckpointPages,
             "; PRAGMA journal_size_limit = ", 4 * kCheckpointPages * kPageBytes,
             "; PRAGMA secure_delete = OFF;");
  result = database.execute(settings.c_str());
  if (result == SQLITE_OK && version < kVersion) result = database.execute(kTables);
  if (result != SQLITE_OK) return failed(database, result, reason);
  return Result::ready;
}
