#pragma once

#include "platform/QVJoulewell.h"
#include "platform/fake/QVFakeMisuse.h"

#include <mutex>
#include <string>
#include <vector>

// A Joulewell for tests: keeps the events in order. Checks that every event has a name.
//
// Threads: any.
class QVFakeJoulewell : public QVJoulewell {
 public:
  struct Event {
    int32_t agent = 0;
    std::string name;
    QVDictionary event;
    QVDictionary options;
  };

  void logEvent(int32_t agent, std::string_view name, const QVDictionary& event,
                const QVDictionary& options) override;

  std::vector<Event> events() const;
  void forgetEvents();
  std::vector<std::string> takeMisuses();

 private:
  QVFakeMisuse misuse_{"QVFakeJoulewell"};
  mutable std::mutex mutex_;
  std::vector<Event> events_;  // guarded by mutex_
};
