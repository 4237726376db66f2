#include "tools/qvctl/QVServiceConnection.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVWhoMay.h"

#include <cerrno>

#include <unistd.h>

namespace {

QVToolFailure cannotReach(const QVToolPlaces& places, const QVClientError& error) {
  std::string text = "cannot reach the service: ";
  const std::string problem = places.socketProblem();
  if (!problem.empty()) return {QVToolStatus::notRunning, text.append(problem)};
  text.append(error.text());
  const bool isClosed = ::access(places.socket.c_str(), W_OK) != 0 && errno == EACCES;
  if (!isClosed) return {QVToolStatus::notRunning, text};
  return {QVToolStatus::notPermitted, text.append(QVWhoMay(places.socket, W_OK))};
}

}  // namespace

QVServiceConnection::QVServiceConnection(const QVToolPlaces& places, std::function<void()> lost,
                                         Patience patience)
    : patience_(patience) {
  QVClientOptions options;
  options.socketPath = places.socket.string();
  options.connectTimeLimit = patience_.limit;
  if (lost) {
    options.connectionLost = [lost = std::move(lost)](const QVClientError& /*error*/) { lost(); };
  }
  const std::unique_ptr<QVWaitNotice> notice = notify();
  auto connected = QVClient::connect(std::move(options));
  isSaid_ = notice->end();
  if (!connected) throw cannotReach(places, connected.error());
  client_ = std::move(connected.value());
}

std::unique_ptr<QVWaitNotice> QVServiceConnection::notify() const {
  return isSaid_ ? nullptr : std::make_unique<QVWaitNotice>(patience_.moment);
}

QVToolFailure QVServiceConnection::failure(const QVClientError& error) const {
  using Code = QVClientError::Code;
  switch (error.code()) {
    case Code::timedOut:
      return {QVToolStatus::notRunning,
              QVText("the service does not answer: it has said nothing for ",
                     std::chrono::duration<double>(patience_.limit).count(), " s")};
    case Code::cannotConnect:
    case Code::connectionLost:
      return {QVToolStatus::notRunning, "the service does not answer: " + error.text()};
    default:
      return {QVToolStatus::failed, error.text()};
  }
}

std::vector<int64_t> QVServiceConnection::reporters() {
  return ask(&QVClient::getAllReportersAndWait);
}

std::optional<uint16_t> QVServiceConnection::serviceType(int64_t reporterID) {
  const QVClientReporter reporter = ask(&QVClient::reporterIDValidAndWait, reporterID);
  if (reporter.reporterID == 0) return std::nullopt;
  return static_cast<uint16_t>(reporter.serviceType);
}

bool QVServiceConnection::isReporting() {
  const QVClientTargets noSession{std::span<const int64_t>()};
  const QVClientError error =
      wait(&QVClient::sendMessageAndWait, QVClientPayload(),
           QVClientCategory(QVClientKind::generic), QVClientMessageType::generic, noSession);
  const bool isSwitchedOff = error.code() == QVClientError::Code::serviceError &&
                             error.domain() == kQVClientReportingDomain &&
                             error.serviceCode() == kQVClientReportingSwitchedOff;
  if (!isSwitchedOff) expectTaken(error);
  return !isSwitchedOff;
}
