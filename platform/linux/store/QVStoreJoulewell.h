#pragma once

#include "platform/QVJoulewell.h"
#include "platform/linux/store/QVSQLiteEventStore.h"

#include <memory>
#include <string>
#include <utility>

// Joulewell on the event store: an event is a row of joulewell_event. Options have no meaning
// here.
//
// Threads: any. Events that come after the store was closed are dropped.
class QVStoreJoulewell : public QVJoulewell {
 public:
  explicit QVStoreJoulewell(std::shared_ptr<QVSQLiteEventStore> store) : store_(std::move(store)) {}

  void logEvent(int32_t agent, std::string_view name, const QVDictionary& event,
                const QVDictionary&) override {
    store_->addJoulewellEvent(agent, std::string(name), event);
  }

 private:
  const std::shared_ptr<QVSQLiteEventStore> store_;
};
