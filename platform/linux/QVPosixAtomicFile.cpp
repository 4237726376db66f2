#include "platform/linux/QVPosixAtomicFile.h"

#include "platform/linux/QVPosixError.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include <fcntl.h>
#include <sys/random.h>
#include <unistd.h>

namespace {

// What a new file may be at the most; the process's umask takes from it.
constexpr mode_t kMode = S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;

// Names that are tried: each is one of 2^64, so a second one is needed hardly ever.
constexpr int kNames = 16;

// After so many bytes the kernel writes them while more are made, and forgets those before them:
// what is kept of a large file is twice this, not all of it, and pages are used again while they
// are in the processor's cache.
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
    result = ::fsync(descriptor);
  } while (result != 0 && errno == EINTR);
  return result == 0;
}

}  // namespace

QVPosixAtomicFile::QVPosixAtomicFile(const std::string& path) : path_(path) {
  open();
}

QVPosixAtomicFile::~QVPosixAtomicFile() {
  abandon();
}

void QVPosixAtomicFile::open() {
  directory_ = ::open(path_.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (!check(directory_ >= 0)) return;
  for (int i = 0; i < kNames && file_ < 0; ++i) {
    temporaryName_ = arbitraryName();
    file_ = ::openat(directory_, temporaryName_.c_str(),
                     O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kMode);
    if (file_ < 0 && errno != EEXIST) break;
  }
  if (file_ < 0) temporaryName_.clear();
  if (check(file_ >= 0)) buffer_ = std::make_unique_for_overwrite<char[]>(kBufferBytes);
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
    const ssize_t count = ::write(file_, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (!check(count >= 0)) return;
    bytes.remove_prefix(static_cast<std::size_t>(count));
    written_ += static_cast<uint64_t>(count);
  }
  handOn();
}

void QVPosixAtomicFile::handOn() {
  if (written_ - handedOn_ < kHandOnBytes) return;
  const auto sync = [this](uint64_t from, uint64_t to, unsigned flags) {
    const int result =
        ::sync_file_range(file_, static_cast<off_t>(from), static_cast<off_t>(to - from), flags);
    // What failed on its way to the disk is told once, so it may not be overheard here. The call
    // itself may be refused to a service that is locked in: then the syncing at the end does it
    // all.
    check(result == 0 || errno == EPERM || errno == ENOSYS);
  };
  sync(handedOn_, written_, SYNC_FILE_RANGE_WRITE);
  if (handedOn_ > onDisk_) {
    sync(onDisk_, handedOn_,
         SYNC_FILE_RANGE_WAIT_BEFORE | SYNC_FILE_RANGE_WRITE | SYNC_FILE_RANGE_WAIT_AFTER);
    static_cast<void>(::posix_fadvise(file_, static_cast<off_t>(onDisk_),
                                      static_cast<off_t>(handedOn_ - onDisk_),
                                      POSIX_FADV_DONTNEED));
  }
  onDisk_ = std::exchange(handedOn_, written_);
}

std::optional<QVError> QVPosixAtomicFile::commit() {
  if (!failure_) writeOut({buffer_.get(), std::exchange(used_, 0)});
  if (!failure_) check(sync(file_));
  if (!failure_) check(::close(std::exchange(file_, -1)) == 0);
  if (!failure_ && check(::renameat(directory_, temporaryName_.c_str(), directory_,
                                    path_.filename().c_str()) == 0)) {
    temporaryName_.clear();
    check(sync(directory_));
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
    ::unlinkat(directory_, std::exchange(temporaryName_, {}).c_str(), 0);
  }
  if (file_ >= 0) ::close(std::exchange(file_, -1));
  if (directory_ >= 0) ::close(std::exchange(directory_, -1));
  buffer_.reset();
}
