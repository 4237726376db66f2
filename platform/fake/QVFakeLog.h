#pragma once

#include "platform/QVLog.h"

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

// A log that keeps its lines for tests to read. Threads: any, at once.
class QVFakeLog final : public QVLog {
 public:
  // How the default log is called where a scope's name would stand.
  static constexpr std::string_view kDefaultScope = "default";

  struct Line {
    QVLogLevel level;
    std::string scope;
    std::string function;
    std::string text;
    std::string file;  // without directories
    uint32_t line;

    // "5[qvrs] -[QVReportingServiceDelegate init]: text"
    std::string rendering() const;
    bool operator==(const Line&) const = default;
  };

  struct Registration {
    bool enabled;
    uint32_t code;
    std::string name;
    std::string domain;
    std::string verboseKey;
    int32_t registration;
    bool operator==(const Registration&) const = default;
  };

  // What a test makes of the default log ends with it.
  ~QVFakeLog() override { setDefaultVerbose(false); }

  QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                            std::string_view domain, std::string_view verboseKey,
                            int32_t registration) override;
  void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
             std::string text) override;
  void flush() override {}  // lines are there at once

  // Answers the verbose switch `verboseKey` from now on; read when a scope is registered.
  void setVerbose(std::string_view verboseKey, bool verbose);

  std::vector<Line> lines() const;
  std::vector<Line> linesOfScope(std::string_view scope) const;
  // The renderings of lines(), or of one scope's lines.
  std::vector<std::string> renderings() const;
  std::vector<std::string> renderingsOfScope(std::string_view scope) const;
  std::vector<Registration> registrations() const;
  // Forgets the lines, not the scopes.
  void clear();

 private:
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::vector<Line> lines_;
  std::vector<Registration> registrations_;
  std::map<std::string, bool, std::less<>> verboseSwitches_;
  std::map<std::string, std::unique_ptr<QVLogScope>, std::less<>> scopes_;
};
