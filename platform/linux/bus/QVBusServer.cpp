#include "platform/linux/bus/QVBusServer.h"

#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/bus/QVBusConnection.h"
#include "platform/linux/bus/QVBusHexadecimal.h"
#include "platform/linux/bus/QVBusLoop.h"

#include <array>
#include <chrono>
#include <random>
#include <utility>

namespace {

std::string makeIdentifier() {
  std::random_device random;
  std::array<char, 16> bytes;
  for (char& byte : bytes) byte = static_cast<char>(random());
  return QVBusToHexadecimal({bytes.data(), bytes.size()});
}

}  // namespace

QVBusServer::QVBusServer(QVBusLoop& loop, std::size_t intakeBound)
    : loop_(loop),
      identifier_(makeIdentifier()),
      readBuffer_(new char[kReadBuffer]),  // not zeroed: untouched pages cost nothing
      budget_(std::make_shared<QVIntakeBudget>(intakeBound)) {
  budget_->setWake([this] { loop_.post([this] { resumeAdmitted(); }); });
}

QVBusServer::~QVBusServer() {
  budget_->setWake(nullptr);
  closedHandler_ = nullptr;
  // Nobody runs the loop any more.
  afterCalls_ = nullptr;
  invalidateAll();
}

std::shared_ptr<QVBusConnection> QVBusServer::adopt(int descriptor) {
  // Number 0 is the service itself on the bus that tools believe to see.
  const uint64_t number = ++lastNumber_;
  auto connection = std::make_shared<QVBusConnection>(*this, descriptor, number);
  connections_.emplace(number, connection);
  return connection;
}

void QVBusServer::readToTheEnd() {
  const QVWakeUpBatch wakeUps;
  const auto connections = connections_;
  for (const auto& [number, connection] : connections) connection->readToTheEnd();
}

void QVBusServer::invalidateAll() {
  // Each takes itself out.
  while (!connections_.empty()) {
    const auto connection = connections_.begin()->second;
    connection->invalidate();
  }
}

void QVBusServer::forget(const QVBusConnection& connection) {
  connections_.erase(connection.number());
  if (closedHandler_) closedHandler_();
}

void QVBusServer::runAfterCalls(QVFunction<void()> work) {
  if (!afterCalls_) {
    work();
    return;
  }
  ++waitingForCalls_;
  afterCalls_([this, work = std::move(work)]() mutable {
    loop_.post([this, work = std::move(work)]() mutable {
      --waitingForCalls_;
      work();
      if (waitingForCalls_ == 0) readUnread();
    });
  });
}

void QVBusServer::readLater(const QVBusConnection& connection) {
  unread_.push_back(connection.number());
}

// At once, each of them: whoever comes and goes all the time keeps nobody from being read.
void QVBusServer::readUnread() {
  for (const uint64_t number : std::exchange(unread_, {})) {
    const auto found = connections_.find(number);
    if (found == connections_.end()) continue;
    QVBusConnection::read(found->second);
  }
}

void QVBusServer::letGoAfterCalls(std::shared_ptr<QVReportingServiceProtocol> object) {
  if (afterCalls_ && object != nullptr) afterCalls_([object = std::move(object)] {});
}

void QVBusServer::awaitCalls() {
  while (waitingForCalls_ > 0) loop_.runOne(std::chrono::hours(1));
}

void QVBusServer::resumeWhenAdmitted(const QVBusConnection& connection) {
  notAdmitted_.insert(connection.number());
}

void QVBusServer::resumeAdmitted() {
  // Those that still have to wait put themselves in anew.
  for (const uint64_t number : std::exchange(notAdmitted_, {})) {
    const auto found = connections_.find(number);
    if (found == connections_.end()) continue;
    const auto connection = found->second;
    connection->continueReading();
  }
}
