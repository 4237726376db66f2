#pragma once

#include "platform/linux/files/QVJSONReceiver.h"

#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

// A session's summary as it lies in the log directory (docs/summary.md), written by the service
// from what applications sent: its name and its contents are hostile, and it may be larger than
// memory.
//
// Threads: as any value. Failures: QVToolFailure.
class QVSummaryFile {
 public:
  // The directory's summaries, that of the session that stopped last first. A directory that is not
  // there has none.
  static std::vector<QVSummaryFile> list(const std::filesystem::path& directory);
  // One of them: by its place in the list, "1" the latest, by its name, or by its path; without a
  // word the latest.
  static QVSummaryFile choose(const std::filesystem::path& directory, const std::string& word);

  const std::filesystem::path& path() const { return path_; }
  // When the session stopped, as the name says, in microseconds since 1970; where that says
  // nothing, when the file was written.
  int64_t stopped() const { return stopped_; }
  // "net.example.player", "telephony"; empty where the name has none.
  const std::string& application() const { return application_; }
  const std::string& service() const { return service_; }
  uint64_t bytes() const { return bytes_; }

  // What the file holds, part by part. What is wrong with it may show in its middle.
  void scan(QVJSONReceiver& receiver) const;
  // Whether it is in order, to the end.
  void check() const;
  // Its text, in parts that end where a character does.
  void read(const std::function<void(std::string_view part)>& receiver) const;

 private:
  explicit QVSummaryFile(std::filesystem::path path);

  std::filesystem::path path_;
  int64_t stopped_ = 0;
  std::string application_;
  std::string service_;
  uint64_t bytes_ = 0;
};
