#include "tests/support/QVStoreReader.h"

#include "tests/support/QVDirectoryWatch.h"

#include <memory>
#include <stdexcept>

#include <sqlite3.h>

namespace {

// Milliseconds for which a reader waits while the service has the store to itself, which it has
// for moments at its beginning and end.
constexpr int kBusyLimit = 10'000;

}  // namespace

QVStoreReader::QVStoreReader(const std::filesystem::path& store) {
  if (sqlite3_open_v2(store.c_str(), &handle_, SQLITE_OPEN_READONLY, nullptr) != SQLITE_OK) {
    sqlite3_close(handle_);
    throw std::runtime_error("cannot open " + store.string());
  }
  sqlite3_busy_timeout(handle_, kBusyLimit);
}

QVStoreReader::~QVStoreReader() {
  sqlite3_close(handle_);
}

std::vector<std::string> QVStoreReader::rows(const std::string& query) const {
  sqlite3_stmt* raw = nullptr;
  const int prepared = sqlite3_prepare_v2(handle_, query.c_str(), -1, &raw, nullptr);
  const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> statement(raw, sqlite3_finalize);
  if (prepared != SQLITE_OK) throw std::runtime_error(query + ": " + sqlite3_errmsg(handle_));
  std::vector<std::string> found;
  int result = sqlite3_step(raw);
  for (; result == SQLITE_ROW; result = sqlite3_step(raw)) {
    std::string& row = found.emplace_back();
    for (int column = 0; column < sqlite3_column_count(raw); ++column) {
      if (column != 0) row += '|';
      const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(raw, column));
      row += text == nullptr ? "NULL" : text;
    }
  }
  if (result != SQLITE_DONE) throw std::runtime_error(query + ": " + sqlite3_errmsg(handle_));
  return found;
}

int64_t QVStoreReader::number(const std::string& query) const {
  return std::stoll(rows(query).at(0));
}

int64_t QVStoreReader::count(const std::string& table) const {
  return number("SELECT count(*) FROM " + table);
}

bool QVStoreReader::await(const std::filesystem::path& store, const std::string& query,
                          std::size_t count) {
  const QVDirectoryWatch watch(store.parent_path());
  return watch.await([&store, &query, count] {
    // There may be no store yet, or one without its tables.
    try {
      return QVStoreReader(store).rows(query).size() >= count;
    } catch (const std::runtime_error&) {
      return false;
    }
  });
}
