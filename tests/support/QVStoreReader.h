#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

struct sqlite3;

// Reads the service's event store, as any other program would: read-only, while the service runs
// or after its end.
//
// Threads: one at a time.
class QVStoreReader {
 public:
  // Throws where there is no store.
  explicit QVStoreReader(const std::filesystem::path& store);
  ~QVStoreReader();
  QVStoreReader(const QVStoreReader&) = delete;
  QVStoreReader& operator=(const QVStoreReader&) = delete;

  // The rows that a query answers, their columns with "|" between; what is null is "NULL".
  std::vector<std::string> rows(const std::string& query) const;
  // The number in the first column of the first row.
  int64_t number(const std::string& query) const;
  // How many rows a table has.
  int64_t count(const std::string& table) const;

  // Waits until a query answers `count` rows; false where that takes longer than a minute.
  [[nodiscard]] static bool await(const std::filesystem::path& store, const std::string& query,
                                  std::size_t count);

 private:
  sqlite3* handle_ = nullptr;
};
