#include "client/QVClientConnection.h"

#include "client/QVClientSocket.h"
#include "platform/linux/bus/QVBusAuthClient.h"
#include "platform/linux/bus/QVBusMessage.h"

#include <algorithm>
#include <cassert>
#include <new>
#include <utility>

#include <sys/socket.h>
#include <unistd.h>

namespace {

using Operation = QVReportingServiceOperation;

// Bytes of calls that a batch keeps together. A write of this size costs next to nothing more per
// call than a larger one, and the service gets to work meanwhile.
constexpr std::size_t kBatchBytes = std::size_t{64} << 10;

// Bytes of memory that each of the two buffers keeps when it is empty.
constexpr std::size_t kKeptBufferBytes = std::size_t{256} << 10;

// Writes that one call makes on behalf of others before it leaves the rest to the reading thread.
constexpr int kMaximumWrites = 4;

// Reads in a row, so that a program's loop gets round to its other descriptors: 1 MiB.
constexpr int kMaximumReads = 16;

QVClientError closedError() {
  return {QVClientError::Code::closed, "the client was closed"};
}

QVClientError timedOutError(const char* text) {
  return {QVClientError::Code::timedOut, text};
}

QVClientError wouldDeadlockError() {
  return {QVClientError::Code::wouldDeadlock,
          "a reply cannot wait for another one: both run on the same thread"};
}

}  // namespace

QVClientConnection::QVClientConnection(QVDescriptor socket, QVClientOptions options)
    : options_(std::move(options)),
      socket_(std::move(socket)),
      poller_(socket_.get(), hasOwnThread()),
      calls_(options_.maximumOutstandingCalls) {}

QVClientError QVClientConnection::start() {
  if (!poller_.isOpen()) {
    return {QVClientError::Code::cannotConnect,
            "no descriptors left to watch the connection to the service"};
  }
  bool send = false;
  {
    QVMutexLock lock(mutex_);
    pending_ = QVBusAuthClient::opening(geteuid());
    takenInBytes_ = pending_.size();
    send = beginSending();
  }
  if (send) sendPending();
  if (!hasOwnThread()) return {};

  return thread_.start([self = shared_from_this()] { self->runOwnThread(); });
}

void QVClientConnection::close() {
  flush();
  {
    QVMutexLock lock(mutex_);
    closing_ = true;
  }
  const bool inReply = onCallbackThread();
  if (hasOwnThread()) {
    poller_.ring();
    if (!thread_.joinable()) return;
    if (inReply) {
      thread_.detach();
    } else {
      thread_.join();
    }
  } else if (!inReply) {
    callbackThread_ = std::this_thread::get_id();
    finishClosing();
    callbackThread_ = std::thread::id();
  }
}

void QVClientConnection::finishClosing() {
  try {
    {
      QVMutexLock lock(mutex_);
      if (closing_) end(closedError());
    }
    runDueReplies();
  } catch (const std::bad_alloc&) {
    // The replies that are left cannot be told; the program goes on.
  }
}

void QVClientConnection::runOwnThread() {
  callbackThread_ = std::this_thread::get_id();
  for (bool ended = false; !ended;) {
    poller_.wait();
    work();
    QVMutexLock lock(mutex_);
    ended = closing_ || ended_;
  }
  finishClosing();
  // The system may give the same ID to a thread of the program's.
  callbackThread_ = std::thread::id();
}

void QVClientConnection::dispatch() {
  if (hasOwnThread() || onCallbackThread()) return;
  callbackThread_ = std::this_thread::get_id();
  work();
  // A reply may have destroyed the client.
  bool closing = false;
  {
    QVMutexLock lock(mutex_);
    closing = closing_;
  }
  if (closing) finishClosing();
  callbackThread_ = std::thread::id();
}

void QVClientConnection::work() {
  poller_.silence();
  continueSending();
  if (beginReading()) {
    // What a waiting thread left here came before what is still in the socket.
    runDueReplies();
    readWhatIsThere(true);
    endReading();
  }
  runDueReplies();
  // What the replies sent was kept together until now.
  flush();
}

// Calls.

