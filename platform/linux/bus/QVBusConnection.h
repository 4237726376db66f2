#pragma once

#include "platform/QVIPC.h"
#include "platform/QVLog.h"
#include "platform/linux/bus/QVBusAuthServer.h"
#include "platform/linux/bus/QVBusFrameDecoder.h"
#include "platform/linux/bus/QVBusMessage.h"
#include "platform/linux/bus/QVBusOutbox.h"
#include "platform/linux/bus/QVBusSocket.h"
#include "platform/linux/bus/QVIntakeBudget.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

class QVBusServer;

// One client's connection: reads what is there, hands calls to the exported object, writes replies.
//
//   accepted --resume()--> authenticating --BEGIN--> open
//       |                        |                    |
//       '------------------------+--------------------'--> closed
//
// It closes when the stream ends, when the peer breaks a rule of the protocol (one line in the log
// says which) and when the service ends. What came in whole before the stream's end is delivered
// first; then the invalidation handler runs, but not before what the listener's delegate enqueued
// for the connection has: the end of one that is gone at once waits for that, and its calls.
// Whatever a step throws, want of memory above all, is one line in the log and the end of this
// connection alone.
//
// Threads: the loop's thread only; replies come from any thread, through the outbox.
// Ownership: the server holds it until it has told its end; waits and wakes hold it weakly.
// Limits: not read while more than 1 MiB waits to be written to its peer, nor while the intake
// budget does not admit it, unless the peer has gone and only the rest is left. An idle connection
// holds no buffer of more than 4 KiB.
class QVBusConnection final : public QVIPCConnection,
                              public std::enable_shared_from_this<QVBusConnection> {
 public:
  // `number` is unique among the connections of the server, which outlives them all.
  QVBusConnection(QVBusServer& server, int descriptor, uint64_t number);

  int32_t processIdentifier() const override { return peer_.processIdentifier; }
  std::string description() const override;
  void setExportedInterface(QVIPCInterface exportedInterface) override;
  void setExportedObject(std::shared_ptr<QVReportingServiceProtocol> exportedObject) override;
  std::shared_ptr<QVReportingServiceProtocol> exportedObject() const override;
  void setInterruptionHandler(QVFunction<void()> handler) override;
  void setInvalidationHandler(QVFunction<void()> handler) override;
  void resume() override;

  // The rest is for the server.

  using Handle = std::weak_ptr<QVBusConnection>;
  // Takes in what the peer has sent so far, before the service ends.
  static void readRest(const Handle& connection) noexcept;
  // Reads on where nothing is in the way; called again whenever something no longer is.
  static void readOn(const Handle& connection) noexcept;
  // Closes, has the invalidation handler run and lets go of the exported object. May be called
  // again.
  void invalidate() noexcept;
  // What was enqueued for it before it was resumed has run.
  void settle() noexcept { isSettled_ = true; }
  // Runs the invalidation handler; once.
  void tellTheEnd() noexcept;
  uint64_t number() const noexcept { return number_; }

 private:
  enum class State { accepted, authenticating, open, closed };

  // What waits and wakes call: the step, as long as the connection is there.
  using Step = void (QVBusConnection::*)();
  static void take(const Handle& connection, Step step) noexcept;
  template <class Work>
  void attempt(const QVLogSite& site, Work&& work) const noexcept;

  bool isAdmitted();
  void onReadable();
  void onWritable();
  void onError();
  void onWake();
  // Answer how many whole messages the bytes completed.
  std::size_t takeBytesSafely(std::string_view bytes);
  std::size_t takeBytes(std::string_view bytes);
  std::size_t takeMessages(std::string_view bytes);
  const char* takeMessage(std::string_view bytes);
  void violated(const char* reason);
  void close() noexcept;
  void end() noexcept;
  void continueReading();
  void readToTheEnd();
  void writeAnswers();
  void flush();
  void chargeHeldBytes();
  std::size_t unwritten() { return outbox_->size() + sending_.size() - sent_; }

  QVBusServer& server_;
  const uint64_t number_;
  QVBusSocket socket_;
  const QVBusSocket::Peer peer_;
  State state_ = State::accepted;
  bool isSettled_ = false;

  std::unique_ptr<QVBusAuthServer> authentication_;  // until it is done
  QVBusFrameDecoder decoder_;
  QVBusKnownHeader knownHeader_;
  bool waitsToRead_ = false;
  bool waitsForHangUp_ = false;
  bool hungUp_ = false;
  QVIntakeBudget::AccountHandle account_;
  std::size_t charged_ = 0;  // for the decoder's memory

  std::shared_ptr<QVBusOutbox> outbox_;
  std::string sending_;   // taken from the outbox
  std::size_t sent_ = 0;  // of that
  bool waitsToWrite_ = false;

  QVIPCInterface exportedInterface_ = QVIPCInterface::none;
  std::shared_ptr<QVReportingServiceProtocol> exportedObject_;
  QVFunction<void()> interruptionHandler_;
  QVFunction<void()> invalidationHandler_;
};
