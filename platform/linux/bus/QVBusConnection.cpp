#include "platform/linux/bus/QVBusConnection.h"

#include "platform/QVPlatform.h"
#include "platform/linux/QVLogException.h"
#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/bus/QVBusLoop.h"
#include "platform/linux/bus/QVBusServer.h"

#include <new>
#include <utility>

namespace {

// Bytes that may wait for a peer before its calls are no longer read. Enough for the largest reply
// and a batch of small ones.
constexpr std::size_t kMostUnwritten = std::size_t{1} << 20;

// Reads from a connection when the service ends: more than the kernel's buffer of a socket holds,
// so that what was sent before is taken in; not endless, for a peer that goes on sending.
constexpr int kMostLastReads = 16;

// Bytes of buffer that an idle connection may keep; there may be thousands of them.
constexpr std::size_t kIdleBuffer = 4096;

}  // namespace

QVBusConnection::QVBusConnection(QVBusServer& server, int descriptor, uint64_t number)
    : server_(server),
      number_(number),
      socket_(server.loop(), descriptor),
      peer_(socket_.peer()),
      account_(server.budget().open()) {}

std::string QVBusConnection::description() const {
  return QVText("<QVBusConnection :1.", number_, " pid ", peer_.processIdentifier, ">");
}

void QVBusConnection::setExportedInterface(QVIPCInterface exportedInterface) {
  exportedInterface_ = exportedInterface;
}

void QVBusConnection::setExportedObject(
    std::shared_ptr<QVReportingServiceProtocol> exportedObject) {
  exportedObject_ = std::move(exportedObject);
}

std::shared_ptr<QVReportingServiceProtocol> QVBusConnection::exportedObject() const {
  return exportedObject_;
}

void QVBusConnection::setInterruptionHandler(QVFunction<void()> handler) {
  interruptionHandler_ = std::move(handler);
}

void QVBusConnection::setInvalidationHandler(QVFunction<void()> handler) {
  invalidationHandler_ = std::move(handler);
}

void QVBusConnection::resume() {
  if (state_ != State::accepted) return;
  state_ = State::authenticating;
  authentication_ = std::make_unique<QVBusAuthServer>(peer_.userID, server_.identifier());
  outbox_ = std::make_shared<QVBusOutbox>([&loop = server_.loop(), weak = weak_from_this()] {
    loop.post([weak] { take(weak, &QVBusConnection::onWake); });
  });
  server_.settleAfterCalls(shared_from_this());
  continueReading();
}

// Whatever the work throws is one line in the log.
template <class Work>
void QVBusConnection::attempt(const QVLogSite& site, Work&& work) const noexcept {
  try {
    work();
  } catch (...) {
    QVLogException(*QVPlatform::shared().log, site, "the connection of process",
                   std::to_string(peer_.processIdentifier));
  }
}

void QVBusConnection::take(const Handle& connection, Step step) noexcept {
  const auto self = connection.lock();
  if (self == nullptr) return;
  self->attempt("-[QVBusConnection take:]", [&self, step] {
    try {
      (*self.*step)();
    } catch (...) {
      self->invalidate();
      throw;
    }
  });
}

void QVBusConnection::readRest(const Handle& connection) noexcept {
  take(connection, &QVBusConnection::readToTheEnd);
}

void QVBusConnection::readOn(const Handle& connection) noexcept {
  take(connection, &QVBusConnection::continueReading);
}

// ---- Reading

void QVBusConnection::continueReading() {
  if (state_ == State::accepted || state_ == State::closed || waitsToRead_) return;
  // While bytes wait there is a wait to write, or a wake, after which we come here again.
  if (unwritten() > kMostUnwritten) return;
  if (!isAdmitted()) return;
  waitsToRead_ = true;
  socket_.waitReadable([weak = weak_from_this()] { take(weak, &QVBusConnection::onReadable); });
}

