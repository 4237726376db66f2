#pragma once

#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/linux/store/QVSQLiteEventStore.h"
#include "platform/linux/store/QVStoreBeacon.h"
#include "platform/linux/store/QVStoreCountwise.h"
#include "platform/linux/store/QVStoreJoulewell.h"
#include "tests/support/QVStoreReader.h"
#include "tests/support/QVTemporaryRoot.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

// An event store in a directory of its own, with the three services on it. Nothing is committed
// for its age unless a test shortens `options.commitInterval`, nothing tried again unless it
// shortens `options.retryInterval`, both before the first call.
class QVStoreFixture : public ::testing::Test {
 public:
  struct SessionOptions {
    int64_t sessionID = 4711;
    bool realtime = false;
    QVDictionary userInfo{{kBeaconUserInfoClientName, "net.quillon.quietvox"},
                          {kBeaconUserInfoServiceName, "media_session"}};
  };

 protected:
  QVStoreFixture();
  ~QVStoreFixture() override;

  QVSQLiteEventStore& store();
  std::shared_ptr<QVSQLiteEventStore> shared();
  QVStoreBeacon beacon() { return QVStoreBeacon(shared()); }
  // Ends the store and begins a new one on the same file.
  void restart();
  void close();

  std::shared_ptr<QVBeaconSession> openSession(const SessionOptions& session);
  std::shared_ptr<QVBeaconSession> openSession() { return openSession(SessionOptions()); }
  void send(QVBeaconSession& session, const QVDictionary& payload, uint16_t category = 3,
            uint16_t type = 1);
  void sendSingle(const QVDictionary& payload);
  void sendCountwise(const std::string& name, const QVDictionary& payload);
  void logJoulewell(const QVDictionary& event);

  // The list that a search of a new session ends with.
  std::optional<QVArray> findBackends();
  // The error that the session's flush ends with.
  std::optional<QVError> flush(QVBeaconSession& session);
  // Commits all that was sent, through a session's flush.
  void flushAll();
  // Returns when the writer has done what was due before, without making anything due.
  void awaitWriter();

  std::string path() const { return root_.store().string(); }
  std::vector<std::string> rows(const std::string& query) const;
  int64_t count(const std::string& table) const;
  int64_t number(const std::string& query) const;
  // Of as many messages as analytics events, numbered from 0 as "n" in this order, the newest are
  // stored, about as many of each; answers how many of both are not.
  int64_t expectNewest(int64_t ofEach) const;
  // The losses by cause, "cause|count".
  std::vector<std::string> losses() const;
  // Log lines of the level.
  std::vector<std::string> lines(QVLogLevel level) const;

  QVTemporaryRoot root_;
  QVFakeLog log_;
  QVFakeClock clock_;
  QVFakePreferences preferences_;
  QVEventStoreOptions options_;

 private:
  std::shared_ptr<QVSQLiteEventStore> store_;
};
