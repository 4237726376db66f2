#include "QVServices/Statistics/Service/QVReportingServer.h"

#include <utility>

namespace {

std::shared_ptr<QVWorkQueue>& serverQueue() {
  static std::shared_ptr<QVWorkQueue> queue;
  return queue;
}

const QVLogScope* sharedLogScope = nullptr;

}  // namespace

void QVReportingServer::setQueue(std::shared_ptr<QVWorkQueue> queue) {
  serverQueue() = std::move(queue);
}

QVWorkQueue& QVReportingServer::queue() {
  return *serverQueue();
}

const std::shared_ptr<QVWorkQueue>& QVReportingServer::sharedQueue() {
  return serverQueue();
}

void QVReportingServer::setLogScope(const QVLogScope* scope) {
  sharedLogScope = scope;
}

const QVLogScope* QVReportingServer::logScope() {
  return sharedLogScope;
}
