#pragma once

#include "client/QVClientCall.h"
#include "client/QVClientCallTable.h"
#include "client/QVClientInbox.h"
#include "client/QVClientOptions.h"
#include "client/QVClientPoller.h"
#include "client/QVClientRequest.h"
#include "client/QVClientThread.h"
#include "platform/linux/QVDescriptor.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <atomic>
#include <condition_variable>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

// One connection to the service: what lies behind a QVClient.
//
//   connected --the peer ends or breaks the rules--> lost      (calls fail with connectionLost)
//       '-------the client is destroyed------------> closed    (calls fail with closed)
//
// Writing: a call is copied into `pending_` under the lock. If nobody is writing, its caller then
// swaps that buffer out and sends it without the lock; whoever comes meanwhile only adds to the
// next buffer, which the writer sends next. When the socket is full the rest is left to the thread
// that reads. So the lock is held for the copy of one call and never across a system call that
// waits.
//
// Reading: one thread at a time, the holder of `reading_`: the library's own, the one in
// dispatch(), or with a program's loop a thread that waits inside of a call. The latter must not
// run replies of other calls; it keeps those for dispatch() and rings the bell.
//
// Threads: any, but for what is marked. Ownership: shared by the QVClient and, while it runs, by
// the library's thread, so that a reply may destroy its client.
class QVClientConnection : public std::enable_shared_from_this<QVClientConnection> {
 public:
  using Deadline = std::optional<std::chrono::steady_clock::time_point>;

  QVClientConnection(QVDescriptor socket, QVClientOptions options);

  // Begins to talk to the service. Once, before anything else.
  QVClientError start();
  // Ends it: what is outstanding fails, on the callback thread. Once, last; does not wait where the
  // callback thread itself calls it.
  void close();

  // Takes a call in. Where that succeeds, its reply will run; without a reply no answer is asked
  // for. Of two calls of one thread, the first is the first to leave.
  QVClientError issue(const QVClientRequest& request, QVClientCall::Reply reply);
  // The same, and where too much is under way already, waits until there is room.
  QVClientError issueWithin(const QVClientRequest& request, QVClientCall::Reply reply,
                            Deadline deadline);
  // The same, and waits until the reply has run.
  QVClientError issueAndWait(const QVClientRequest& request, QVClientCall::Reply reply,
                             Deadline deadline);
  // Waits until every call taken in has left.
  QVClientError waitUntilSent(Deadline deadline);

  // Between these, the calling thread's calls are kept together. Batches may lie within each other.
  void beginBatch();
  void endBatch();
  // Sends what is kept.
  void flush();

  int descriptor() const noexcept { return hasOwnThread() ? -1 : poller_.descriptor(); }
  // Reads and writes what can be read and written now, and runs replies. For a program's loop.
  void dispatch();

 private:
  // A reply that is due, kept until the callback thread comes.
  struct DueReply {
    QVClientCall call;
    std::string answer;   // the message; empty:
    QVClientError error;  // what came instead
  };
  enum class Sending { idle, underWay, waitingForRoom };

  bool hasOwnThread() const { return options_.callbacks == QVClientOptions::Callbacks::ownThread; }
  bool onCallbackThread() const { return callbackThread_.load() == std::this_thread::get_id(); }
  void runOwnThread();
  void work();

  QVClientError takeIn(const QVClientRequest& request, QVClientCall& call, uint32_t& serial)
      QV_REQUIRES(mutex_);
  QVClientError issueWithin(const QVClientRequest& request, QVClientCall& call, uint32_t& serial,
                            const Deadline& deadline);
  bool holdsBack() const QV_REQUIRES(mutex_);
  // Waits for something that may help whoever waits; false when the deadline has passed.
  bool waitForProgress(QVMutexLock& lock, const Deadline& deadline) QV_REQUIRES(mutex_);
  bool waitForRoom(QVMutexLock& lock, const Deadline& deadline) QV_REQUIRES(mutex_);

  std::size_t queuedBytes() const QV_REQUIRES(mutex_) { return pending_.size() + sendingBytes_; }
  // Where this answers true, sendPending() must follow, without the lock.
  bool beginSending() QV_REQUIRES(mutex_);
  void sendPending();
  void continueSending();

  bool beginReading();
  void endReading();
  void readWhatIsThere(bool deliver);
  void takeAnswer(std::string_view bytes, bool deliver);
  void runDueReplies();
  void end(const QVClientError& error) QV_REQUIRES(mutex_);
  void finishClosing();

  const QVClientOptions options_;
  const QVDescriptor socket_;
  QVClientPoller poller_;
  QVClientThread thread_;                          // started by start()
  std::atomic<std::thread::id> callbackThread_{};  // while it may run replies
  QVClientInbox inbox_;                            // used by the holder of reading_
  std::string sendingBuffer_;  // used by whoever made sending_ underWay, as is sent_:
  std::size_t sent_ = 0;       // how much of it has left

  QVMutex mutex_;
  std::condition_variable progress_;
  QVClientCallTable calls_ QV_GUARDED_BY(mutex_);
  std::string pending_ QV_GUARDED_BY(mutex_);
  std::size_t sendingBytes_ QV_GUARDED_BY(mutex_) = 0;  // of sendingBuffer_, not sent yet
  uint64_t takenInBytes_ QV_GUARDED_BY(mutex_) = 0;     // ever; what is not queued has left
  Sending sending_ QV_GUARDED_BY(mutex_) = Sending::idle;
  bool watchesForRoom_ QV_GUARDED_BY(mutex_) = false;
  bool sendingFailed_ QV_GUARDED_BY(mutex_) = false;  // the reader will find the end
  bool reading_ QV_GUARDED_BY(mutex_) = false;
  bool closing_ QV_GUARDED_BY(mutex_) = false;
  QVClientError ended_ QV_GUARDED_BY(mutex_);  // set when lost or closed
  bool lossIsDue_ QV_GUARDED_BY(mutex_) = false;
  std::size_t waiting_ QV_GUARDED_BY(mutex_) = 0;         // threads inside of waitForProgress()
  std::size_t waitingForRoom_ QV_GUARDED_BY(mutex_) = 0;  // those of them that wait for room
  std::vector<std::thread::id> batches_ QV_GUARDED_BY(mutex_);
  std::deque<DueReply> due_ QV_GUARDED_BY(mutex_);
};
