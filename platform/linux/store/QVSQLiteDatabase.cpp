#include "platform/linux/store/QVSQLiteDatabase.h"

#include <system_error>

#include <sqlite3.h>

int QVSQLiteDatabase::open(const std::string& path, const std::string& vfs) {
  close();
  // SQLite's own book-keeping of memory takes a lock at each allocation. Too late once SQLite runs,
  // which does no harm.
  [[maybe_unused]] static const int kConfigured = sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
  const int result = sqlite3_open_v2(
      path.c_str(), &handle_, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX,
      vfs.empty() ? nullptr : vfs.c_str());
  if (handle_ != nullptr) sqlite3_extended_result_codes(handle_, 1);
  return result;
}

void QVSQLiteDatabase::close() {
  sqlite3_close_v2(handle_);
  handle_ = nullptr;
}

int QVSQLiteDatabase::execute(const char* statements) {
  return sqlite3_exec(handle_, statements, nullptr, nullptr, nullptr);
}

std::string QVSQLiteDatabase::message() const {
  if (handle_ == nullptr) return "out of memory";
  std::string text = sqlite3_errmsg(handle_);
  const int systemError = sqlite3_system_errno(handle_);
  const int result = sqlite3_errcode(handle_) & 0xFF;
  if (systemError != 0 && (result == SQLITE_CANTOPEN || result == SQLITE_IOERR)) {
    text.append(" (").append(std::generic_category().message(systemError)).append(")");
  }
  return text;
}

bool QVSQLiteDatabase::isReadOnly() const {
  return sqlite3_db_readonly(handle_, "main") != 0;
}

bool QVSQLiteDatabase::hasMoved() const {
  int moved = 0;
  sqlite3_file_control(handle_, "main", SQLITE_FCNTL_HAS_MOVED, &moved);
  return moved != 0;
}

bool QVSQLiteDatabase::inTransaction() const {
  return sqlite3_get_autocommit(handle_) == 0;
}

void QVSQLiteDatabase::giveMemoryBack() {
  if (handle_ != nullptr) sqlite3_db_release_memory(handle_);
}

int64_t QVSQLiteDatabase::lastRow() const {
  return sqlite3_last_insert_rowid(handle_);
}

int64_t QVSQLiteDatabase::changes() const {
  return sqlite3_changes64(handle_);
}

bool QVSQLiteDatabase::isDamage(int result) {
  return (result & 0xFF) == SQLITE_CORRUPT || (result & 0xFF) == SQLITE_NOTADB;
}

int QVSQLiteStatement::prepare(const QVSQLiteDatabase& database, const std::string& text) {
  finalize();
  return sqlite3_prepare_v3(database.handle(), text.c_str(), -1, SQLITE_PREPARE_PERSISTENT,
                            &handle_, nullptr);
}

void QVSQLiteStatement::finalize() {
  sqlite3_finalize(handle_);
  handle_ = nullptr;
}

void QVSQLiteStatement::bind(int parameter, int64_t value) {
  sqlite3_bind_int64(handle_, parameter, value);
}

void QVSQLiteStatement::bind(int parameter, double value) {
  sqlite3_bind_double(handle_, parameter, value);
}

void QVSQLiteStatement::bind(int parameter, std::string_view text) {
  sqlite3_bind_text64(handle_, parameter, text.data() == nullptr ? "" : text.data(), text.size(),
                      SQLITE_STATIC, SQLITE_UTF8);
}

void QVSQLiteStatement::bindNull(int parameter) {
  sqlite3_bind_null(handle_, parameter);
}

int QVSQLiteStatement::run() {
  int result = step();
  while (result == SQLITE_ROW) result = step();
  reset();
  return result == SQLITE_DONE ? SQLITE_OK : result;
}

int QVSQLiteStatement::step() {
  return sqlite3_step(handle_);
}

int64_t QVSQLiteStatement::column(int index) const {
  return sqlite3_column_int64(handle_, index);
}

bool QVSQLiteStatement::isNull(int index) const {
  return sqlite3_column_type(handle_, index) == SQLITE_NULL;
}

void QVSQLiteStatement::reset() {
  sqlite3_reset(handle_);
}

int QVSQLiteStatement::read(int64_t& result) {
  const int state = step();
  if (state == SQLITE_ROW && !isNull(0)) result = column(0);
  reset();
  return state == SQLITE_ROW || state == SQLITE_DONE ? SQLITE_OK : state;
}
