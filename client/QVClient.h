#pragma once

#include "client/QVClientError.h"
#include "client/QVClientExport.h"
#include "client/QVClientOptions.h"
#include "client/QVClientPayload.h"
#include "client/QVClientReplies.h"
#include "client/QVClientResult.h"
#include "client/QVClientVocabulary.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>

class QVClientConnection;

// A connection to the reporting service. Its eleven operations, each in two forms:
//
// - `operation(arguments, reply)` sends the call and returns at once. It never waits for the
//   service and never raises SIGPIPE. Answers an error where the call was not taken in; the reply
//   then never runs. Where it was, the reply runs exactly once, with the service's answer or an
//   error. Many calls may be under way; the service works them off in the order sent.
// - `operationAndWait(arguments, timeLimit)` returns the answer. On the thread that runs replies it
//   would wait for itself: it answers wouldDeadlock there. Without a limit it waits for as long as
//   the connection lasts; after the limit it answers timedOut, and the call may still be carried
//   out.
//
// Sending: a call leaves at once. Calls that come while another thread is writing leave together
// after that. Inside of a QVClientBatch, and inside of replies, calls are kept and leave together
// at the end of it, or as soon as they are 64 KiB. flush() and every waiting call send what is
// kept.
//
// Where replies run: on a thread of the library, or with Callbacks::pollLoop only inside of
// dispatch(), also when a waiting call reads answers meanwhile. Signals are blocked in the
// library's thread. A reply may send calls and may destroy the client.
//
// When the connection is lost, every outstanding call's reply runs with connectionLost, then the
// options' connectionLost, once; from then on every call answers that error. Make a new client to
// connect again.
//
// Threads: every member may be called on any thread, at once, but dispatch() by one at a time, and
// the destructor last. Limits: QVClientOptions; payloads of 8 MiB.
class QV_CLIENT_API QVClient {
 public:
  using TimeLimit = std::optional<std::chrono::milliseconds>;

  // A client of the service at the options' socket. The service may still turn the connection away;
  // that is a loss then. Replies, connectionLost above all, may run before this returns.
  static QVClientResult<std::unique_ptr<QVClient>> connect(QVClientOptions options = {});
  // The same over a stream socket that is connected already, which the client owns from now on.
  static QVClientResult<std::unique_ptr<QVClient>> connectedTo(int socket,
                                                               QVClientOptions options = {});

  // Calls without an answer get their replies run with `closed`: on the library's thread, for which
  // this waits, or with a poll loop inside of this. What was sent is sent.
  ~QVClient();
  QVClient(const QVClient&) = delete;
  QVClient& operator=(const QVClient&) = delete;

  [[nodiscard]] QVClientError createReportingSession(int64_t reporterID,
                                                     QVClientBooleanReply reply);
  [[nodiscard]] QVClientError setServiceType(QVClientServiceType serviceType,
                                             int64_t reportingSession, QVClientBooleanReply reply);
  [[nodiscard]] QVClientError getServiceNameForReporterID(int64_t reporterID,
                                                          QVClientServiceTypeReply reply);
  [[nodiscard]] QVClientError setConfiguration(const QVClientPayload& configuration,
                                               int64_t forReporterID, QVClientBooleanReply reply);
  // `completed` runs when the session is stopped, maybe hours later, or at once where there is
  // nothing to start; for a session that is destroyed while started, only when the connection ends.
  [[nodiscard]] QVClientError startReportingSessionForID(int64_t reporterID,
                                                         QVClientBooleanReply completed);
  [[nodiscard]] QVClientError sendMessage(const QVClientPayload& message,
                                          QVClientCategory withCategory,
                                          QVClientMessageType andType,
                                          const QVClientTargets& forReportingIDs,
                                          QVClientMessageReply reply);
  [[nodiscard]] QVClientError stopReportingSessionForID(int64_t reporterID,
                                                        QVClientBooleanReply reply);
  [[nodiscard]] QVClientError destroyReportingSession(int64_t reporterID,
                                                      QVClientBooleanReply reply);
  [[nodiscard]] QVClientError reporterIDValid(int64_t reporterID, QVClientReporterReply reply);
  [[nodiscard]] QVClientError getAllReporters(QVClientReportersReply reply);
  // Ends the service, which never answers: the loss of the connection is this call's success.
  [[nodiscard]] QVClientError killService(QVClientBooleanReply reply);

  QVClientResult<bool> createReportingSessionAndWait(int64_t reporterID, TimeLimit limit = {});
  QVClientResult<bool> setServiceTypeAndWait(QVClientServiceType serviceType,
                                             int64_t reportingSession, TimeLimit limit = {});
  QVClientResult<QVClientServiceType> getServiceNameForReporterIDAndWait(int64_t reporterID,
                                                                         TimeLimit limit = {});
  QVClientResult<bool> setConfigurationAndWait(const QVClientPayload& configuration,
                                               int64_t forReporterID, TimeLimit limit = {});
  // Does not wait for the session's end: sends the start, asks behind it whether there is such a
  // session (reporterIDValid), and waits for that answer, which is what it answers. The service
  // keeps the order, so the start is over by then. `completed` may be empty.
  QVClientResult<bool> startReportingSessionForIDAndWait(int64_t reporterID,
                                                         QVClientBooleanReply completed,
                                                         TimeLimit limit = {});
  QVClientError sendMessageAndWait(const QVClientPayload& message, QVClientCategory withCategory,
                                   QVClientMessageType andType,
                                   const QVClientTargets& forReportingIDs, TimeLimit limit = {});
  QVClientResult<bool> stopReportingSessionForIDAndWait(int64_t reporterID, TimeLimit limit = {});
  QVClientResult<bool> destroyReportingSessionAndWait(int64_t reporterID, TimeLimit limit = {});
  QVClientResult<QVClientReporter> reporterIDValidAndWait(int64_t reporterID, TimeLimit limit = {});
  QVClientResult<std::vector<int64_t>> getAllReportersAndWait(TimeLimit limit = {});
  QVClientResult<bool> killServiceAndWait(TimeLimit limit = {});

  // What a program's loop waits for being readable, to call dispatch() then; the same as long as
  // the client lives. -1 where the library has its own thread.
  int fileDescriptor() const noexcept;
  // Writes and reads what can be, and runs replies. Does nothing where the library has its own
  // thread, and inside of a reply.
  void dispatch();

  // Sends what a batch or a reply has kept so far.
  void flush();
  // Waits until all that was taken in has left: after queueFull, or before the program ends.
  QVClientError waitUntilSent(TimeLimit limit = {});

 private:
  friend class QVClientBatch;
  explicit QVClient(std::shared_ptr<QVClientConnection> connection);

  std::shared_ptr<QVClientConnection> connection_;
};
