#pragma once

#include "platform/QVFileSystem.h"

#include <string>

// Directories and files of the operating system.
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
  const std::string diagnosticLogRoot_;
};
