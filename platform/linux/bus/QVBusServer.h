#pragma once

#include "platform/QVFunction.h"
#include "platform/linux/bus/QVIntakeBudget.h"
#include "platform/linux/bus/QVReportingServiceExporter.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <unordered_map>
#include <unordered_set>

class QVBusConnection;
class QVBusLoop;

// The connections of one listener and what they share: the loop, one buffer to read into, the
// exporter with its scratch memory, the intake budget.
//
// Threads: the loop's thread only.
// Ownership: holds every connection until it closes. The loop outlives the server and is not run
// after it.
class QVBusServer {
 public:
  explicit QVBusServer(QVBusLoop& loop, std::size_t intakeBound = QVIntakeBudget::kBound);
  ~QVBusServer();
  QVBusServer(const QVBusServer&) = delete;
  QVBusServer& operator=(const QVBusServer&) = delete;

  // A new connection over a connected socket, which is taken over.
  std::shared_ptr<QVBusConnection> adopt(int descriptor);
  // Every connection takes in what its peer has sent so far.
  void readToTheEnd();
  // Invalidates every connection.
  void invalidateAll();
  std::size_t connections() const noexcept { return connections_.size(); }
  // Is called after each close of a connection; its descriptor is free by then.
  void setClosedHandler(QVFunction<void()> handler) { closedHandler_ = std::move(handler); }
  // Says how to have something run behind all that exported objects have been asked to do so far.
  // Without it, they have always done it when they return.
  using AfterCalls = QVFunction<void(QVFunction<void()>)>;
  void setAfterCalls(AfterCalls afterCalls) { afterCalls_ = std::move(afterCalls); }
  // Runs the loop until every connection that has ended has told so, for half a minute at the most;
  // then the rest tell it at once.
  void awaitEnds();

  // The rest is for connections.
  QVBusLoop& loop() noexcept { return loop_; }
  QVReportingServiceExporter& exporter() noexcept { return exporter_; }
  QVIntakeBudget& budget() noexcept { return *budget_; }
  // 32 hexadecimal digits, new with each server.
  const std::string& identifier() const noexcept { return identifier_; }
  // What is read lies here until the next read, whichever connection's.
  std::span<char> readBuffer() noexcept { return {readBuffer_.get(), kReadBuffer}; }
  void forget(const QVBusConnection& connection);
  // Has the connection read on when the budget admits more.
  void resumeWhenAdmitted(const QVBusConnection& connection);
  // Settles the connection behind what exported objects have been asked to do so far.
  void settleAfterCalls(const std::shared_ptr<QVBusConnection>& connection);
  // Has the connection tell its end behind that; false where it has to tell it at once.
  bool endAfterCalls(const std::shared_ptr<QVBusConnection>& connection) noexcept;
  // Lets go of an exported object where its calls are carried out, and behind them: with it goes
  // what belongs to that thread.
  void letGoAfterCalls(std::shared_ptr<QVReportingServiceProtocol> object);

 private:
  // Bytes of one read: some hundred messages of usual size, and the kernel's buffer holds little
  // more.
  static constexpr std::size_t kReadBuffer = std::size_t{64} << 10;

  void resumeAdmitted();
  void tellTheEnd(uint64_t number);

  QVBusLoop& loop_;
  const std::string identifier_;
  const std::unique_ptr<char[]> readBuffer_;
  QVReportingServiceExporter exporter_;
  const std::shared_ptr<QVIntakeBudget> budget_;
  std::unordered_map<uint64_t, std::shared_ptr<QVBusConnection>> connections_;
  std::unordered_set<uint64_t> notAdmitted_;
  uint64_t lastNumber_ = 0;
  QVFunction<void()> closedHandler_;
  AfterCalls afterCalls_;
  // Closed, and waiting to tell it.
  std::unordered_map<uint64_t, std::shared_ptr<QVBusConnection>> ending_;
};
