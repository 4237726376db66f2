#include "tools/qvctl/QVSessionSetup.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVTypedValue.h"

#include <unistd.h>

namespace {

QVClientServiceType typeOf(const std::string& name) {
  const auto type = QVParseServiceType(name);
  if (!type) {
    throw QVToolFailure(QVToolStatus::wrongUsage,
                        QVText("no service type is called \"", name, "\""));
  }
  return static_cast<QVClientServiceType>(*type);
}

}  // namespace

QVClientPayload QVSessionSetup::values() const {
  return QVMakePayload(QVPayloadOf::configuration, configuration, entries);
}

void QVSessionSetup::check() const {
  typeOf(service);
  // Standard input can be read once only.
  if (configuration != "-") values();
  if (reporterID == 0) throw QVToolFailure(QVToolStatus::wrongUsage, "0 is no session's ID");
}

int64_t QVSessionSetup::create(QVServiceConnection& connection) const {
  const int64_t session = reporterID.value_or(::getpid());
  const QVClientServiceType type = typeOf(service);
  const QVClientPayload configured = values();
  if (connection.serviceType(session)) {
    throw QVToolFailure(QVToolStatus::failed, QVText("there is a session ", session, " already"));
  }
  connection.ask(&QVClient::createReportingSessionAndWait, session);
  connection.ask(&QVClient::setServiceTypeAndWait, type, session);
  if (!configured.entries().empty()) {
    connection.ask(&QVClient::setConfigurationAndWait, configured, session);
  }
  return session;
}
