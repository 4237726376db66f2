#pragma once

#include <concepts>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

struct sqlite3;
struct sqlite3_stmt;

// The event store, opened to read: nothing is written, no file is made or changed, and the service
// never waits. Works while the service runs and while it does not.
//
// Where the store's write-ahead log is there, the file is read with it, as SQLite does it for a
// reader that may not write; where it is not, nobody has the store open, and the file is read as it
// lies. A file system of our own in SQLite sees to it that nothing is made.
//
// While it is open the service cannot remove its write-ahead log, so it is not kept open for long;
// a query that is not at its end, least of all: the log grows meanwhile.
//
// Threads: one at a time. Failures: QVToolFailure, notPermitted or failed, naming the file.
class QVReadOnlyStore {
 public:
  // Null where there is no store yet.
  static std::unique_ptr<QVReadOnlyStore> open(const std::filesystem::path& path);
  ~QVReadOnlyStore();
  QVReadOnlyStore(const QVReadOnlyStore&) = delete;
  QVReadOnlyStore& operator=(const QVReadOnlyStore&) = delete;

  // The number in the first column of the first row; 0 where there is no row.
  int64_t number(const std::string& query) const;

 private:
  friend class QVStoreQuery;
  enum class Outcome { ready, empty, failed };

  explicit QVReadOnlyStore(std::filesystem::path path) : path_(std::move(path)) {}
  Outcome tryToOpen(bool withLog);
  [[noreturn]] void fail() const;

  const std::filesystem::path path_;
  sqlite3* handle_ = nullptr;
};

// A query and its rows. Its read transaction lasts from the first next() to reset().
//
// Threads: one at a time. The store outlives it.
class QVStoreQuery {
 public:
  QVStoreQuery(const QVReadOnlyStore& store, const std::string& text);
  ~QVStoreQuery();
  QVStoreQuery(const QVStoreQuery&) = delete;
  QVStoreQuery& operator=(const QVStoreQuery&) = delete;

  // Parameters count from 1.
  void bind(int parameter, int64_t value);
  // The next row; false at the end.
  bool next();
  void reset();

  // Columns count from 0; valid until the next row.
  int64_t integer(int column) const;
  std::string_view text(int column) const;
  bool isNull(int column) const;
  // Absent where the row has no number that one of this kind can be: another program wrote it.
  template <std::unsigned_integral Number>
  std::optional<Number> numberWithin(int column) const {
    const int64_t number = integer(column);
    if (isNull(column) || !std::in_range<Number>(number)) return std::nullopt;
    return static_cast<Number>(number);
  }

 private:
  const QVReadOnlyStore& store_;
  sqlite3_stmt* handle_ = nullptr;
};
