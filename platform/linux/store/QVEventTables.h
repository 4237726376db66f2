#pragma once

#include "platform/linux/store/QVEventLosses.h"
#include "platform/linux/store/QVEventRetention.h"
#include "platform/linux/store/QVEventRows.h"
#include "platform/linux/store/QVJSONText.h"
#include "platform/linux/store/QVSQLiteDatabase.h"

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

// The opened event store: its tables, and the statements that write them. Used by the writer.
//
// Between begin() and commit() or rollback(), rows are inserted in any order; results are SQLite's
// codes, and after any but SQLITE_OK the transaction has to be rolled back. SQLITE_TOOBIG alone is
// the row's own fault: it was left out, the transaction goes on.
//
// Threads: one at a time. Rows are bound where they lie and not kept.
class QVEventTables {
 public:
  enum class Opening { opened, refused, damaged };

  // Bytes that the file may grow to.
  explicit QVEventTables(int64_t limit);

  [[nodiscard]] Opening open(const std::string& path, const std::string& vfs, int64_t now,
                             std::string& reason);
  void close();
  bool isOpen() const { return database_.isOpen(); }
  // Is the file that was opened no longer at its path?
  bool hasMoved() const { return database_.hasMoved(); }
  void setLimit(int64_t limit) { retention_.setLimit(limit); }
  std::string message() const { return database_.message(); }
  // Frees what large payloads left behind. Not within a transaction.
  void giveMemoryBack();
  // Bytes of payload text that were written since.
  uint64_t textBytes() const { return textBytes_ - textBytesGivenBack_; }

  [[nodiscard]] int begin();
  [[nodiscard]] int insert(const QVBeaconSessionRow& row);
  [[nodiscard]] int insert(const QVBeaconMessageRow& row);
  [[nodiscard]] int insert(const QVCountwiseRow& row);
  [[nodiscard]] int insert(const QVJoulewellRow& row);
  // Notes the flush in the session's row.
  [[nodiscard]] int insert(const QVFlushRow& row);
  // Adds what was lost, here and in `losses`, to the table of losses, and makes the transaction
  // last. Only then `losses` is emptied.
  [[nodiscard]] int commit(QVEventLosses& losses, int64_t now);
  void rollback();

 private:
  // The row that a cause's losses are being added to, and since when.
  struct LossRow {
    int64_t id = 0;
    int64_t since = 0;
  };

  [[nodiscard]] int prepareStatements();
  [[nodiscard]] int insertSessionRow(const std::shared_ptr<QVEventSession>& session, int64_t time,
                                     std::string_view userInfo);
  [[nodiscard]] int insertBareSession(const std::shared_ptr<QVEventSession>& session, int64_t time);
  [[nodiscard]] int insertLoss(std::string_view cause, int64_t count, int64_t now);
  std::string_view text(const QVDictionary& payload);

  QVJSONText json_;
  uint64_t textBytes_ = 0;
  uint64_t textBytesGivenBack_ = 0;
  QVSQLiteDatabase database_;
  // Which database this is, from 1: sessions written to an earlier one are not in this.
  uint64_t number_ = 0;
  int64_t nextSession_ = 1;
  // Sessions whose row is as good as this transaction.
  std::vector<std::shared_ptr<QVEventSession>> newSessions_;
  std::map<std::string, LossRow, std::less<>> lossRows_;

  // After the database, so that they go before it.
  QVSQLiteStatement begin_;
  QVSQLiteStatement commit_;
  QVSQLiteStatement rollback_;
  QVSQLiteStatement session_;
  QVSQLiteStatement message_;
  QVSQLiteStatement countwise_;
  QVSQLiteStatement joulewell_;
  QVSQLiteStatement flush_;
  QVSQLiteStatement newLoss_;
  QVSQLiteStatement moreLoss_;
  QVEventRetention retention_;
};
