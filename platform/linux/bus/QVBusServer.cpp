#include "platform/linux/bus/QVBusServer.h"

#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/bus/QVBusConnection.h"
#include "platform/linux/bus/QVBusHexadecimal.h"
#include "platform/linux/bus/QVBusLoop.h"

#include <array>
#include <chrono>
#include <exception>
#include <random>
#include <utility>

namespace {

// When the service ends, for what clients asked for before: far longer than a queue is ever behind.
constexpr std::chrono::seconds kLongestWaitForCalls{30};

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
  for (const auto& [number, connection] : connections) QVBusConnection::readRest(connection);
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

void QVBusServer::settleAfterCalls(const std::shared_ptr<QVBusConnection>& connection) {
  if (!afterCalls_) {
    connection->settle();
    return;
  }
  afterCalls_([&loop = loop_, weak = std::weak_ptr(connection)] {
    loop.post([weak] {
      if (const auto self = weak.lock()) self->settle();
    });
  });
}

bool QVBusServer::endAfterCalls(const std::shared_ptr<QVBusConnection>& connection) noexcept {
  if (!afterCalls_) return false;
  const uint64_t number = connection->number();
  try {
    ending_.emplace(number, connection);
    afterCalls_([this, number] { loop_.post([this, number] { tellTheEnd(number); }); });
    return true;
  } catch (const std::exception&) {
    // For want of memory.
    ending_.erase(number);
    return false;
  }
}

void QVBusServer::tellTheEnd(uint64_t number) {
  if (auto ended = ending_.extract(number)) ended.mapped()->tellTheEnd();
}

void QVBusServer::letGoAfterCalls(std::shared_ptr<QVReportingServiceProtocol> object) {
  if (afterCalls_ && object != nullptr) afterCalls_([object = std::move(object)] {});
}

void QVBusServer::awaitEnds() {
  const auto deadline = std::chrono::steady_clock::now() + kLongestWaitForCalls;
  while (!ending_.empty()) {
    const auto left = deadline - std::chrono::steady_clock::now();
    if (left <= std::chrono::steady_clock::duration::zero()) break;
    loop_.runOne(left);
  }
  while (!ending_.empty()) tellTheEnd(ending_.begin()->first);
}

void QVBusServer::resumeWhenAdmitted(const QVBusConnection& connection) {
  notAdmitted_.insert(connection.number());
}

void QVBusServer::resumeAdmitted() {
  // Those that still have to wait put themselves in anew.
  for (const uint64_t number : std::exchange(notAdmitted_, {})) {
    const auto found = connections_.find(number);
    if (found == connections_.end()) continue;
    QVBusConnection::readOn(found->second);
  }
}
