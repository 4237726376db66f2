#include "client/QVClient.h"

#include "client/QVClientConnection.h"
#include "client/QVClientRequest.h"
#include "client/QVClientSocket.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace {

using Operation = QVReportingServiceOperation;

// No reply is a reply of no type: then no answer is asked for.
template <class Outcome>
QVClientCall::Reply replyOrNone(std::function<void(const Outcome&)>&& reply) {
  if (!reply) return {};
  return std::move(reply);
}

QVClientConnection::Deadline deadlineOf(QVClient::TimeLimit limit) {
  // Beyond this the sum with the current time could overflow.
  constexpr std::chrono::milliseconds kLongest = std::chrono::hours(24 * 365);
  if (!limit) return std::nullopt;
  return std::chrono::steady_clock::now() + std::min(*limit, kLongest);
}

template <class Value>
QVClientResult<Value> callAndWait(QVClientConnection& connection, const QVClientRequest& request,
                                  QVClientConnection::Deadline deadline) {
  QVClientResult<Value> outcome;
  const std::function<void(const QVClientResult<Value>&)> keep =
      [&outcome](const QVClientResult<Value>& result) { outcome = result; };
  if (QVClientError error = connection.issueAndWait(request, keep, deadline)) return error;
  return outcome;
}

QVClientRequest serviceTypeRequest(QVClientServiceType serviceType, int64_t reporterID) {
  return {
      .operation = Operation::setServiceType, .targets = reporterID, .serviceType = serviceType};
}

QVClientRequest configurationRequest(const QVClientPayload& configuration, int64_t reporterID) {
  return {
      .operation = Operation::setConfiguration, .targets = reporterID, .payload = &configuration};
}

QVClientRequest messageRequest(const QVClientPayload& message, QVClientCategory category,
                               QVClientMessageType type, const QVClientTargets& targets) {
  return {.operation = Operation::sendMessage,
          .targets = targets,
          .payload = &message,
          .category = category,
          .messageType = type};
}

}  // namespace

QVClientResult<std::unique_ptr<QVClient>> QVClient::connect(QVClientOptions options) {
  QVClientResult<QVDescriptor> socket = QVClientConnectSocket(options);
  if (!socket) return socket.error();
  auto connection =
      std::make_shared<QVClientConnection>(std::move(socket.value()), std::move(options));
  if (QVClientError error = connection->start()) return error;
  return std::unique_ptr<QVClient>(new QVClient(std::move(connection)));
}

QVClientResult<std::unique_ptr<QVClient>> QVClient::connectedTo(int socket,
                                                                QVClientOptions options) {
  QVDescriptor owned(socket);
  if (!QVClientPrepareSocket(socket)) {
    return QVClientError(QVClientError::Code::cannotConnect,
                         "the socket given: " + QVClientSystemErrorText(errno));
  }
  auto connection = std::make_shared<QVClientConnection>(std::move(owned), std::move(options));
  if (QVClientError error = connection->start()) return error;
  return std::unique_ptr<QVClient>(new QVClient(std::move(connection)));
}

QVClient::QVClient(std::shared_ptr<QVClientConnection> connection)
    : connection_(std::move(connection)) {}

QVClient::~QVClient() {
  connection_->close();
}

// The operations, sent.

