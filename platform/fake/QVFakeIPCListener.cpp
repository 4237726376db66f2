#include "platform/fake/QVFakeIPCListener.h"

void QVFakeIPCListener::setDelegate(std::weak_ptr<QVIPCListenerDelegate> delegate) {
  delegate_ = std::move(delegate);
}

void QVFakeIPCListener::resume() {
  hasResumed_ = true;
  if (traffic_) traffic_();
  const auto connections = connections_;
  for (const auto& connection : connections) connection->invalidate();
}

std::shared_ptr<QVFakeIPCConnection> QVFakeIPCListener::connect(int32_t processIdentifier) {
  auto connection = std::make_shared<QVFakeIPCConnection>(processIdentifier, ++connectionCount_);
  const auto delegate = delegate_.lock();
  if (delegate != nullptr && delegate->listener(*this, connection)) {
    connections_.push_back(connection);
  } else {
    connection->invalidate();
  }
  return connection;
}

void QVFakeIPCListener::onResume(QVFunction<void()> traffic) {
  traffic_ = std::move(traffic);
}

void QVFakeIPCListener::abandonConnections() {
  for (const auto& connection : connections_) connection->abandon();
}