QVClientError QVClientConnection::issue(const QVClientRequest& request, QVClientCall::Reply reply) {
  if (QVClientError error = request.check()) return error;
  QVClientCall call{std::move(reply), nullptr, request.operation == Operation::killService};
  uint32_t serial = 0;
  for (bool again = true;; again = false) {
    QVClientError error;
    bool send = false;
    {
      QVMutexLock lock(mutex_);
      error = takeIn(request, call, serial);
      if (!error && holdsBack()) return {};
      send = beginSending();
    }
    if (send) sendPending();
    // It may have been a batch that filled the queue, not the service.
    const bool mayFit = send && error.code() == QVClientError::Code::queueFull;
    if (!mayFit || !again) return error;
  }
}

QVClientError QVClientConnection::issueWithin(const QVClientRequest& request,
                                              QVClientCall::Reply reply, Deadline deadline) {
  QVClientCall call{std::move(reply), nullptr, request.operation == Operation::killService};
  uint32_t serial = 0;
  return issueWithin(request, call, serial, deadline);
}

QVClientError QVClientConnection::issueWithin(const QVClientRequest& request, QVClientCall& call,
                                              uint32_t& serial, const Deadline& deadline) {
  if (onCallbackThread()) return wouldDeadlockError();
  if (QVClientError error = request.check()) return error;
  for (bool taken = false; !taken;) {
    bool send = false;
    {
      QVMutexLock lock(mutex_);
      QVClientError error = takeIn(request, call, serial);
      if (error && error.code() != QVClientError::Code::queueFull) return error;
      taken = !error;
      send = beginSending();
      if (!taken && !send && !waitForRoom(lock, deadline)) {
        return timedOutError("the service did not read within the time limit");
      }
    }
    if (send) sendPending();
  }
  return {};
}

QVClientError QVClientConnection::issueAndWait(const QVClientRequest& request,
                                               QVClientCall::Reply reply, Deadline deadline) {
  bool done = false;
  uint32_t serial = 0;
  QVClientCall call{std::move(reply), &done, request.operation == Operation::killService};
  if (QVClientError error = issueWithin(request, call, serial, deadline)) return error;
  QVMutexLock lock(mutex_);
  while (!done) {
    if (waitForProgress(lock, deadline)) continue;
    if (done) break;
    if (calls_.abandon(serial)) {
      return timedOutError("the service did not answer within the time limit");
    }
    // The answer is being handed over at this very moment.
    deadline.reset();
  }
  return {};
}

// Lets go of the lock in a way that the compiler's analysis cannot follow.
QVClientError QVClientConnection::waitUntilSent(Deadline deadline) QV_NO_THREAD_SAFETY_ANALYSIS {
  if (onCallbackThread()) return wouldDeadlockError();
  QVMutexLock lock(mutex_);
  // What others add meanwhile is theirs to wait for; what a batch keeps back must leave.
  const uint64_t last = takenInBytes_;
  while (!ended_ && !sendingFailed_) {
    if (takenInBytes_ - queuedBytes() >= last) return {};
    if (beginSending()) {
      lock.unlock();
      sendPending();
      lock.lock();
    } else if (!waitForRoom(lock, deadline)) {
      return timedOutError("the service did not read within the time limit");
    }
  }
  return ended_ ? ended_
                : QVClientError(QVClientError::Code::connectionLost, "the service is gone");
}

// Moves `call` into the table where that succeeds.
QVClientError QVClientConnection::takeIn(const QVClientRequest& request, QVClientCall& call,
                                         uint32_t& serial) {
  if (ended_) return ended_;
  if (closing_) return closedError();
  if (sendingFailed_) return {QVClientError::Code::connectionLost, "the service is gone"};
  const std::size_t bytes = request.messageBytes();
  const std::size_t queued = queuedBytes();
  if (queued != 0 && queued + bytes > options_.maximumQueuedBytes) {
    return {QVClientError::Code::queueFull, "the service does not read: too much waits for it"};
  }
  const bool answered = !std::holds_alternative<std::monostate>(call.reply);
  if (answered && calls_.isFull()) {
    return {QVClientError::Code::queueFull, "too many calls are unanswered"};
  }
  try {
    if (answered) calls_.prepare();
    if (pending_.capacity() - pending_.size() < bytes) {
      pending_.reserve(std::max(2 * pending_.capacity(), pending_.size() + bytes));
    }
  } catch (const std::bad_alloc&) {
    return {QVClientError::Code::outOfMemory, "no memory for the call"};
  }
  serial = answered ? calls_.insert(std::move(call)) : calls_.unansweredSerial();
  request.appendTo(pending_, serial, answered);
  takenInBytes_ += bytes;
  return {};
}

