#pragma once

#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/linux/store/QVSQLiteEventStore.h"
#include "tests/support/QVStoreReader.h"
#include "tests/support/QVTemporaryRoot.h"

#include <future>
#include <memory>
#include <string>
#include <vector>

// An event store in a directory of its own, for the services that stand on it.
class QVStoreUnderTest {
 public:
  const std::shared_ptr<QVSQLiteEventStore>& store() { return store_; }
  QVFakePreferences& preferences() { return preferences_; }

  // Returns when everything that was handed over has been stored.
  void settle() {
    std::promise<void> stored;
    store_->flush(std::make_shared<QVEventSession>(),
                  [&stored](const std::optional<QVError>&) { stored.set_value(); });
    stored.get_future().wait();
  }
  // The rows that a query answers once everything is stored.
  std::vector<std::string> rows(const std::string& query) {
    settle();
    return QVStoreReader(root_.store()).rows(query);
  }

 private:
  QVTemporaryRoot root_;
  QVFakeLog log_;
  QVFakeClock clock_;
  QVFakePreferences preferences_;
  std::shared_ptr<QVSQLiteEventStore> store_ = std::make_shared<QVSQLiteEventStore>(
      log_, clock_, preferences_, QVEventStoreOptions{.path = root_.store().string()});
};
