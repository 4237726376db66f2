#include "platform/fake/QVFakeIPCConnection.h"

#include "platform/QVText.h"
#include "platform/fake/QVFakeAbort.h"

std::string QVFakeIPCConnection::description() const {
  return QVText("connection ", number_, " of process ", processIdentifier_);
}

void QVFakeIPCConnection::setExportedInterface(QVIPCInterface exportedInterface) {
  exportedInterface_ = exportedInterface;
}

void QVFakeIPCConnection::setExportedObject(
    std::shared_ptr<QVReportingServiceProtocol> exportedObject) {
  exportedObject_ = std::move(exportedObject);
}

std::shared_ptr<QVReportingServiceProtocol> QVFakeIPCConnection::exportedObject() const {
  return exportedObject_;
}

void QVFakeIPCConnection::setInterruptionHandler(QVFunction<void()> handler) {
  interruptionHandler_ = std::move(handler);
}

void QVFakeIPCConnection::setInvalidationHandler(QVFunction<void()> handler) {
  invalidationHandler_ = std::move(handler);
}

void QVFakeIPCConnection::resume() {
  if (state_ == State::fresh) state_ = State::resumed;
}

QVReportingServiceProtocol& QVFakeIPCConnection::call() {
  const char* obstacle = nullptr;
  if (state_ == State::fresh) obstacle = "it has not been resumed";
  if (state_ == State::invalidated) obstacle = "it has been invalidated";
  if (state_ == State::resumed && exportedInterface_ != QVIPCInterface::reportingService) {
    obstacle = "it exports no interface";
  }
  if (state_ == State::resumed && exportedObject_ == nullptr) obstacle = "it exports no object";
  if (obstacle != nullptr) {
    QVFakeAbort(QVText("QVFakeIPCConnection: ", description(), " cannot be called: ", obstacle));
  }
  return *exportedObject_;
}

void QVFakeIPCConnection::interrupt() {
  if (state_ == State::resumed && interruptionHandler_) interruptionHandler_();
}

void QVFakeIPCConnection::invalidate() {
  const bool wasResumed = state_ == State::resumed;
  if (state_ == State::invalidated) return;
  state_ = State::invalidated;
  if (wasResumed && invalidationHandler_) invalidationHandler_();
  abandon();
}

void QVFakeIPCConnection::abandon() {
  state_ = State::invalidated;
  // The members are empty before what they held is destroyed, since that may look at them.
  const auto object = std::exchange(exportedObject_, nullptr);
  const auto interruption = std::exchange(interruptionHandler_, nullptr);
  const auto invalidation = std::exchange(invalidationHandler_, nullptr);
}