bool QVClientConnection::holdsBack() const {
  const std::size_t most = std::min(kBatchBytes, options_.maximumQueuedBytes / 2);
  if (pending_.size() >= most) return false;
  const auto me = std::this_thread::get_id();
  return onCallbackThread() || std::find(batches_.begin(), batches_.end(), me) != batches_.end();
}

void QVClientConnection::beginBatch() {
  QVMutexLock lock(mutex_);
  batches_.push_back(std::this_thread::get_id());
}

void QVClientConnection::endBatch() {
  bool send = false;
  {
    QVMutexLock lock(mutex_);
    const auto own = std::find(batches_.begin(), batches_.end(), std::this_thread::get_id());
    assert(own != batches_.end());
    batches_.erase(own);
    send = !holdsBack() && beginSending();
  }
  if (send) sendPending();
}

void QVClientConnection::flush() {
  bool send = false;
  {
    QVMutexLock lock(mutex_);
    send = beginSending();
  }
  if (send) sendPending();
}

bool QVClientConnection::waitForRoom(QVMutexLock& lock, const Deadline& deadline) {
  ++waitingForRoom_;
  const bool inTime = waitForProgress(lock, deadline);
  --waitingForRoom_;
  return inTime;
}

// Lets go of the lock in a way that the compiler's analysis cannot follow.
bool QVClientConnection::waitForProgress(QVMutexLock& lock,
                                         const Deadline& deadline) QV_NO_THREAD_SAFETY_ANALYSIS {
  if (deadline && std::chrono::steady_clock::now() >= *deadline) return false;
  // Whoever reads, or is writing right now, will say so when there is news.
  if (hasOwnThread() || reading_ || sending_ == Sending::underWay) {
    ++waiting_;
    if (deadline) {
      static_cast<void>(lock.waitUntil(progress_, *deadline));
    } else {
      lock.wait(progress_);
    }
    --waiting_;
    return true;
  }
  // Nobody reads unless this thread does.
  reading_ = true;
  lock.unlock();
  poller_.waitForSocket(deadline);
  continueSending();
  readWhatIsThere(false);
  lock.lock();
  reading_ = false;
  progress_.notify_all();
  return true;
}

// Writing.

bool QVClientConnection::beginSending() {
  if (sending_ != Sending::idle || pending_.empty() || sendingFailed_ || ended_) return false;
  sending_ = Sending::underWay;
  std::swap(pending_, sendingBuffer_);
  sendingBytes_ = sendingBuffer_.size();
  sent_ = 0;
  return true;
}

void QVClientConnection::continueSending() {
  {
    QVMutexLock lock(mutex_);
    if (sending_ != Sending::waitingForRoom) return;
    sending_ = Sending::underWay;
  }
  sendPending();
}

void QVClientConnection::sendPending() {
  for (int writes = 1;; ++writes) {
    const QVClientTransfer transfer =
        QVClientSend(socket_.get(), sendingBuffer_.data() + sent_, sendingBuffer_.size() - sent_);
    sent_ += transfer.bytes;

    QVMutexLock lock(mutex_);
    sendingBytes_ -= transfer.bytes;
    const bool everything = transfer.state == QVClientTransfer::State::done;
    const bool failed = transfer.state == QVClientTransfer::State::failed || ended_;
    const bool enough = everything && !pending_.empty() && writes == kMaximumWrites;
    if (waitingForRoom_ != 0 || (waiting_ != 0 && !hasOwnThread())) progress_.notify_all();
    if (failed) {
      // What the service said before it went is still to be read; then comes the end.
      sendingFailed_ = true;
      pending_.clear();
      shutdown(socket_.get(), SHUT_RDWR);
    }
    if (failed || everything) {
      sendingBytes_ = 0;
      sendingBuffer_.clear();
      sent_ = 0;
      if (sendingBuffer_.capacity() > kKeptBufferBytes) std::string().swap(sendingBuffer_);
    }
    sending_ = failed || (everything && !enough) ? Sending::idle : Sending::waitingForRoom;
    const bool watch = sending_ == Sending::waitingForRoom;
    if (watch != watchesForRoom_) poller_.watchForRoom(watch);
    watchesForRoom_ = watch;
    if (!beginSending()) return;
  }
}

