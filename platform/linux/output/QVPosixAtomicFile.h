#pragma once

#include "platform/QVFileSystem.h"
#include "platform/linux/QVDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>

#include <sys/types.h>

// A file that is written beside the place that it shall take: into a hidden file of an arbitrary
// name in the same directory, which is synced and renamed. The renaming itself is not waited for:
// after a loss of power the place may have what was there before. Whatever goes wrong before the
// renaming, and when the object is dropped, that file is removed; only a service that is killed
// meanwhile leaves it behind.
//
// The file is readable by the service's group and, where the process's umask lets them, by others,
// unless it is said otherwise.
// A link that somebody laid under the name is replaced, not followed.
//
// Threads: one at a time.
class QVPosixAtomicFile final : public QVAtomicFile {
 public:
  // What is held back to be written at once, in bytes.
  static constexpr std::size_t kBufferBytes = std::size_t{64} * 1024;

  // `directory` is the path's; where it is not open, errno says why.
  QVPosixAtomicFile(const std::string& path, QVDescriptor directory);
  ~QVPosixAtomicFile() override;
  QVPosixAtomicFile(const QVPosixAtomicFile&) = delete;
  QVPosixAtomicFile& operator=(const QVPosixAtomicFile&) = delete;

  // Who may do what with the file, in place of the usual, before anything is written: what is put
  // in a file's place can be read by those alone who could read that. Only root can give a file
  // away; where the process may not, it stays its own.
  void setAccess(mode_t mode, uid_t owner, gid_t group);

  void write(std::string_view bytes) override;
  [[nodiscard]] std::optional<QVError> commit() override;

 private:
  void open();
  void writeOut(std::string_view bytes);
  // Has the kernel begin to write what it was given so far.
  void handOn();
  // Keeps the first failure; answers whether there is none.
  bool check(bool succeeded);
  void abandon();

  const std::filesystem::path path_;
  QVDescriptor directory_;
  QVDescriptor file_;
  std::string temporaryName_;  // empty once there is no such file
  std::unique_ptr<char[]> buffer_;
  std::size_t used_ = 0;
  uint64_t written_ = 0;
  uint64_t handedOn_ = 0;
  std::optional<QVError> failure_;
};
