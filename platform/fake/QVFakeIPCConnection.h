#pragma once

#include "platform/QVIPC.h"

// A client's connection without a wire: the test calls the exported object as the transport would.
//
// States: new -> resumed -> invalidated, or new -> invalidated (refused). Calls are possible in
// `resumed` only.
// Threads: the test's.
class QVFakeIPCConnection final : public QVIPCConnection {
 public:
  // `number` is the connection's in its listener, from 1.
  QVFakeIPCConnection(int32_t processIdentifier, int number)
      : processIdentifier_(processIdentifier), number_(number) {}

  int32_t processIdentifier() const override { return processIdentifier_; }
  // "connection 1 of process 42"
  std::string description() const override;
  void setExportedInterface(QVIPCInterface exportedInterface) override;
  void setExportedObject(std::shared_ptr<QVReportingServiceProtocol> exportedObject) override;
  std::shared_ptr<QVReportingServiceProtocol> exportedObject() const override;
  void setInterruptionHandler(QVFunction<void()> handler) override;
  void setInvalidationHandler(QVFunction<void()> handler) override;
  void resume() override;

  // The exported object, for calling it. Ends the program where the transport could not deliver:
  // before resume(), after the invalidation, without exported interface or object.
  QVReportingServiceProtocol& call();
  // Runs the interruption handler. A peer that violates the protocol is interrupted and then
  // invalidated.
  void interrupt();
  // Runs the invalidation handler if the connection was resumed, then drops exported object and
  // handlers. Does nothing the second time.
  void invalidate();
  // As invalidate(), but no handler runs: for the end of a test.
  void abandon();

  QVIPCInterface exportedInterface() const { return exportedInterface_; }
  bool isResumed() const { return state_ == State::resumed; }
  bool isInvalidated() const { return state_ == State::invalidated; }

 private:
  enum class State { fresh, resumed, invalidated };

  const int32_t processIdentifier_;
  const int number_;
  State state_ = State::fresh;
  QVIPCInterface exportedInterface_ = QVIPCInterface::none;
  std::shared_ptr<QVReportingServiceProtocol> exportedObject_;
  QVFunction<void()> interruptionHandler_;
  QVFunction<void()> invalidationHandler_;
};
