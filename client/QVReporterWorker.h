#pragma once

#include "client/QVReconnectDelay.h"
#include "client/QVReporterCalls.h"
#include "client/QVReporterCore.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>

// What a reporter's thread does: keeps the connection, has calls made and answers taken in, hears
// of the switch, tells of drops, and ends in time.
//
//   idle --something to send--> connecting --> connected --lost--> pausing --> connecting ...
//
// It sleeps without a limit while there is nothing to do; with one for the next attempt to connect,
// the next report of drops, the end, and while real-time queues are polled.
//
// Threads: the reporter's. Ownership: its thread keeps the core.
class QVReporterWorker {
 public:
  explicit QVReporterWorker(QVReporterCore& core);
  ~QVReporterWorker();
  QVReporterWorker(const QVReporterWorker&) = delete;
  QVReporterWorker& operator=(const QVReporterWorker&) = delete;

  // Until the core's deadline, or until nothing is left to do before it.
  void run();

 private:
  using TimePoint = QVReporterCore::TimePoint;

  // False at the end.
  bool work();
  void followSwitch();
  void connect(TimePoint now);
  void loseConnection(TimePoint now);
  void beginFlush();
  void workOffFlush();
  bool mayEnd(TimePoint now);
  std::optional<TimePoint> nextWakeUp(TimePoint now);
  void wait();
  void finish();

  QVReporterCore& core_;
  QVReporterCalls calls_;
  QVReconnectDelay delay_;
  std::unique_ptr<QVClient> client_;  // before calls_ goes, its answers run
  bool hasNewsOfSwitch_ = false;
  bool hasAnswers_ = false;
  bool isEnding_ = false;
  bool hasTriedAtEnd_ = false;
  bool wasOff_ = core_.isReportingOff();
  bool isSwitchSettled_ = false;  // looked at since the service answered on this connection

  // The flush under way: first its records have to be worked off, then the calls answered.
  enum class Flush { none, queued, underWay };
  Flush flush_ = Flush::none;
  uint64_t flushedRecords_ = 0;
  uint64_t flushedCalls_ = 0;
};
