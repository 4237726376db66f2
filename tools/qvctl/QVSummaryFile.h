#pragma once

#include "platform/QVValue.h"

#include <cstdint>
#include <filesystem>
#include <map>
#include <string>
#include <utility>
#include <vector>

// A session's summary as it lies in the log directory (docs/summary.md), written by the service
// from what applications sent: its name and its contents are hostile.
//
// Threads: as any value. Failures: QVToolFailure.
class QVSummaryFile {
 public:
  // Bytes of a file that is read; a summary of a million messages is a fifth of it.
  static constexpr std::size_t kMaximumBytes = std::size_t{512} << 20;

  // The directory's summaries, the latest first. A directory that is not there has none.
  static std::vector<QVSummaryFile> list(const std::filesystem::path& directory);
  // One of them: by its place in the list, "1" the latest, by its name, or by its path; without a
  // word the latest.
  static QVSummaryFile choose(const std::filesystem::path& directory, const std::string& word);

  const std::filesystem::path& path() const { return path_; }
  // "20261116-061300+0000", "net.example.player", "telephony"; empty where the name has none.
  const std::string& date() const { return date_; }
  const std::string& application() const { return application_; }
  const std::string& service() const { return service_; }
  // "2026-11-16 06:13:00 +0000"
  std::string dateText() const;
  uint64_t bytes() const { return bytes_; }

  std::string text() const;
  QVArray contents() const;

  // The numbers of the session's messages by their keys: each with the number of its message, from
  // 1. Without the summary event, whose values are texts.
  using Column = std::vector<std::pair<int64_t, double>>;
  struct Columns {
    int64_t messages = 0;
    std::map<std::string, Column> byKey;
  };
  static Columns columns(const QVArray& contents);

 private:
  explicit QVSummaryFile(std::filesystem::path path);

  std::filesystem::path path_;
  std::string date_;
  std::string application_;
  std::string service_;
  uint64_t bytes_ = 0;
};
