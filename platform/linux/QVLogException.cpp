#include "platform/linux/QVLogException.h"

#include <exception>

namespace {

void logReason(QVLog& log, const QVLogSite& site, std::string_view place, std::string_view name,
               std::string_view reason) noexcept {
  try {
    log.error(nullptr, site, "exception in ", place, name.empty() ? "" : " ", name, ": ", reason);
  } catch (...) {
    // Nobody is left to be told.
    return;
  }
}

}  // namespace

void QVLogException(QVLog& log, const QVLogSite& site, std::string_view place,
                    std::string_view name) noexcept {
  try {
    throw;
  } catch (const std::exception& exception) {
    logReason(log, site, place, name, exception.what());
  } catch (...) {
    logReason(log, site, place, name, "of unknown type");
  }
}
