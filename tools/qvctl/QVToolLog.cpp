#include "tools/qvctl/QVToolLog.h"

#include <utility>

QVLogScope* QVToolLog::registerScope(bool /*enabled*/, uint32_t /*code*/, std::string_view /*name*/,
                                     std::string_view /*domain*/, std::string_view /*verboseKey*/,
                                     int32_t /*registration*/) {
  return nullptr;
}

void QVToolLog::write(const QVLogScope* /*scope*/, QVLogLevel level, const QVLogSite& /*site*/,
                      std::string text) {
  if (level == QVLogLevel::error) errors_.push_back(std::move(text));
}
