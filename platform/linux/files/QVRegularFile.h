#pragma once

#include "platform/linux/QVDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// A file whose writer is not trusted, opened for reading: a regular one, so that nothing waits for
// the other end of a pipe, and read into memory, so that whoever truncates it meanwhile ends
// nothing but the text. Files that the kernel makes up as they are read count as regular.
//
// Threads: one at a time. Ownership: closes its descriptor.
class QVRegularFile {
 public:
  // What a symbolic link at the end of the path is.
  enum class Links { follow, refuse };

  QVRegularFile(const std::string& path, Links links);

  // Why the file cannot be read, an error number; kIrregular where it is no regular file, 0 where
  // it is open. Nothing may be read where it is not.
  int error() const { return error_; }

  static constexpr int kIrregular = 22;  // EINVAL
  static constexpr int kTooLarge = 27;   // EFBIG

  // All of the file, from its beginning; an error number where that fails, kTooLarge where there
  // are more than `maximumBytes`.
  [[nodiscard]] int read(std::size_t maximumBytes, std::string& contents) const;
  // The first bytes alone, fewer where the file is shorter.
  [[nodiscard]] int readBeginning(std::size_t bytes, std::string& contents) const;
  // Up to so many bytes from `offset` on, for files that are read part by part; none at the end.
  [[nodiscard]] int readPart(std::uint64_t offset, std::size_t bytes, std::string& part) const;

  // An error number of these in words.
  static std::string reason(int error, std::size_t maximumBytes);

 private:
  int error_ = 0;
  QVDescriptor descriptor_;
};
