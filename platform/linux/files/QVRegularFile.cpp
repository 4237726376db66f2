#include "platform/linux/files/QVRegularFile.h"

#include "platform/QVText.h"

#include <algorithm>
#include <cerrno>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

static_assert(QVRegularFile::kIrregular == EINVAL && QVRegularFile::kTooLarge == EFBIG);

namespace {

// Bytes asked for where the file does not say how many it has: the kernel's own files say 0.
constexpr std::size_t kStepBytes = std::size_t{16} * 1024;

}  // namespace

QVRegularFile::QVRegularFile(const std::string& path, Links links) {
  const int flags =
      O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | (links == Links::refuse ? O_NOFOLLOW : 0);
  do {
    descriptor_ = QVDescriptor(::open(path.c_str(), flags));
  } while (!descriptor_.isOpen() && errno == EINTR);
  struct stat status {};
  if (!descriptor_.isOpen() || ::fstat(descriptor_.get(), &status) != 0) {
    // A device without a driver, or a socket.
    error_ = errno == ENXIO || errno == ENODEV ? kIrregular : errno;
  } else if (!S_ISREG(status.st_mode)) {
    error_ = kIrregular;
  }
}

int QVRegularFile::read(std::size_t maximumBytes, std::string& contents) const {
  // One more than is allowed, to see that there are more.
  const int failure = readBeginning(maximumBytes + 1, contents);
  if (failure != 0) return failure;
  return contents.size() > maximumBytes ? kTooLarge : 0;
}

int QVRegularFile::readBeginning(std::size_t bytes, std::string& contents) const {
  struct stat status {};
  if (::fstat(descriptor_.get(), &status) != 0) return errno;
  const auto announced = static_cast<std::size_t>(std::max<off_t>(status.st_size, 0));
  // Room for a byte more than the file says: so one that grew since is read on to its end, and one
  // that did not takes a single read.
  std::size_t step = std::max(announced + 1, kStepBytes);
  std::size_t length = 0;
  while (length < bytes) {
    contents.resize(std::min(bytes, length + step));
    const ssize_t count = ::pread(descriptor_.get(), contents.data() + length,
                                  contents.size() - length, static_cast<off_t>(length));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    length += static_cast<std::size_t>(count);
    if (count == 0 || length == announced) break;
    step = kStepBytes;
  }
  contents.resize(length);
  return 0;
}

int QVRegularFile::readPart(std::uint64_t offset, std::size_t bytes, std::string& part) const {
  part.resize(bytes);
  ssize_t count = 0;
  do {
    count = ::pread(descriptor_.get(), part.data(), bytes, static_cast<off_t>(offset));
  } while (count < 0 && errno == EINTR);
  part.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
  return count < 0 ? errno : 0;
}

std::string QVRegularFile::reason(int error, std::size_t maximumBytes) {
  if (error == kIrregular) return "not a regular file";
  if (error == kTooLarge) return QVText("larger than ", maximumBytes, " bytes");
  return std::generic_category().message(error);
}
