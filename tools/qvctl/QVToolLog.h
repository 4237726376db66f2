#pragma once

#include "platform/QVLog.h"

#include <string>
#include <vector>

// The log of adapters that qvctl uses: keeps the error lines, for the command to say what is wrong;
// others go nowhere.
//
// Threads: one at a time.
class QVToolLog final : public QVLog {
 public:
  const std::vector<std::string>& errors() const { return errors_; }

  QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                            std::string_view domain, std::string_view verboseKey,
                            int32_t registration) override;
  void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
             std::string text) override;
  void flush() override {}

 private:
  std::vector<std::string> errors_;
};
