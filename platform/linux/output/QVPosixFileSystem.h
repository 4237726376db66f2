#pragma once

#include "platform/QVFileSystem.h"
#include "platform/linux/QVDescriptor.h"

#include <string>
#include <string_view>
#include <utility>

// Directories and files of the operating system. Below the root every directory is opened by its
// name in the one above it, and never through a symbolic link.
//
// Threads: any, at once.
class QVPosixFileSystem final : public QVFileSystem {
 public:
  explicit QVPosixFileSystem(std::string diagnosticLogRoot)
      : diagnosticLogRoot_(std::move(diagnosticLogRoot)) {}

  std::string diagnosticLogRoot() const override { return diagnosticLogRoot_; }
  [[nodiscard]] std::optional<QVError> createDirectory(const std::string& path,
                                                       uint32_t permissions) override;
  std::unique_ptr<QVAtomicFile> makeAtomicFile(const std::string& path) override;

 private:
  // The directory that lies `below` the root; not open, with errno set, where it cannot be opened,
  // and then `failed` is the path of the part that failed. Missing parts are made where there are
  // permissions for them.
  QVDescriptor openDirectory(std::string_view below, std::optional<uint32_t> permissions,
                             std::string& failed) const;

  const std::string diagnosticLogRoot_;
};
