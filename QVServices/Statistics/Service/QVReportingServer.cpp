#include "QVServices/Statistics/Service/QVReportingServer.h"

#include <utility>

namespace {

std::shared_ptr<QVWorkQueue>& sharedQueue() {
  static std::shared_ptr<QVWorkQueue> queue;
  return queue;
}

const QVLogScope* sharedLogScope = nullptr;

}  // namespace

void QVReportingServer::setQueue(std::shared_ptr<QVWorkQueue> queue) {
  sharedQueue() = std::move(queue);
}

QVWorkQueue& QVReportingServer::queue() {
  return *sharedQueue();
}

void QVReportingServer::setLogScope(const QVLogScope* scope) {
  sharedLogScope = scope;
}

const QVLogScope* QVReportingServer::logScope() {
  return sharedLogScope;
}
