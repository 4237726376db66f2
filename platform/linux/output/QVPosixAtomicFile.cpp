#include "platform/linux/output/QVPosixAtomicFile.h"

#include "platform/linux/QVPosixError.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// What a new file may be at the most; the process's umask takes from it.
constexpr mode_t kMode = S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;

// Names that are tried: each is one of 2^64, so a second one is needed hardly ever.
constexpr int kNames = 16;

// After so many bytes the kernel begins to write them while more are made, so that the syncing at
// the end has little left to do; and forgets what has arrived of those before them, so that a large
// file takes pages that are in the processor's cache again and again, and little memory.
constexpr uint64_t kHandOnBytes = uint64_t{8} << 20;

std::string arbitraryName() {
  uint64_t number = 0;
  if (::getrandom(&number, sizeof number, 0) != sizeof number) return {};
  char name[48];
  std::snprintf(name, sizeof name, ".quietvox-%016llx.tmp",
                static_cast<unsigned long long>(number));
  return name;
}

bool sync(int descriptor) {
  int result = 0;
  do {
    result = ::fdatasync(descriptor);
  } while (result != 0 && errno == EINTR);
  return result == 0;
}

}  // namespace

QVPosixAtomicFile::QVPosixAtomicFile(const std::string& path, QVDescriptor directory)
    : path_(path), directory_(std::move(directory)) {
  open();
}

QVPosixAtomicFile::~QVPosixAtomicFile() {
  abandon();
}

void QVPosixAtomicFile::open() {
  if (!check(directory_.isOpen())) return;
  // First: what needs memory once there is a file would leave it behind.
  buffer_ = std::make_unique_for_overwrite<char[]>(kBufferBytes);
  for (int i = 0; i < kNames && !file_.isOpen(); ++i) {
    temporaryName_ = arbitraryName();
    file_ = QVDescriptor(::openat(directory_.get(), temporaryName_.c_str(),
                                  O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kMode));
    if (!file_.isOpen() && errno != EEXIST) break;
  }
  if (!file_.isOpen()) temporaryName_.clear();
  check(file_.isOpen());
}

void QVPosixAtomicFile::setAccess(mode_t mode, uid_t owner, gid_t group) {
  if (failure_) return;
  static_cast<void>(::fchown(file_.get(), owner, group));
  check(::fchmod(file_.get(), mode) == 0);
}

void QVPosixAtomicFile::write(std::string_view bytes) {
  while (!failure_ && !bytes.empty()) {
    if (used_ == 0 && bytes.size() >= kBufferBytes) {
      writeOut(bytes);
      return;
    }
    const std::string_view part = bytes.substr(0, kBufferBytes - used_);
    std::copy(part.begin(), part.end(), buffer_.get() + used_);
    used_ += part.size();
    bytes.remove_prefix(part.size());
    if (used_ == kBufferBytes) writeOut({buffer_.get(), std::exchange(used_, 0)});
  }
}

void QVPosixAtomicFile::writeOut(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(file_.get(), bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (!check(count >= 0)) return;
    bytes.remove_prefix(static_cast<std::size_t>(count));
    written_ += static_cast<uint64_t>(count);
  }
  handOn();
}

void QVPosixAtomicFile::handOn() {
  if (written_ - handedOn_ < kHandOnBytes) return;
  // Nothing is waited for. Where the call is refused, or what it began fails, the syncing at the
  // end does it all, or says so.
  static_cast<void>(::sync_file_range(file_.get(), static_cast<off_t>(handedOn_),
                                      static_cast<off_t>(written_ - handedOn_),
                                      SYNC_FILE_RANGE_WRITE));
  static_cast<void>(
      ::posix_fadvise(file_.get(), 0, static_cast<off_t>(handedOn_), POSIX_FADV_DONTNEED));
  handedOn_ = written_;
}

std::optional<QVError> QVPosixAtomicFile::commit() {
  if (!failure_) writeOut({buffer_.get(), std::exchange(used_, 0)});
  if (!failure_) check(sync(file_.get()));
  if (!failure_) check(::close(file_.release()) == 0);
  if (!failure_ && check(::renameat(directory_.get(), temporaryName_.c_str(), directory_.get(),
                                    path_.filename().c_str()) == 0)) {
    temporaryName_.clear();
  }
  abandon();
  return failure_;
}

bool QVPosixAtomicFile::check(bool succeeded) {
  if (!succeeded && !failure_) failure_ = QVMakePosixError(path_.string());
  return succeeded;
}

void QVPosixAtomicFile::abandon() {
  if (!temporaryName_.empty()) {
    ::unlinkat(directory_.get(), std::exchange(temporaryName_, {}).c_str(), 0);
  }
  file_ = {};
  directory_ = {};
  buffer_.reset();
}
