#pragma once

#include "platform/QVFileSystem.h"
#include "platform/fake/QVFakeMisuse.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

// A file system for tests: a tree in memory, with directories that remember their permissions, and
// failures on demand. Names behave as on a disk: what lies below a file is no directory, a name of
// more than 255 bytes is too long, a file does not take a directory's place.
//
// A file that is being written shows under no name before it is committed; files that are dropped
// before that show in openFiles() alone, while they live.
//
// Threads: any.
class QVFakeFileSystem final : public QVFileSystem {
 public:
  static constexpr std::string_view kDiagnosticLogRoot = "/logs";
  static constexpr std::size_t kMaximumNameBytes = 255;

  enum class Step { createDirectory, open, write, rename };

  QVFakeFileSystem();

  std::string diagnosticLogRoot() const override { return std::string(kDiagnosticLogRoot); }
  [[nodiscard]] std::optional<QVError> createDirectory(const std::string& path,
                                                       uint32_t permissions) override;
  std::unique_ptr<QVAtomicFile> makeAtomicFile(const std::string& path) override;

  // The step fails from now on for this reason; a write, once so many bytes of its file fitted.
  void fail(Step step, std::errc reason, std::size_t bytes = 0);
  void recover(Step step);
  // Puts a file there, whatever was there before; its directory has to be there.
  void addFile(const std::string& path, std::string contents);
  // Puts a symbolic link there, to a directory that is none of the service's business.
  void addLink(const std::string& path);

  // Paths of all files, in order; the contents of one, nothing where there is none.
  std::vector<std::string> files() const;
  std::optional<std::string> contents(const std::string& path) const;
  // Of a directory; nothing where there is none.
  std::optional<uint32_t> permissions(const std::string& path) const;
  // Files that are being written.
  std::size_t openFiles() const;

  // Files that were written to, or committed, after they had been committed, and paths that name
  // no place.
  std::vector<std::string> takeMisuses() { return state_->misuse.take(); }

 private:
  class File;
  struct Node {
    std::optional<uint32_t> permissions{};  // of a directory
    std::string contents{};                 // of a file
    bool isLink = false;

    bool isFile() const { return !permissions && !isLink; }
  };
  // What open files share with their file system, which they may outlive.
  struct State {
    mutable std::mutex mutex;
    QVFakeMisuse misuse{"QVFakeFileSystem"};
    // Guarded by mutex.
    std::map<std::string, Node> nodes;
    std::map<Step, std::pair<std::errc, std::size_t>> failures;
    std::size_t openFiles = 0;

    // What stands in the way of the step, with the mutex held; nothing where nothing does.
    std::optional<std::errc> failure(Step step, std::size_t bytes = 0) const;
    std::optional<std::errc> obstacle(const std::string& path) const;
    std::optional<std::errc> replace(const std::string& path, std::string contents);
  };

  const std::shared_ptr<State> state_;
};