// If the intake budget does not admit the connection, sees to it that it goes on later.
bool QVBusConnection::isAdmitted() {
  // What a peer that has gone left behind is no more than the kernel's buffer holds, and half a
  // message is let go of only by reading to its end.
  if (hungUp_ || server_.budget().admits(*account_)) return true;
  server_.resumeWhenAdmitted(*this);
  if (!waitsForHangUp_) {
    waitsForHangUp_ = true;
    socket_.waitHangUp([weak = weak_from_this()] { take(weak, &QVBusConnection::onError); });
  }
  return false;
}

void QVBusConnection::onError() {
  // The wait ends on urgent data, too, which a peer that is there can send at will.
  if (!socket_.hasHungUp()) return;
  hungUp_ = true;
  continueReading();
}

void QVBusConnection::onReadable() {
  waitsToRead_ = false;
  // Replies may have piled up since the wait began.
  if (unwritten() <= kMostUnwritten) {
    // What a batch of calls is answered on this thread goes out in one write after it.
    outbox_->hold();
    const QVWakeUpBatch wakeUps;
    const bool answersWait = unwritten() > 0;
    const auto buffer = server_.readBuffer();
    const auto received = socket_.receive(buffer);
    switch (received.status) {
      case QVBusSocket::Status::done: {
        const std::size_t messages = takeBytesSafely({buffer.data(), received.bytes});
        if (messages > 1 || (messages == 1 && answersWait)) server_.loop().noteStream();
        break;
      }
      case QVBusSocket::Status::wouldBlock:
        break;
      case QVBusSocket::Status::ended:
      case QVBusSocket::Status::failed:
        invalidate();
        break;
    }
    writeAnswers();
  }
  continueReading();
}

std::size_t QVBusConnection::takeBytesSafely(std::string_view bytes) {
  try {
    return takeBytes(bytes);
  } catch (const std::bad_alloc&) {
    // The peer whose message does not fit loses its connection, nobody else theirs.
    violated("out of memory for its message");
    return 0;
  }
}

std::size_t QVBusConnection::takeBytes(std::string_view bytes) {
  if (authentication_ != nullptr) {
    std::string answer;
    bytes.remove_prefix(authentication_->feed(bytes, answer));
    outbox_->putBytes(answer);
    if (authentication_->state() == QVBusAuthServer::State::failed) {
      violated(authentication_->failure());
      return 0;
    }
    if (authentication_->state() != QVBusAuthServer::State::done) return 0;
    authentication_.reset();
    state_ = State::open;
  }
  return takeMessages(bytes);
}

std::size_t QVBusConnection::takeMessages(std::string_view bytes) {
  decoder_.feed(bytes);
  std::string_view message;
  for (std::size_t taken = 0;; ++taken) {
    switch (decoder_.next(message)) {
      case QVBusFrameDecoder::Result::message:
        if (const char* reason = takeMessage(message)) {
          violated(reason);
          return taken;
        }
        break;
      case QVBusFrameDecoder::Result::needsMore:
        chargeHeldBytes();
        return taken;
      case QVBusFrameDecoder::Result::malformed:
        violated(decoder_.failure());
        return taken;
    }
  }
}

const char* QVBusConnection::takeMessage(std::string_view bytes) {
  QVBusMessage message;
  if (const char* reason = message.parse(bytes, knownHeader_)) return reason;
  // We call nobody and listen to no signals: what is no call is checked and ignored.
  if (message.type() != QVBusMessageType::methodCall) return message.checkBody();

  const bool exported = exportedInterface_ == QVIPCInterface::reportingService;
  return server_.exporter().handle(
      {.message = message,
       .reply = message.noReplyExpected() ? QVBusReply() : QVBusReply(outbox_, message.serial()),
       .object = exported ? exportedObject_.get() : nullptr,
       .charge = account_.get(),
       .connectionNumber = number_});
}

