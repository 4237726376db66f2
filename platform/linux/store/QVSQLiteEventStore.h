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
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>

class QVEventStoreWriter;

// The event store: one SQLite file that Beacon's, Countwise's and Joulewell's events are written to
// by one thread. The adapters of the three hold it together.
//
// Rows go through a queue (QVEventStoreQueue) to the writer (QVEventStoreWriter), which begins with
// the first of them; until then there is no thread and no file. Rows are committed once 500 wait or
// 250 ms after they came, at once where they are urgent or a flush asks for it.
//
// Where the thread cannot be had, that is tried again with each row and each search. Until then a
// search is answered with no list, and the store counts as out of order: one error line, a flush is
// answered with an error, rows are held within the same limit and stored once there is a thread, by
// close() at the latest. The writer's work that needs no disk is done by the caller meanwhile, one
// at a time; a row that comes at the same time is seen to with the next one.
//
// Threads: any, at once; no call waits for the disk but close(). Completions and payload callbacks
// run on the writer's thread, or while there is none on a caller's, without a lock; they must not
// drop the last handle to the store. Without the thread a caller may have to read the preferences.
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
  void findBackends(QVBeaconSession::BackendsCompletion completion);
  // Answers when everything that was handed over before is stored, or that it cannot be.
  void flush(std::shared_ptr<QVEventSession> session, QVBeaconSession::FlushCompletion completion);

  // Stores what was handed over, closes the file and ends the thread; returns when that is done.
  // What comes later is refused. May be called again; not from a completion.
  void close();

 private:
  bool startWriter();
  template <class Work>
  void standIn(Work work) QV_EXCLUDES(mutex_);
  template <class Row>
  bool add(Row& row, bool urgent);
  int64_t time() const { return QVEventStoreTime(clock_); }

  QVLog& log_;
  QVClock& clock_;
  const QVEventStoreOptions options_;
  QVEventStoreQueue queue_;
  // The thread's, or while there is none, the stand-in's.
  const std::unique_ptr<QVEventStoreWriter> writer_;

  std::atomic<bool> started_{false};  // the thread was started, or will never be
  QVMutex mutex_;
  bool hasStandIn_ QV_GUARDED_BY(mutex_) = false;
  std::condition_variable standInGone_;
  std::thread thread_ QV_GUARDED_BY(mutex_);
};
