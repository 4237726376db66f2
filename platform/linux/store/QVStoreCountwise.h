#pragma once

#include "platform/QVCountwise.h"
#include "platform/linux/store/QVSQLiteEventStore.h"

#include <memory>
#include <string>
#include <utility>

// Countwise on the event store: an event is a row of countwise_event. Every event is wanted but
// those whose name the preferences domain "net.quillon.countwise" lists under "unwanted". The
// payload callback is called on the store's thread, when the row is stored, or while the store is
// out of order; where it has no thread, on the sender's.
//
// Threads: any. Events that come after the store was closed are dropped.
class QVStoreCountwise : public QVCountwise {
 public:
  explicit QVStoreCountwise(std::shared_ptr<QVSQLiteEventStore> store) : store_(std::move(store)) {}

  void sendEventLazily(std::string name, PayloadCallback payload) override {
    store_->addCountwiseEvent(std::move(name), std::move(payload));
  }

 private:
  const std::shared_ptr<QVSQLiteEventStore> store_;
};
