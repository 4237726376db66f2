#include "tools/qvctl/QVReadOnlyStore.h"

#include "platform/QVText.h"
#include "platform/linux/store/QVEventStoreSchema.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <chrono>
#include <thread>
#include <utility>

#include <sqlite3.h>
#include <unistd.h>

namespace {

constexpr const char* kFileSystem = "quietvox-read-only";

// How long a query waits for a service that locks its store, which it does as it starts and ends.
constexpr int kBusyMilliseconds = 5000;

// The service may open or close the store between our looking and our opening, and takes some
// milliseconds for it: half a second in all.
constexpr int kAttempts = 25;
constexpr std::chrono::milliseconds kPause{20};

sqlite3_vfs& usualFileSystem() {
  return *::sqlite3_vfs_find(nullptr);
}

// Whatever SQLite asks for, files are opened as they are, and to read.
int openToRead(sqlite3_vfs* /*fileSystem*/, const char* name, sqlite3_file* file, int flags,
               int* openedWith) {
  flags &= ~(SQLITE_OPEN_CREATE | SQLITE_OPEN_READWRITE);
  flags |= SQLITE_OPEN_READONLY;
  return usualFileSystem().xOpen(&usualFileSystem(), name, file, flags, openedWith);
}

// SQLite's usual file system, but for that.
void registerFileSystem() {
  static sqlite3_vfs readOnly = usualFileSystem();
  readOnly.zName = kFileSystem;
  readOnly.xOpen = openToRead;
  readOnly.pNext = nullptr;
  ::sqlite3_vfs_register(&readOnly, 0);
}

// A path as it stands in SQLite's addresses.
std::string addressOf(const std::string& path, bool withLog) {
  constexpr const char* kDigits = "0123456789ABCDEF";
  std::string address = "file:";
  for (const char character : path) {
    if (character == '%' || character == '?' || character == '#') {
      const auto byte = static_cast<unsigned char>(character);
      address.append({'%', kDigits[byte >> 4U], kDigits[byte & 15U]});
    } else {
      address.push_back(character);
    }
  }
  return address.append(withLog ? "?mode=ro&readonly_shm=1" : "?mode=ro&immutable=1");
}

}  // namespace

std::unique_ptr<QVReadOnlyStore> QVReadOnlyStore::open(const std::filesystem::path& path) {
  registerFileSystem();
  const std::string log = path.string() + "-wal";
  std::unique_ptr<QVReadOnlyStore> store;
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    if (::access(path.c_str(), R_OK) != 0) {
      if (errno == ENOENT) return nullptr;
      throw QVToolFailure::ofFile(path, R_OK, errno);
    }
    store.reset(new QVReadOnlyStore(path));
    switch (store->tryToOpen(::access(log.c_str(), F_OK) == 0)) {
      case Outcome::ready:
        return store;
      case Outcome::empty:
        return nullptr;
      case Outcome::failed:
        std::this_thread::sleep_for(kPause);
        break;
    }
  }
  store->fail();
}

QVReadOnlyStore::~QVReadOnlyStore() {
  ::sqlite3_close_v2(handle_);
}

QVReadOnlyStore::Outcome QVReadOnlyStore::tryToOpen(bool withLog) {
  const std::string address = addressOf(path_.string(), withLog);
  int result =
      ::sqlite3_open_v2(address.c_str(), &handle_,
                        SQLITE_OPEN_READONLY | SQLITE_OPEN_URI | SQLITE_OPEN_NOMUTEX, kFileSystem);
  if (result != SQLITE_OK) return Outcome::failed;
  ::sqlite3_busy_timeout(handle_, kBusyMilliseconds);
  int64_t version = 0;
  sqlite3_stmt* question = nullptr;
  result = ::sqlite3_prepare_v2(handle_, "PRAGMA user_version", -1, &question, nullptr);
  if (result == SQLITE_OK && ::sqlite3_step(question) == SQLITE_ROW) {
    version = ::sqlite3_column_int64(question, 0);
  }
  if (result == SQLITE_OK) result = ::sqlite3_reset(question);
  ::sqlite3_finalize(question);
  if (result != SQLITE_OK) return Outcome::failed;
  if (version > QVEventStoreSchema::kVersion) {
    throw QVToolFailure(QVToolStatus::failed,
                        QVText(path_.string(), ": its version ", version, " is newer than ",
                               QVEventStoreSchema::kVersion));
  }
  return version == 0 ? Outcome::empty : Outcome::ready;
}

void QVReadOnlyStore::fail() const {
  const int code = ::sqlite3_system_errno(handle_);
  const bool isRefused = code == EACCES || code == EPERM;
  throw QVToolFailure(isRefused ? QVToolStatus::notPermitted : QVToolStatus::failed,
                      QVText(path_.string(), ": ", ::sqlite3_errmsg(handle_)));
}

int64_t QVReadOnlyStore::number(const std::string& query) const {
  QVStoreQuery question(*this, query);
  return question.next() ? question.integer(0) : 0;
}

QVStoreQuery::QVStoreQuery(const QVReadOnlyStore& store, const std::string& text) : store_(store) {
  if (::sqlite3_prepare_v2(store.handle_, text.c_str(), -1, &handle_, nullptr) != SQLITE_OK) {
    store.fail();
  }
}

QVStoreQuery::~QVStoreQuery() {
  ::sqlite3_finalize(handle_);
}

void QVStoreQuery::bind(int parameter, int64_t value) {
  ::sqlite3_bind_int64(handle_, parameter, value);
}

bool QVStoreQuery::next() {
  const int result = ::sqlite3_step(handle_);
  if (result == SQLITE_ROW) return true;
  if (result != SQLITE_DONE) store_.fail();
  return false;
}

void QVStoreQuery::reset() {
  ::sqlite3_reset(handle_);
}

int64_t QVStoreQuery::integer(int column) const {
  return ::sqlite3_column_int64(handle_, column);
}

std::string_view QVStoreQuery::text(int column) const {
  const auto* const bytes =
      static_cast<const char*>(static_cast<const void*>(::sqlite3_column_text(handle_, column)));
  if (bytes == nullptr) return {};
  return {bytes, static_cast<std::size_t>(::sqlite3_column_bytes(handle_, column))};
}

bool QVStoreQuery::isNull(int column) const {
  return ::sqlite3_column_type(handle_, column) == SQLITE_NULL;
}
