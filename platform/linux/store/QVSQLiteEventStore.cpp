#include "platform/linux/store/QVSQLiteEventStore.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/QVThreads.h"
#include "platform/linux/store/QVEventStoreError.h"
#include "platform/linux/store/QVEventStoreWriter.h"

#include <exception>
#include <optional>
#include <utility>

QVSQLiteEventStore::QVSQLiteEventStore(QVLog& log, QVClock& clock, QVPreferences& preferences,
                                       QVEventStoreOptions options)
    : log_(log),
      clock_(clock),
      options_(std::move(options)),
      queue_(options_.commitInterval),
      writer_(std::make_unique<QVEventStoreWriter>(
          QVEventStoreWriter::Services{log, clock, preferences}, options_, queue_)) {}

QVSQLiteEventStore::~QVSQLiteEventStore() {
  close();
}

bool QVSQLiteEventStore::addSession(std::shared_ptr<QVEventSession> session,
                                    const QVDictionary& userInfo) {
  QVBeaconSessionRow row{time(), std::move(session), userInfo};
  return add(row, false);
}

bool QVSQLiteEventStore::addMessage(const std::shared_ptr<QVEventSession>& session,
                                    uint16_t category, uint16_t type, const QVDictionary& payload) {
  QVBeaconMessageRow row{time(), session, category, type, payload};
  return add(row, session->containsRealtimeEvents);
}

bool QVSQLiteEventStore::addCountwiseEvent(std::string name, QVCountwise::PayloadCallback payload) {
  QVCountwiseRow row{time(), std::move(name), std::move(payload)};
  return add(row, false);
}

bool QVSQLiteEventStore::addJoulewellEvent(int32_t agent, std::string name,
                                           const QVDictionary& event) {
  QVJoulewellRow row{time(), agent, std::move(name), event};
  return add(row, false);
}

void QVSQLiteEventStore::findBackends(QVBeaconSession::BackendsCompletion completion) {
  if (!startWriter() || !queue_.search(completion)) completion(std::nullopt);
}

void QVSQLiteEventStore::flush(std::shared_ptr<QVEventSession> session,
                               QVBeaconSession::FlushCompletion completion) {
  QVFlushRow row{time(), std::move(session), std::move(completion)};
  if (add(row, true)) return;
  row.completion(QVEventStoreClosedError());
}

void QVSQLiteEventStore::close() {
  queue_.stop();
  QVMutexLock lock(mutex_);
  while (hasStandIn_) lock.wait(standInGone_);
  if (!started_.exchange(true)) {
    // Nothing was handed over, or it was and there is still no thread.
    hasStandIn_ = true;
    lock.unlock();
    standIn([this] { writer_->run(); });
    lock.lock();
  }
  if (thread_.joinable()) thread_.join();
}

// Is the writer at work, or will it never be again?
bool QVSQLiteEventStore::startWriter() {
  if (started_.load(std::memory_order_acquire)) return true;
  QVMutexLock lock(mutex_);
  if (started_.load()) return true;
  if (hasStandIn_) return false;
  try {
    thread_ = options_.makeThread([this] {
      QVPrepareThread("qv-store", 0);
      writer_->run();
    });
  } catch (const std::exception& failure) {
    hasStandIn_ = true;
    lock.unlock();
    standIn([&] { writer_->hold(failure.what()); });
    return false;
  }
  started_.store(true, std::memory_order_release);
  return true;
}

// By whoever has set `hasStandIn_`.
template <class Work>
void QVSQLiteEventStore::standIn(Work work) {
  try {
    work();
  } catch (...) {
    // For want of memory.
    QVLogException(log_, "-[QVSQLiteEventStore standIn]", "the event store", options_.path);
  }
  const QVMutexLock lock(mutex_);
  hasStandIn_ = false;
  // Under the lock: who waits for this may destroy the store.
  standInGone_.notify_all();
}

template <class Row>
bool QVSQLiteEventStore::add(Row& row, bool urgent) {
  if (!queue_.add(row, urgent)) return false;
  startWriter();
  return true;
}
