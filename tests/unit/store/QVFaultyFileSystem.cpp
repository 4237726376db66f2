#include "tests/unit/store/QVFaultyFileSystem.h"

#include <chrono>

#include <sqlite3.h>

namespace {

QVFaultyFileSystem* current = nullptr;
sqlite3_vfs* usual = nullptr;
sqlite3_vfs faulty;

// The usual file system's file lies right behind this one.
struct File {
  sqlite3_file base;
  sqlite3_file* real() { return reinterpret_cast<sqlite3_file*>(this + 1); }
};

sqlite3_file* real(sqlite3_file* file) {
  return reinterpret_cast<File*>(file)->real();
}

// The result of an operation that would change the disk; SQLITE_OK where it may go on.
int verdict(int inputOutputError) {
  switch (current->attemptWrite()) {
    case QVFaultyFileSystem::Fault::diskFull:
      return SQLITE_FULL;
    case QVFaultyFileSystem::Fault::badSectors:
      return inputOutputError;
    case QVFaultyFileSystem::Fault::none:
      break;
  }
  return SQLITE_OK;
}

int closeFile(sqlite3_file* file) {
  return real(file)->pMethods->xClose(real(file));
}
int readFile(sqlite3_file* file, void* bytes, int count, sqlite3_int64 offset) {
  return real(file)->pMethods->xRead(real(file), bytes, count, offset);
}
int writeFile(sqlite3_file* file, const void* bytes, int count, sqlite3_int64 offset) {
  const int result = verdict(SQLITE_IOERR_WRITE);
  return result != SQLITE_OK ? result
                             : real(file)->pMethods->xWrite(real(file), bytes, count, offset);
}
int truncateFile(sqlite3_file* file, sqlite3_int64 size) {
  return real(file)->pMethods->xTruncate(real(file), size);
}
int syncFile(sqlite3_file* file, int flags) {
  const int result = verdict(SQLITE_IOERR_FSYNC);
  return result != SQLITE_OK ? result : real(file)->pMethods->xSync(real(file), flags);
}
int fileSize(sqlite3_file* file, sqlite3_int64* size) {
  return real(file)->pMethods->xFileSize(real(file), size);
}
int lockFile(sqlite3_file* file, int level) {
  return real(file)->pMethods->xLock(real(file), level);
}
int unlockFile(sqlite3_file* file, int level) {
  return real(file)->pMethods->xUnlock(real(file), level);
}
int checkReservedLock(sqlite3_file* file, int* reserved) {
  return real(file)->pMethods->xCheckReservedLock(real(file), reserved);
}
int fileControl(sqlite3_file* file, int operation, void* argument) {
  return real(file)->pMethods->xFileControl(real(file), operation, argument);
}
int sectorSize(sqlite3_file* file) {
  return real(file)->pMethods->xSectorSize(real(file));
}
int deviceCharacteristics(sqlite3_file* file) {
  return real(file)->pMethods->xDeviceCharacteristics(real(file));
}
int mapSharedMemory(sqlite3_file* file, int region, int size, int extend, void volatile** memory) {
  return real(file)->pMethods->xShmMap(real(file), region, size, extend, memory);
}
int lockSharedMemory(sqlite3_file* file, int offset, int count, int flags) {
  return real(file)->pMethods->xShmLock(real(file), offset, count, flags);
}
void sharedMemoryBarrier(sqlite3_file* file) {
  real(file)->pMethods->xShmBarrier(real(file));
}
int unmapSharedMemory(sqlite3_file* file, int remove) {
  return real(file)->pMethods->xShmUnmap(real(file), remove);
}

constexpr sqlite3_io_methods kMethods{2,
                                      closeFile,
                                      readFile,
                                      writeFile,
                                      truncateFile,
                                      syncFile,
                                      fileSize,
                                      lockFile,
                                      unlockFile,
                                      checkReservedLock,
                                      fileControl,
                                      sectorSize,
                                      deviceCharacteristics,
                                      mapSharedMemory,
                                      lockSharedMemory,
                                      sharedMemoryBarrier,
                                      unmapSharedMemory,
                                      nullptr,
                                      nullptr};

int openFile(sqlite3_vfs*, const char* name, sqlite3_file* file, int flags, int* outFlags) {
  auto* opened = reinterpret_cast<File*>(file);
  const int result = usual->xOpen(usual, name, opened->real(), flags, outFlags);
  opened->base.pMethods = opened->real()->pMethods == nullptr ? nullptr : &kMethods;
  return result;
}

}  // namespace

QVFaultyFileSystem::QVFaultyFileSystem() {
  current = this;
  usual = sqlite3_vfs_find(nullptr);
  faulty = *usual;
  faulty.zName = "qv-faulty";
  faulty.szOsFile = static_cast<int>(sizeof(File)) + usual->szOsFile;
  faulty.xOpen = openFile;
  sqlite3_vfs_register(&faulty, 0);
}

QVFaultyFileSystem::~QVFaultyFileSystem() {
  sqlite3_vfs_unregister(&faulty);
  current = nullptr;
}

void QVFaultyFileSystem::fail(Fault fault) {
  const std::lock_guard lock(mutex_);
  fault_ = fault;
  wrote_ = false;
}

bool QVFaultyFileSystem::awaitWrite() {
  std::unique_lock lock(mutex_);
  return written_.wait_for(lock, std::chrono::minutes(1), [this] { return wrote_; });
}

QVFaultyFileSystem::Fault QVFaultyFileSystem::attemptWrite() {
  const std::lock_guard lock(mutex_);
  if (fault_ == Fault::none) {
    wrote_ = true;
    written_.notify_all();
  }
  return fault_;
}
