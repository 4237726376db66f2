#pragma once

#include "platform/linux/store/QVSQLiteDatabase.h"

#include <array>
#include <cstddef>
#include <cstdint>

// Keeps the event store's file within its limit: before rows are inserted it sees to room for
// them, by removing the oldest rows of all tables.
//
// Rows are removed in the transaction that inserts new ones, a little at a time: the pages that
// come free are filled again at once and written once; removed on their own they would be written
// as free pages first. A row's age is its id: the tables are only appended to.
//
// A session's row goes when it has ended before the oldest message that is left; sessions that
// are open, or ended without a flush, only when nothing else is left to go.
//
// Threads: one at a time. States: prepared between prepare() and release().
class QVEventRetention {
 public:
  enum Table : std::size_t { kMessages, kCountwise, kJoulewell, kTables };

  explicit QVEventRetention(int64_t limit);

  // Finds out what the database holds. `openedAt` is now: sessions of earlier runs have ended.
  [[nodiscard]] int prepare(const QVSQLiteDatabase& database, int64_t openedAt);
  void release();
  void setLimit(int64_t limit);

  // At a transaction's beginning, and after one was rolled back.
  [[nodiscard]] int begin();
  // Makes room for a row of so many bytes; SQLITE_TOOBIG where it can never fit.
  [[nodiscard]] int makeRoom(std::size_t bytes);
  // A row was appended to the table.
  void noteRow(Table table, int64_t id);
  void noteRollback() { stale_ = true; }

  // Rows removed in this transaction.
  int64_t removed() const { return removed_; }

 private:
  // A table's rows: ids from `first` to `last`.
  struct Rows {
    int64_t first = 1;
    int64_t last = 0;
    QVSQLiteStatement bounds;
    QVSQLiteStatement timeAt;
    QVSQLiteStatement remove;

    int64_t count() const { return last - first + 1; }
  };

  [[nodiscard]] int readBounds();
  [[nodiscard]] int measure();
  [[nodiscard]] int removeOldest(int64_t bytes);
  [[nodiscard]] int removeRows(Rows& rows, int64_t last);
  [[nodiscard]] int removeEndedSessions(int64_t before);
  [[nodiscard]] int removeOldestSessions();
  [[nodiscard]] int readTime(Rows& rows, int64_t id, int64_t& time);
  [[nodiscard]] int lastNotAfter(Rows& rows, int64_t time, int64_t& last);
  int64_t rowCount() const;

  int64_t limit_;
  const QVSQLiteDatabase* database_ = nullptr;
  std::array<Rows, kTables> tables_;
  QVSQLiteStatement pages_;
  QVSQLiteStatement freePages_;
  QVSQLiteStatement sessionsAfter_;
  QVSQLiteStatement removeSession_;
  QVSQLiteStatement removeSessions_;

  int64_t pageBytes_ = 0;
  int64_t used_ = 0;  // bytes, at the last measuring
  int64_t room_ = 0;  // bytes that may still be added, estimated from there
  int64_t removed_ = 0;
  bool stale_ = false;  // the tables' bounds have to be read again

  int64_t openedAt_ = 0;
  int64_t lastEarlierSession_ = 0;  // up to this id sessions are of earlier runs
  int64_t sessionCursor_ = 0;       // sessions are looked through a few at a time, from here
};
