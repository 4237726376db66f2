#include "QVServices/Statistics/Service/QVReportingRunStep.h"

#include "platform/QVPlatform.h"

#include <exception>

namespace {

void logReason(const QVLogScope* scope, const QVLogSite& site, std::string_view what,
               std::optional<int64_t> number, std::string_view reason) noexcept {
  try {
    QVPlatform::shared().log->error(scope, site, "failed to ", what, number ? " " : "",
                                    number ? QVText(*number) : "", ": ", reason);
  } catch (...) {
    // Nobody is left to be told.
    return;
  }
}

}  // namespace

void QVReportingLogFailure(const QVLogScope* scope, const QVLogSite& site, std::string_view what,
                           std::optional<int64_t> number) noexcept {
  try {
    throw;
  } catch (const std::exception& exception) {
    logReason(scope, site, what, number, exception.what());
  } catch (...) {
    logReason(scope, site, what, number, "of unknown type");
  }
}