// Reading.

bool QVClientConnection::beginReading() {
  QVMutexLock lock(mutex_);
  if (reading_ || ended_ || closing_) return false;
  reading_ = true;
  return true;
}

void QVClientConnection::endReading() {
  QVMutexLock lock(mutex_);
  reading_ = false;
  if (waiting_ != 0 && !hasOwnThread()) progress_.notify_all();
}

void QVClientConnection::readWhatIsThere(bool deliver) {
  for (int reads = 0; reads < kMaximumReads; ++reads) {
    const QVClientInbox::Reading reading = inbox_.receive(socket_.get());
    for (std::string_view message; inbox_.next(message);) takeAnswer(message, deliver);
    if (!inbox_.failure().empty()) {
      QVMutexLock lock(mutex_);
      // A client that a reply has destroyed is closed, whatever the service does.
      if (!closing_) end({QVClientError::Code::connectionLost, inbox_.failure()});
      return;
    }
    if (reading != QVClientInbox::Reading::full) return;
  }
}

void QVClientConnection::takeAnswer(std::string_view bytes, bool deliver) {
  QVBusMessage message;
  if (const char* reason = message.parse(bytes)) {
    inbox_.reject(reason);
    return;
  }
  // The service may not call us, and its signals, should it ever have any, are not for us.
  if (message.type() != QVBusMessageType::methodReturn &&
      message.type() != QVBusMessageType::error) {
    return;
  }
  QVClientCall call;
  {
    QVMutexLock lock(mutex_);
    // Second answers, and answers that nobody waits for any more, find no call.
    if (closing_ || !calls_.take(message.replySerial(), call)) return;
    if (waitingForRoom_ != 0) progress_.notify_all();
    if (call.done == nullptr && !deliver) {
      due_.push_back({std::move(call), std::string(bytes), {}});
      poller_.ring();
      return;
    }
  }
  QVClientFinish(call, message);
  if (call.done == nullptr) return;
  QVMutexLock lock(mutex_);
  *call.done = true;
  progress_.notify_all();
}

void QVClientConnection::runDueReplies() {
  for (;;) {
    DueReply due;
    bool isLoss = false;
    {
      QVMutexLock lock(mutex_);
      if (!due_.empty()) {
        due = std::move(due_.front());
        due_.pop_front();
      } else if (lossIsDue_) {
        isLoss = true;
        lossIsDue_ = false;
        due.error = ended_;
      } else {
        return;
      }
    }
    if (isLoss) {
      if (options_.connectionLost) options_.connectionLost(due.error);
    } else if (due.answer.empty()) {
      QVClientFail(due.call, due.error);
    } else if (QVBusMessage message; message.parse(due.answer) == nullptr) {
      QVClientFinish(due.call, message);
    }
  }
}

// Every call that has no answer yet gets the error instead; then comes the loss.
void QVClientConnection::end(const QVClientError& error) {
  if (ended_) return;
  ended_ = error;
  lossIsDue_ = error.code() == QVClientError::Code::connectionLost;
  pending_.clear();
  for (QVClientCall& call : calls_.takeAll()) {
    if (call.done == nullptr) {
      due_.push_back({std::move(call), {}, error});
    } else {
      // The reply of a waiting call only keeps the error for it: no code of the program's.
      QVClientFail(call, error);
      *call.done = true;
    }
  }
  poller_.forgetSocket();
  shutdown(socket_.get(), SHUT_RDWR);
  progress_.notify_all();
  poller_.ring();
}
