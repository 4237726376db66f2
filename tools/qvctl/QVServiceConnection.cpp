#include "tools/qvctl/QVServiceConnection.h"

#include <cerrno>

QVServiceConnection::QVServiceConnection(const QVToolPlaces& places, std::function<void()> lost) {
  QVClientOptions options;
  options.socketPath = places.socket.string();
  if (lost) {
    options.connectionLost = [lost = std::move(lost)](const QVClientError& /*error*/) { lost(); };
  }
  auto connected = QVClient::connect(std::move(options));
  if (!connected) {
    const bool isClosed = ::access(places.socket.c_str(), W_OK) != 0 && errno == EACCES;
    throw QVToolFailure(isClosed ? QVToolStatus::notPermitted : QVToolStatus::notRunning,
                        "cannot reach the service: " + connected.error().text());
  }
  client_ = std::move(connected.value());
}

QVToolFailure QVServiceConnection::failure(const QVClientError& error) {
  using Code = QVClientError::Code;
  switch (error.code()) {
    case Code::cannotConnect:
    case Code::connectionLost:
    case Code::timedOut:
      return {QVToolStatus::notRunning, "the service does not answer: " + error.text()};
    default:
      return {QVToolStatus::failed, error.text()};
  }
}

std::vector<int64_t> QVServiceConnection::reporters() {
  return answer(client_->getAllReportersAndWait(kTimeLimit));
}

std::optional<uint16_t> QVServiceConnection::serviceType(int64_t reporterID) {
  const auto reporter = answer(client_->reporterIDValidAndWait(reporterID, kTimeLimit));
  if (reporter.reporterID == 0) return std::nullopt;
  return static_cast<uint16_t>(reporter.serviceType);
}

bool QVServiceConnection::isReporting() {
  const QVClientError error =
      client_->sendMessageAndWait(QVClientPayload(), QVClientCategory(QVClientKind::generic),
                                  QVClientMessageType::generic, noSession(), kTimeLimit);
  const bool isSwitchedOff = error.code() == QVClientError::Code::serviceError &&
                             error.domain() == kQVClientReportingDomain &&
                             error.serviceCode() == kQVClientReportingSwitchedOff;
  if (!isSwitchedOff) expectTaken(error);
  return !isSwitchedOff;
}
