#pragma once

#include "platform/QVBeacon.h"
#include "platform/QVClock.h"
#include "platform/QVCountwise.h"
#include "platform/QVLog.h"
#include "platform/QVPreferences.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/store/QVEventRows.h"
#include "platform/linux/store/QVEventStoreOptions.h"
#include "platform/linux/store/QVEventStoreQueue.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>

// The event store: one SQLite file that Beacon's, Countwise's and Joulewell's events are written to
// by one thread. The adapters of the three hold it together.
//
// Rows go through a queue (QVEventStoreQueue) to the writer (QVEventStoreWriter), which begins with
// the first of them; until then there is no thread and no file. Rows are committed 500 at a time or
// 250 ms after they came, at once where they are urgent or a flush asks for it.
//
// Threads: any, at once; no call waits for the disk but close(). Completions and payload callbacks
// run on the writer's thread and must not drop the last handle to the store.
// Ownership: shared by its adapters; log, clock and preferences outlive it.
// States: idle (no thread yet) -> running -> closed; idle -> closed.
class QVSQLiteEventStore {
 public:
  QVSQLiteEventStore(QVLog& log, QVClock& clock, QVPreferences& preferences,
                     QVEventStoreOptions options);
  ~QVSQLiteEventStore();
  QVSQLiteEventStore(const QVSQLiteEventStore&) = delete;
  QVSQLiteEventStore& operator=(const QVSQLiteEventStore&) = delete;

  // Hand events over; false once the store is closed.
  bool addSession(std::shared_ptr<QVEventSession> session, const QVDictionary& userInfo);
  bool addMessage(const std::shared_ptr<QVEventSession>& session, uint16_t category, uint16_t type,
                  const QVDictionary& payload);
  bool addCountwiseEvent(std::string name, QVCountwise::PayloadCallback payload);
  bool addJoulewellEvent(int32_t agent, std::string name, const QVDictionary& event);

  // Answers whether the store can be used, opening it where it is not open. A closed store answers
  // at once.
  void findBackends(std::shared_ptr<QVEventSession> session,
                    QVBeaconSession::BackendsCompletion completion);
  // Answers when everything that was handed over before is stored, or that it cannot be.
  void flush(std::shared_ptr<QVEventSession> session, QVBeaconSession::FlushCompletion completion);

  // Stores what was handed over, closes the file and ends the thread; returns when that is done.
  // What comes later is refused. May be called again; not from a completion.
  void close();

 private:
  void startWriter();
  template <class Row>
  bool add(Row& row, bool urgent);
  int64_t time() const { return QVEventStoreTime(clock_); }

  QVLog& log_;
  QVClock& clock_;
  QVPreferences& preferences_;
  const QVEventStoreOptions options_;
  QVEventStoreQueue queue_;

  std::atomic<bool> started_{false};  // the writer was started, or will never be
  QVMutex mutex_;
  std::thread writer_ QV_GUARDED_BY(mutex_);
};
