#pragma once

#include "platform/QVLog.h"

// The log of adapters that qvctl uses: error lines go to standard error, others nowhere.
//
// Threads: one at a time.
class QVToolLog final : public QVLog {
 public:
  QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                            std::string_view domain, std::string_view verboseKey,
                            int32_t registration) override;
  void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
             std::string text) override;
  void flush() override {}
};
