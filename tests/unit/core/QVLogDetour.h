#pragma once

#include "platform/QVPlatform.h"

#include <functional>
#include <memory>
#include <new>
#include <set>
#include <string>
#include <string_view>
#include <utility>

// Puts itself before the platform's log: a test does something with each line before it is written,
// or throws what the making of a line may throw. Threads: as the log that it stands before, with
// what the test does.
class QVLogDetour final : public QVLog {
 public:
  using Detour = QVFunction<void(std::string_view text)>;

  static void install(Detour detour) {
    auto& log = QVPlatform::shared().log;
    log = std::make_unique<QVLogDetour>(std::move(log), std::move(detour));
  }

  // From now on there is no memory for lines of these texts.
  static void failLines(const std::set<std::string, std::less<>>& texts) {
    install([texts](std::string_view text) {
      if (texts.contains(text)) throw std::bad_alloc();
    });
  }

  QVLogDetour(std::unique_ptr<QVLog> log, Detour detour)
      : log_(std::move(log)), detour_(std::move(detour)) {}

  QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                            std::string_view domain, std::string_view verboseKey,
                            int32_t registration) override {
    return log_->registerScope(enabled, code, name, domain, verboseKey, registration);
  }
  void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
             std::string text) override {
    detour_(text);
    log_->write(scope, level, site, std::move(text));
  }
  void flush() override { log_->flush(); }

 private:
  const std::unique_ptr<QVLog> log_;
  Detour detour_;
};