void QVBusConnection::chargeHeldBytes() {
  const std::size_t held = decoder_.bytesHeld();
  if (held > charged_) account_->add(held - charged_);
  if (held < charged_) account_->remove(charged_ - held);
  charged_ = held;
}

void QVBusConnection::readToTheEnd() {
  if (state_ != State::open && state_ != State::authenticating) return;
  for (int read = 0; read < kMostLastReads && state_ != State::closed; ++read) {
    const auto buffer = server_.readBuffer();
    const auto received = socket_.receive(buffer);
    if (received.status != QVBusSocket::Status::done) return;
    takeBytesSafely({buffer.data(), received.bytes});
  }
}

// ---- Writing

void QVBusConnection::onWake() {
  writeAnswers();
  continueReading();
}

void QVBusConnection::onWritable() {
  waitsToWrite_ = false;
  onWake();
}

void QVBusConnection::writeAnswers() {
  if (state_ != State::closed && outbox_->hasOverflowed()) {
    violated("more than 16 MiB of answers wait for a peer that does not read them");
  } else {
    flush();
  }
}

void QVBusConnection::flush() {
  while (state_ != State::closed && !waitsToWrite_) {
    if (sending_.empty()) {
      outbox_->take(sending_);
      if (sending_.empty()) return;
    }
    const auto written = socket_.send(std::string_view(sending_).substr(sent_));
    switch (written.status) {
      case QVBusSocket::Status::wouldBlock:
        waitsToWrite_ = true;
        socket_.waitWritable(
            [weak = weak_from_this()] { take(weak, &QVBusConnection::onWritable); });
        return;
      case QVBusSocket::Status::failed:
        // The peer is gone; what it sent before may still be there to be read, and then the end.
        outbox_->close();
        sent_ = sending_.size();
        break;
      default:
        sent_ += written.bytes;
        break;
    }
    if (sent_ == sending_.size()) {
      sending_.clear();
      sent_ = 0;
      if (sending_.capacity() > kIdleBuffer) std::string().swap(sending_);
    }
  }
}

// ---- The end

void QVBusConnection::violated(const char* reason) {
  if (state_ == State::closed) return;
  const auto self = shared_from_this();
  QVPlatform::shared().log->error(nullptr, "-[QVBusConnection violated:]",
                                  "protocol violation, closing the connection of process ",
                                  peer_.processIdentifier, ": ", reason);
  close();
  attempt("-[QVBusConnection violated:]", [this] {
    if (interruptionHandler_) interruptionHandler_();
  });
  end();
}

void QVBusConnection::invalidate() noexcept {
  if (state_ == State::closed) return;
  const auto self = shared_from_this();
  close();
  end();
}

void QVBusConnection::close() noexcept {
  constexpr const char* kFunction = "-[QVBusConnection close]";
  if (outbox_ != nullptr) {
    // What was answered already, as far as the peer takes it.
    attempt(kFunction, [this] { flush(); });
    outbox_->close();
  }
  state_ = State::closed;
  socket_.close();
  if (charged_ != 0) account_->remove(std::exchange(charged_, 0));
  account_.reset();
  // The rest of it may have to wait for its calls.
  authentication_.reset();
  decoder_ = {};
  std::string().swap(sending_);
  sent_ = 0;
  attempt(kFunction, [this] { server_.forget(*this); });
}

// For the registration of one that was gone at once, and for its calls.
void QVBusConnection::end() noexcept {
  if (isSettled_ || !server_.endAfterCalls(shared_from_this())) tellTheEnd();
}

void QVBusConnection::tellTheEnd() noexcept {
  attempt("-[QVBusConnection tellTheEnd]", [this] {
    if (invalidationHandler_) invalidationHandler_();
  });
  interruptionHandler_ = nullptr;
  invalidationHandler_ = nullptr;
  attempt("-[QVBusConnection tellTheEnd]",
          [this] { server_.letGoAfterCalls(std::exchange(exportedObject_, nullptr)); });
}
