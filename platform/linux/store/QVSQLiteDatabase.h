#pragma once

#include <cstdint>
#include <string>
#include <string_view>

struct sqlite3;
struct sqlite3_stmt;

// An SQLite connection, closed when it goes. Results are SQLite's result codes: SQLITE_OK or what
// failed; message() then says more.
//
// Threads: one at a time.
class QVSQLiteDatabase {
 public:
  QVSQLiteDatabase() = default;
  ~QVSQLiteDatabase() { close(); }
  QVSQLiteDatabase(const QVSQLiteDatabase&) = delete;
  QVSQLiteDatabase& operator=(const QVSQLiteDatabase&) = delete;

  // Opens the file for reading and writing and makes it where there is none. An empty `vfs` is
  // SQLite's usual file system.
  [[nodiscard]] int open(const std::string& path, const std::string& vfs);
  void close();
  bool isOpen() const { return handle_ != nullptr; }

  // Runs statements that answer nothing.
  [[nodiscard]] int execute(const char* statements);
  // What the last call failed of, with the operating system's reason where there is one.
  std::string message() const;

  bool isReadOnly() const;
  // Has the file been moved or removed since it was opened?
  bool hasMoved() const;
  bool inTransaction() const;
  // Frees what SQLite keeps only for speed.
  void giveMemoryBack();
  int64_t lastRow() const;
  int64_t changes() const;
  sqlite3* handle() const { return handle_; }

  // Does this result mean that the file's contents are damaged or no database at all?
  static bool isDamage(int result);

 private:
  sqlite3* handle_ = nullptr;
};

// A prepared statement that is used again and again. Must go before its database is closed.
class QVSQLiteStatement {
 public:
  QVSQLiteStatement() = default;
  ~QVSQLiteStatement() { finalize(); }
  QVSQLiteStatement(const QVSQLiteStatement&) = delete;
  QVSQLiteStatement& operator=(const QVSQLiteStatement&) = delete;

  [[nodiscard]] int prepare(const QVSQLiteDatabase& database, const std::string& text);
  void finalize();

  // Parameters count from 1 and stay until they are bound anew. Text is not copied: it has to
  // last until the statement has run.
  void bind(int parameter, int64_t value);
  void bind(int parameter, double value);
  void bind(int parameter, std::string_view text);
  void bindNull(int parameter);

  // Runs to the end; SQLITE_OK where that went well.
  [[nodiscard]] int run();

  // For queries: SQLITE_ROW with the first row to read by column(), or SQLITE_DONE; then reset().
  [[nodiscard]] int step();
  int64_t column(int index) const;
  bool isNull(int index) const;
  void reset();

  // The integer in the first row's first column; `result` stays as it is where there is no row or
  // the column is null.
  [[nodiscard]] int read(int64_t& result);

 private:
  sqlite3_stmt* handle_ = nullptr;
};
