#include "platform/linux/store/QVSQLiteEventStore.h"

#include "platform/linux/QVThreads.h"
#include "platform/linux/store/QVEventStoreError.h"
#include "platform/linux/store/QVEventStoreWriter.h"

#include <optional>
#include <utility>

QVSQLiteEventStore::QVSQLiteEventStore(QVLog& log, QVClock& clock, QVPreferences& preferences,
                                       QVEventStoreOptions options)
    : log_(log),
      clock_(clock),
      preferences_(preferences),
      options_(std::move(options)),
      queue_(options_.commitInterval) {}

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

void QVSQLiteEventStore::findBackends(std::shared_ptr<QVEventSession> session,
                                      QVBeaconSession::BackendsCompletion completion) {
  startWriter();
  QVEventStoreQueue::Search search{std::move(session), std::move(completion)};
  if (!queue_.search(search)) search.completion(std::nullopt);
}

void QVSQLiteEventStore::flush(std::shared_ptr<QVEventSession> session,
                               QVBeaconSession::FlushCompletion completion) {
  QVFlushRow row{time(), std::move(session), std::move(completion)};
  if (add(row, true)) return;
  row.completion(QVEventStoreClosedError());
}

void QVSQLiteEventStore::close() {
  queue_.stop();
  const QVMutexLock lock(mutex_);
  started_.store(true);
  if (writer_.joinable()) writer_.join();
}

void QVSQLiteEventStore::startWriter() {
  if (started_.load(std::memory_order_acquire)) return;
  const QVMutexLock lock(mutex_);
  if (started_.load()) return;
  writer_ = std::thread([this] {
    QVPrepareThread("qv-store", 0);
    QVEventStoreWriter({log_, clock_, preferences_}, options_, queue_).run();
  });
  started_.store(true, std::memory_order_release);
}

template <class Row>
bool QVSQLiteEventStore::add(Row& row, bool urgent) {
  startWriter();
  return queue_.add(row, urgent);
}
