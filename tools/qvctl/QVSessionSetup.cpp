#include "tools/qvctl/QVSessionSetup.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVTypedValue.h"

#include <unistd.h>

namespace {

constexpr auto kTimeLimit = QVServiceConnection::kTimeLimit;

QVClientServiceType typeOf(const std::string& name) {
  const auto type = QVParseServiceType(name);
  if (!type) {
    throw QVToolFailure(QVToolStatus::wrongUsage,
                        QVText("no service type is called \"", name, "\""));
  }
  return static_cast<QVClientServiceType>(*type);
}

}  // namespace

void QVSessionSetup::check() const {
  typeOf(service);
  // Standard input can be read once only.
  if (configuration != "-") QVMakePayload(configuration, entries);
  if (reporterID == 0) throw QVToolFailure(QVToolStatus::wrongUsage, "0 is no session's ID");
}

int64_t QVSessionSetup::create(QVServiceConnection& connection) const {
  const int64_t session = reporterID.value_or(::getpid());
  const QVClientServiceType type = typeOf(service);
  const QVClientPayload values = QVMakePayload(configuration, entries);
  if (connection.serviceType(session)) {
    throw QVToolFailure(QVToolStatus::failed, QVText("there is a session ", session, " already"));
  }
  QVClient& client = connection.client();
  QVServiceConnection::answer(client.createReportingSessionAndWait(session, kTimeLimit));
  QVServiceConnection::answer(client.setServiceTypeAndWait(type, session, kTimeLimit));
  if (!values.entries().empty()) {
    QVServiceConnection::answer(client.setConfigurationAndWait(values, session, kTimeLimit));
  }
  return session;
}
