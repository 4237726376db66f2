#pragma once

#include <string>

#include <sys/mman.h>
#include <unistd.h>

// A file in memory in the place of standard output. Threads: one.
class QVOutputFile {
 public:
  QVOutputFile() : descriptor_(::memfd_create("output", MFD_CLOEXEC)) {}
  ~QVOutputFile() { ::close(descriptor_); }
  QVOutputFile(const QVOutputFile&) = delete;
  QVOutputFile& operator=(const QVOutputFile&) = delete;

  int descriptor() const { return descriptor_; }
  std::string text() const {
    std::string text(1 << 16, '\0');
    const ssize_t count = ::pread(descriptor_, text.data(), text.size(), 0);
    text.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
    return text;
  }

 private:
  const int descriptor_;
};
