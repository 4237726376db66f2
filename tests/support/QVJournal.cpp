#include "tests/support/QVJournal.h"

#include "platform/QVText.h"

#include <algorithm>
#include <cstdio>
#include <iterator>
#include <utility>

namespace {

class JournalledLog final : public QVLog {
 public:
  JournalledLog(std::unique_ptr<QVLog> log, QVJournal& journal)
      : log_(std::move(log)), journal_(journal) {}

  QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                            std::string_view domain, std::string_view verboseKey,
                            int32_t registration) override {
    return log_->registerScope(enabled, code, name, domain, verboseKey, registration);
  }
  void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
             std::string text) override {
    journal_.note(logEntry(level, scope == nullptr ? std::string_view("default") : scope->name,
                           site.function, text));
    log_->write(scope, level, site, std::move(text));
  }
  void flush() override {
    journal_.note("log flushed");
    log_->flush();
  }

 private:
  const std::unique_ptr<QVLog> log_;
  QVJournal& journal_;
};

class JournalledTracePoints final : public QVTracePoints {
 public:
  JournalledTracePoints(std::unique_ptr<QVTracePoints> tracePoints, QVJournal& journal)
      : tracePoints_(std::move(tracePoints)), journal_(journal) {}

  void trace(uint32_t code, uint64_t first, uint64_t second, uint64_t third,
             uint64_t fourth) override {
    journal_.note(traceEntry(code));
    tracePoints_->trace(code, first, second, third, fourth);
  }

 private:
  const std::unique_ptr<QVTracePoints> tracePoints_;
  QVJournal& journal_;
};

class JournalledCountwise final : public QVCountwise {
 public:
  JournalledCountwise(std::unique_ptr<QVCountwise> countwise, QVJournal& journal)
      : countwise_(std::move(countwise)), journal_(journal) {}

  void sendEventLazily(std::string name, PayloadCallback payload) override {
    journal_.note("countwise " + name);
    countwise_->sendEventLazily(std::move(name), std::move(payload));
  }

 private:
  const std::unique_ptr<QVCountwise> countwise_;
  QVJournal& journal_;
};

class JournalledJoulewell final : public QVJoulewell {
 public:
  JournalledJoulewell(std::unique_ptr<QVJoulewell> joulewell, QVJournal& journal)
      : joulewell_(std::move(joulewell)), journal_(journal) {}

  void logEvent(int32_t agent, std::string_view name, const QVDictionary& event,
                const QVDictionary& options) override {
    journal_.note(QVText("joulewell ", name));
    joulewell_->logEvent(agent, name, event, options);
  }

 private:
  const std::unique_ptr<QVJoulewell> joulewell_;
  QVJournal& journal_;
};

class JournalledOrientation final : public QVOrientation {
 public:
  JournalledOrientation(std::unique_ptr<QVOrientation> orientation, QVJournal& journal)
      : orientation_(std::move(orientation)), journal_(journal) {}

  void QVRegisterDeviceOrientation(std::string_view callbackID, Callback callback) override {
    journal_.note(QVText("register device ", callbackID));
    orientation_->QVRegisterDeviceOrientation(callbackID, std::move(callback));
  }
  void QVRegisterUIOrientation(std::string_view callbackID, Callback callback) override {
    journal_.note(QVText("register ui ", callbackID));
    orientation_->QVRegisterUIOrientation(callbackID, std::move(callback));
  }
  void QVUnregisterDeviceOrientation(std::string_view callbackID) override {
    journal_.note(QVText("unregister device ", callbackID));
    orientation_->QVUnregisterDeviceOrientation(callbackID);
  }
  void QVUnregisterUIOrientation(std::string_view callbackID) override {
    journal_.note(QVText("unregister ui ", callbackID));
    orientation_->QVUnregisterUIOrientation(callbackID);
  }

 private:
  const std::unique_ptr<QVOrientation> orientation_;
  QVJournal& journal_;
};

template <class Journalled, class Interface>
void insert(std::unique_ptr<Interface>& member, QVJournal& journal) {
  member = std::make_unique<Journalled>(std::move(member), journal);
}

}  // namespace

void QVJournal::listenTo(QVPlatform& platform) {
  insert<JournalledLog>(platform.log, *this);
  insert<JournalledTracePoints>(platform.tracePoints, *this);
  insert<JournalledCountwise>(platform.countwise, *this);
  insert<JournalledJoulewell>(platform.joulewell, *this);
  insert<JournalledOrientation>(platform.orientation, *this);
}

std::vector<std::string> QVJournal::entries(std::string_view prefix) const {
  std::vector<std::string> found;
  std::ranges::copy_if(entries_, std::back_inserter(found),
                       [prefix](const std::string& entry) { return entry.starts_with(prefix); });
  return found;
}

std::vector<std::string> QVJournal::take() {
  return std::exchange(entries_, {});
}

std::string logEntry(QVLogLevel level, std::string_view scope, std::string_view function,
                     std::string_view text) {
  return QVText(static_cast<int>(level), '[', scope, "] ", function, ": ", text);
}

std::string traceEntry(uint32_t code) {
  char text[24];
  std::snprintf(text, sizeof text, "trace %08x", code);
  return text;
}