QVClientError QVClient::createReportingSession(int64_t reporterID, QVClientBooleanReply reply) {
  return connection_->issue({Operation::createReportingSession, reporterID},
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::setServiceType(QVClientServiceType serviceType, int64_t reportingSession,
                                       QVClientBooleanReply reply) {
  return connection_->issue(serviceTypeRequest(serviceType, reportingSession),
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::getServiceNameForReporterID(int64_t reporterID,
                                                    QVClientServiceTypeReply reply) {
  return connection_->issue({Operation::getServiceNameForReporterID, reporterID},
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::setConfiguration(const QVClientPayload& configuration,
                                         int64_t forReporterID, QVClientBooleanReply reply) {
  return connection_->issue(configurationRequest(configuration, forReporterID),
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::startReportingSessionForID(int64_t reporterID,
                                                   QVClientBooleanReply completed) {
  return connection_->issue({Operation::startReportingSessionForID, reporterID},
                            replyOrNone(std::move(completed)));
}

QVClientError QVClient::sendMessage(const QVClientPayload& message, QVClientCategory withCategory,
                                    QVClientMessageType andType,
                                    const QVClientTargets& forReportingIDs,
                                    QVClientMessageReply reply) {
  return connection_->issue(messageRequest(message, withCategory, andType, forReportingIDs),
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::stopReportingSessionForID(int64_t reporterID, QVClientBooleanReply reply) {
  return connection_->issue({Operation::stopReportingSessionForID, reporterID},
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::destroyReportingSession(int64_t reporterID, QVClientBooleanReply reply) {
  return connection_->issue({Operation::destroyReportingSession, reporterID},
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::reporterIDValid(int64_t reporterID, QVClientReporterReply reply) {
  return connection_->issue({Operation::reporterIDValid, reporterID},
                            replyOrNone(std::move(reply)));
}

QVClientError QVClient::getAllReporters(QVClientReportersReply reply) {
  return connection_->issue({Operation::getAllReporters}, replyOrNone(std::move(reply)));
}

QVClientError QVClient::killService(QVClientBooleanReply reply) {
  return connection_->issue({Operation::killService}, replyOrNone(std::move(reply)));
}

// The operations, waited for.

QVClientResult<bool> QVClient::createReportingSessionAndWait(int64_t reporterID, TimeLimit limit) {
  return callAndWait<bool>(*connection_, {Operation::createReportingSession, reporterID},
                           deadlineOf(limit));
}

QVClientResult<bool> QVClient::setServiceTypeAndWait(QVClientServiceType serviceType,
                                                     int64_t reportingSession, TimeLimit limit) {
  return callAndWait<bool>(*connection_, serviceTypeRequest(serviceType, reportingSession),
                           deadlineOf(limit));
}

QVClientResult<QVClientServiceType> QVClient::getServiceNameForReporterIDAndWait(int64_t reporterID,
                                                                                 TimeLimit limit) {
  return callAndWait<QVClientServiceType>(
      *connection_, {Operation::getServiceNameForReporterID, reporterID}, deadlineOf(limit));
}

QVClientResult<bool> QVClient::setConfigurationAndWait(const QVClientPayload& configuration,
                                                       int64_t forReporterID, TimeLimit limit) {
  return callAndWait<bool>(*connection_, configurationRequest(configuration, forReporterID),
                           deadlineOf(limit));
}

QVClientResult<bool> QVClient::startReportingSessionForIDAndWait(int64_t reporterID,
                                                                 QVClientBooleanReply completed,
                                                                 TimeLimit limit) {
  const QVClientConnection::Deadline deadline = deadlineOf(limit);
  if (QVClientError error =
          connection_->issueWithin({Operation::startReportingSessionForID, reporterID},
                                   replyOrNone(std::move(completed)), deadline)) {
    return error;
  }
  const auto reporter = callAndWait<QVClientReporter>(
      *connection_, {Operation::reporterIDValid, reporterID}, deadline);
  if (!reporter) return reporter.error();
  return reporterID != 0 && reporter.value().reporterID == reporterID;
}

QVClientError QVClient::sendMessageAndWait(const QVClientPayload& message,
                                           QVClientCategory withCategory,
                                           QVClientMessageType andType,
                                           const QVClientTargets& forReportingIDs,
                                           TimeLimit limit) {
  QVClientError outcome;
  const QVClientMessageReply keep = [&outcome](const QVClientError& error) { outcome = error; };
  if (QVClientError error =
          connection_->issueAndWait(messageRequest(message, withCategory, andType, forReportingIDs),
                                    keep, deadlineOf(limit))) {
    return error;
  }
  return outcome;
}

QVClientResult<bool> QVClient::stopReportingSessionForIDAndWait(int64_t reporterID,
                                                                TimeLimit limit) {
  return callAndWait<bool>(*connection_, {Operation::stopReportingSessionForID, reporterID},
                           deadlineOf(limit));
}

QVClientResult<bool> QVClient::destroyReportingSessionAndWait(int64_t reporterID, TimeLimit limit) {
  return callAndWait<bool>(*connection_, {Operation::destroyReportingSession, reporterID},
                           deadlineOf(limit));
}

QVClientResult<QVClientReporter> QVClient::reporterIDValidAndWait(int64_t reporterID,
                                                                  TimeLimit limit) {
  return callAndWait<QVClientReporter>(*connection_, {Operation::reporterIDValid, reporterID},
                                       deadlineOf(limit));
}

QVClientResult<std::vector<int64_t>> QVClient::getAllReportersAndWait(TimeLimit limit) {
  return callAndWait<std::vector<int64_t>>(*connection_, {Operation::getAllReporters},
                                           deadlineOf(limit));
}

QVClientResult<bool> QVClient::killServiceAndWait(TimeLimit limit) {
  return callAndWait<bool>(*connection_, {Operation::killService}, deadlineOf(limit));
}

// The loop.

int QVClient::fileDescriptor() const noexcept {
  return connection_->descriptor();
}

void QVClient::dispatch() {
  // A reply may destroy this client.
  const std::shared_ptr<QVClientConnection> connection = connection_;
  connection->dispatch();
}

void QVClient::flush() {
  connection_->flush();
}

QVClientError QVClient::waitUntilSent(TimeLimit limit) {
  return connection_->waitUntilSent(deadlineOf(limit));
}
