#pragma once

#include "client/QVClient.h"
#include "client/QVReporterCore.h"

#include <cstddef>
#include <cstdint>
#include <optional>

// Turns what lies in a reporter's queues into calls to the service, and counts the answers.
//
// Calls that control sessions change what is known of the session first; then, where it is there,
// the service. A session that is not there on this connection is made with all that is known of it.
// So what a loss interrupts is made up for by the restoration.
//
// Only so much is under way at a time: what lies in the queues outlives a lost connection, what is
// under way does not.
//
// Used by QVReporterWorker, on the reporter's thread.
class QVReporterCalls {
 public:
  explicit QVReporterCalls(QVReporterCore& core) : core_(core) {}

  // A connection is made: the sessions that there are have to be restored on it.
  void begin(QVClient& client);
  // It is of no use any more: it was lost, or a call could not be made. Then end() has to follow,
  // once the client is gone. Answers that have not run by then never will; they count as lost.
  bool isLost() const { return isLost_; }
  void lose() { isLost_ = true; }
  void end();
  // Has the service answered on this connection?
  bool isAnswered() const { return isAnswered_; }

  // Does as much as can be done: restores, then works off the queue and the real-time queues, in
  // turns. Without a connection, drops what reporting that is off drops.
  void work();
  // Is there anything to be done with a connection?
  bool wantsConnection();
  // Is nothing left of what has been sent, in real-time queues before they were marked?
  bool isDone();
  // May more be sent right now?
  bool hasRoom() const;
  // Is there a started session with a real-time queue?
  bool polls() const { return polls_; }

  // How many calls were made that are answered, and how many of them are.
  uint64_t issued() const { return issued_; }
  uint64_t answered() const { return answered_; }
  // Notes what the real-time queues hold: a flush, or the end, begins.
  void markRings();
  // Has what they held then been worked off, of started sessions?
  bool areRingsWorkedOff();

  // Counts all that is left as lost. The end.
  void abandon();

 private:
  bool restore();
  bool make(QVReporterSessionState& session);
  bool start(QVReporterSessionState& session);
  bool configure(QVReporterSessionState& session);
  bool isGone(const QVReporterSessionState& session) const;
  bool handleStep(const QVReporterRecord& record, QVReporterSessionState& session);
  bool handleMessage(const QVReporterRecord& record, std::span<char> payload);
  bool destroy(QVReporterSessionState& session);
  bool isDrainedBeforeStep(const QVReporterSessionState& session);
  static bool hasSession(const QVRealtimeRing& ring);
  void lose(QVRealtimeRing& ring);
  void drop(QVRealtimeRing& ring);
  // How many records, or messages, of a turn were worked off.
  std::size_t workQueue();
  std::size_t workRing(QVRealtimeRing& ring);

  bool issue(const QVClientError& error);
  QVClientBooleanReply acknowledge();
  void take(const QVClientError& error, std::size_t bytes);

  QVReporterCore& core_;
  QVClient* client_ = nullptr;
  bool isLost_ = false;
  bool isAnswered_ = false;
  bool isRestored_ = true;
  bool polls_ = false;
  std::size_t turn_ = 0;              // 0: the queue's, else a real-time queue's
  uint64_t markedStep_ = UINT64_MAX;  // the record that rings were last marked for
  uint64_t issued_ = 0;
  uint64_t answered_ = 0;
  std::size_t bytesUnderWay_ = 0;
  uint64_t messagesUnderWay_ = 0;
  std::optional<int64_t> restoredUpTo_;  // sessions with higher IDs are not restored yet
  QVClientPayload view_{std::span<char>()};
};
