#include "tests/support/QVTestClient.h"

#include "platform/QVText.h"

#include <utility>

Reply<bool> QVTestClient::booleanReply(std::string operation) {
  return [journal = journal_, entry = QVText("reply ", pid(), ' ', operation, ": ")](bool handled) {
    journal->note(entry + (handled ? "YES" : "NO"));
  };
}

void QVTestClient::create(int64_t reporterID) {
  connection_->call().createReportingSession(reporterID,
                                             booleanReply(QVText("create ", reporterID)));
}

void QVTestClient::setServiceType(uint16_t serviceType, int64_t reporterID) {
  connection_->call().setServiceType(serviceType, reporterID,
                                     booleanReply(QVText("setServiceType ", reporterID)));
}

void QVTestClient::getServiceType(int64_t reporterID) {
  connection_->call().getServiceNameForReporterID(
      reporterID,
      [journal = journal_, entry = QVText("reply ", pid(), " getServiceType ", reporterID, ": ")](
          uint16_t serviceType) { journal->note(QVText(entry, serviceType)); });
}

void QVTestClient::setConfiguration(const QVDictionary& configuration, int64_t reporterID) {
  connection_->call().setConfiguration(configuration, reporterID,
                                       booleanReply(QVText("setConfiguration ", reporterID)));
}

void QVTestClient::start(int64_t reporterID) {
  connection_->call().startReportingSessionForID(reporterID,
                                                 booleanReply(QVText("start ", reporterID)));
}

void QVTestClient::send(const QVDictionary& message, uint32_t category, uint16_t type,
                        QVReportingServiceProtocol::ReporterIDs reporterIDs) {
  connection_->call().sendMessage(
      message, category, type, std::move(reporterIDs),
      [journal = journal_,
       entry = QVText("reply ", pid(), " send: ")](const std::optional<QVError>& error) {
        journal->note(error ? QVText(entry, error->domain, ' ', error->code, ' ', error->userInfo)
                            : entry + "nil");
      });
}

void QVTestClient::send(const QVDictionary& message, std::vector<int64_t> reporterIDs,
                        uint32_t category, uint16_t type) {
  send(message, category, type, QVReportingServiceProtocol::ReporterIDs(std::move(reporterIDs)));
}

void QVTestClient::sendToAll(const QVDictionary& message, uint32_t category, uint16_t type) {
  send(message, category, type, std::nullopt);
}

void QVTestClient::stop(int64_t reporterID) {
  connection_->call().stopReportingSessionForID(reporterID,
                                                booleanReply(QVText("stop ", reporterID)));
}

void QVTestClient::destroy(int64_t reporterID) {
  connection_->call().destroyReportingSession(reporterID,
                                              booleanReply(QVText("destroy ", reporterID)));
}

void QVTestClient::validate(int64_t reporterID) {
  connection_->call().reporterID(
      reporterID,
      [journal = journal_, entry = QVText("reply ", pid(), " validate ", reporterID, ": ")](
          const QVDictionary& answer) { journal->note(QVText(entry, answer)); });
}

void QVTestClient::listReporters() {
  connection_->call().getAllReporters(
      [journal = journal_,
       entry = QVText("reply ", pid(), " reporters:")](const std::vector<int64_t>& reporterIDs) {
        std::string text = entry;
        for (const int64_t reporterID : reporterIDs) text += QVText(' ', reporterID);
        journal->note(std::move(text));
      });
}

void QVTestClient::killService() {
  connection_->call().killService(booleanReply("kill"));
}

std::shared_ptr<QVReportingServerInstance> QVTestClient::instance() const {
  return std::static_pointer_cast<QVReportingServerInstance>(connection_->exportedObject());
}

std::shared_ptr<QVReportingSession> QVTestClient::session(int64_t reporterID) const {
  const auto client = instance();
  return client == nullptr ? nullptr : client->findReportingSessionForID(reporterID, false);
}
