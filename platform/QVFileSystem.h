#pragma once

#include "platform/QVError.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

// Writes one file so that readers see the old contents or the new ones, never a part: bytes go to
// a temporary file in the same directory, which takes the name's place when all is on the disk. It
// is not waited until that is there, too: a loss of power may bring the old contents back. Dropped
// before that, it leaves nothing behind. Extra memory: one buffer of fixed size.
//
// Threads: one at a time. Blocks on the disk.
class QVAtomicFile {
 public:
  virtual ~QVAtomicFile() = default;
  // Appends. After the first failure bytes are dropped, and the failure is kept for commit().
  virtual void write(std::string_view bytes) = 0;
  // Syncs the contents, moves into place and ends the writing; answers what went wrong, at any step
  // so far.
  [[nodiscard]] virtual std::optional<QVError> commit() = 0;
};

// The part of the file system that the core writes to: what lies below the diagnostic-log root.
//
// The root is the administrator's. Below it anybody may be let in: so a symbolic link in the place
// of a directory there is a failure, and nothing is made or written behind it. Paths that lie
// elsewhere, or have empty parts, "." or "..", fail.
//
// Threads: any, at once. Blocks on the disk. Failures are answered, with the path in their
// description; nothing is logged.
class QVFileSystem {
 public:
  virtual ~QVFileSystem() = default;
  // The directory under which diagnostic logs lie. Need not exist.
  virtual std::string diagnosticLogRoot() const = 0;
  // Makes the directory and those above it that are missing, the root as well, each with exactly
  // these permissions (the process's umask does not count); existing ones are left alone.
  [[nodiscard]] virtual std::optional<QVError> createDirectory(const std::string& path,
                                                               uint32_t permissions) = 0;
  // Begins a file; what cannot be opened fails in commit().
  virtual std::unique_ptr<QVAtomicFile> makeAtomicFile(const std::string& path) = 0;
};
