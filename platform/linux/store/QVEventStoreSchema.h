#pragma once

#include "platform/linux/store/QVSQLiteDatabase.h"

#include <cstdint>
#include <string>

// Brings an opened database file into the shape of the event store.
struct QVEventStoreSchema {
  // The number in PRAGMA user_version. A larger one was written by a later version of the service
  // and is left alone.
  static constexpr int64_t kVersion = 1;
  // Bytes of a page. Large pages cost less time a row, small ones less writing when few rows are
  // committed at a time; bench/store compares them.
  static constexpr int64_t kPageBytes = 8192;
  // The write-ahead log is copied into the file when it has so many pages: 8 MiB. Longer ones
  // would make the writer wait longer for the disk at a time.
  static constexpr int64_t kCheckpointPages = 1024;

  enum class Result {
    ready,
    refused,  // as it is, the file is not for us; `reason` says why
    damaged   // its contents are no event store's; `reason` says why
  };

  // Sets the connection up and makes the tables where there are none.
  [[nodiscard]] static Result prepare(QVSQLiteDatabase& database, std::string& reason);
};
