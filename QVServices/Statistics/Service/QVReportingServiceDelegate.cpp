#include "QVServices/Statistics/Service/QVReportingServiceDelegate.h"

#include "QVServices/Statistics/Service/QVReportingServer.h"
#include "QVServices/Statistics/Service/QVReportingServerInstance.h"
#include "platform/QVPlatform.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <utility>
#include <vector>

namespace {

constexpr const char* kConnectionFunction =
    "-[QVReportingServiceDelegate listener:shouldAcceptNewConnection:]";
constexpr const char* kLookupFunction = "-[QVReportingServiceDelegate findReportingSessionForID:]";
constexpr const char* kListenFunction =
    "-[QVReportingServiceDelegate listenForDefaultsNotification]";
constexpr const char* kPreferencesDomain = "net.quillon.quietvox";
constexpr const char* kDefaultsNotification = "net.quillon.quietvox.reporting";
constexpr const char* kDeviceName = "device_name";
constexpr const char* kDisableReporting = "disable_reporting";
constexpr const char* kUptimeEvent = "net.quillon.quietvox.qvreportingclientuptime";

using Client = QVReportingServerInstance;

QVPlatform& platform() {
  return QVPlatform::shared();
}
QVLog& log() {
  return *platform().log;
}
const QVLogScope* scope() {
  return QVReportingServer::logScope();
}

std::optional<std::string> processName(int32_t pid) {
  const QVProcess& process = *platform().process;
  if (pid == process.ownProcessIdentifier()) return process.ownProcessName();
  return pid >= 1 ? process.nameOfProcess(pid) : std::nullopt;
}

void handleInterruption(const std::shared_ptr<Client>& client) {
  log().standard(scope(), kConnectionFunction, "InterruptionHandler: connection exited");
  if (client) client->handleConnectionError();
}

// The time since the client was registered, as the uptime event tells it: -1 where the start is
// unknown, never negative else.
QVValue uptime(const std::optional<QVDate>& startDate, int32_t pid, std::string_view name) {
  if (!startDate) {
    log().standard(scope(), kConnectionFunction, "clientStartDate is nil. clientpid=", pid,
                   " clientprocessname=", name);
    return -1;
  }
  const std::chrono::duration<double> sinceStart = platform().clock->currentDate() - *startDate;
  if (sinceStart.count() < 0) {
    // The words are the reverse of the condition; tools match on them.
    log().standard(scope(), kConnectionFunction, "clientStartDate is in the past. clientpid=", pid,
                   " clientprocessname=", name);
  }
  return std::fabs(sinceStart.count());
}

void handleInvalidation(const std::shared_ptr<Client>& client, int32_t pid) {
  if (client) client->handleConnectionError();
  const auto name = client ? client->clientProcessName() : std::nullopt;
  const QVValue seconds = uptime(client ? client->clientStartDate() : std::nullopt, pid,
                                 name ? std::string_view(*name) : "unknown");
  const auto wholeSeconds = std::clamp<int64_t>(seconds.integerValue(), INT32_MIN, INT32_MAX);
  log().standard(scope(), kConnectionFunction,
                 "InvalidationHandler: connection exited process=", name,
                 " uptime_sec=", wholeSeconds);
  if (!name) {
    log().standard(scope(), kConnectionFunction, "clientProcessName is nil. clientpid=", pid);
    return;
  }
  platform().countwise->sendEventLazily(
      kUptimeEvent,
      [payload = QVDictionary{{"processName", *name}, {"seconds", seconds}}] { return payload; });
}

}  // namespace

std::shared_ptr<QVReportingServiceDelegate> QVReportingServiceDelegate::init() {
  QVReportingServer::setLogScope(log().registerScope(true, 0x71767273, "qvrs", kPreferencesDomain,
                                                     "reporting_server_verbose", 31));
  std::shared_ptr<QVReportingServiceDelegate> delegate(new QVReportingServiceDelegate);
  QVReportingServer::setQueue(platform().queues->makeSerialQueue(
      "net.quillon.quietvox.reporting.server", QVQualityOfService::userInteractive, 0));
  delegate->listenForDefaultsNotification();
  delegate->driverUtility_ = QVReportingDriverUtility::init();
  return delegate;
}

QVReportingServiceDelegate::~QVReportingServiceDelegate() {
  platform().notifications->cancel(defaultsToken_);
  // Queue and scope belong to the platform, which may end right after.
  QVReportingServer::setQueue(nullptr);
  QVReportingServer::setLogScope(nullptr);
}

QVDictionary QVReportingServiceDelegate::QVReportingDefaults() {
  const QVDictionary values = platform().preferences->valuesInDomain(kPreferencesDomain);
  std::vector<QVDictionaryEntry> defaults;
  const auto deviceName = QVPreferences::stringReading(values.find(kDeviceName));
  if (deviceName) defaults.push_back({kDeviceName, *deviceName});
  // Anything that is there is a value, a null included; what is no truth is false.
  const QVValue* disabled = values.find(kDisableReporting);
  defaults.push_back({kDisableReporting, disabled != nullptr
                                             ? QVValue(QVPreferences::booleanReading(disabled))
                                             : QVValue(0)});
  return QVDictionary::assemble(defaults);
}

void QVReportingServiceDelegate::listenForDefaultsNotification() {
  const uint32_t status = platform().notifications->registerDispatch(
      kDefaultsNotification, defaultsToken_, QVReportingServer::sharedQueue(),
      // A delivery that is enqueued when the service ends finds nobody.
      [delegate = weak_from_this()](int32_t token) {
        if (const auto self = delegate.lock()) self->handleDefaultsNotification(token);
      });
  log().standard(scope(), kListenFunction, "notify setup result ", static_cast<int32_t>(status));
}

void QVReportingServiceDelegate::handleDefaultsNotification(int32_t token) {
  if (token != defaultsToken_) return;
  log().standard(scope(), kListenFunction, "re-reading quietvox defaults");
  defaults_ = QVReportingDefaults();
  log().info(scope(), kListenFunction, "defaults ", defaults_);
  for (const auto& client : clients_) {
    for (const auto& [reporterID, session] : client->clientReportingSessionMap()) {
      session->updateDefaults(defaults_);
    }
  }
  reportingEnabled_ = !QVPreferences::booleanReading(defaults_.find(kDisableReporting));
}

bool QVReportingServiceDelegate::listener(
    [[maybe_unused]] QVIPCListener& listener,
    const std::shared_ptr<QVIPCConnection>& shouldAcceptNewConnection) {
  QVIPCConnection& connection = *shouldAcceptNewConnection;
  const int32_t pid = connection.processIdentifier();
  log().standard(scope(), kConnectionFunction, "newConnection: ", connection.description());

  std::weak_ptr<Client> client;
  {
    const std::lock_guard lock(mutex_);
    connection.setExportedInterface(QVIPCInterface::reportingService);
    const auto instance = Client::initWithPID(pid, weak_from_this());
    connection.setExportedObject(instance);
    // From here on the connection holds the only strong reference, until registration.
    client = instance;
  }
  // Enqueued before the connection delivers anything, so it runs before the client's operations.
  QVReportingServer::queue().async([self = shared_from_this(), client, pid] {
    if (const auto instance = client.lock()) self->registerClient(instance, pid);
  });
  connection.setInterruptionHandler([client] { handleInterruption(client.lock()); });
  connection.setInvalidationHandler([client, pid] { handleInvalidation(client.lock(), pid); });
  connection.resume();
  return true;
}

void QVReportingServiceDelegate::registerClient(const std::shared_ptr<Client>& client,
                                                int32_t pid) {
  clients_.push_back(client);
  client->setClientStartDate(platform().clock->currentDate());
  client->setClientProcessName(processName(pid));
}

void QVReportingServiceDelegate::removeClient(const QVReportingServerInstance& client) {
  std::erase_if(clients_, [&client](const auto& listed) { return listed.get() == &client; });
}

std::shared_ptr<QVReportingSession> QVReportingServiceDelegate::findReportingSessionForID(
    int64_t reporterID) const {
  const std::lock_guard lock(mutex_);
  if (reporterID == 0 || !reportingEnabled_) return nullptr;
  for (const auto& client : clients_) {
    const auto& sessions = client->clientReportingSessionMap();
    const auto found = sessions.find(reporterID);
    if (found == sessions.end()) continue;
    log().info(scope(), kLookupFunction, "found reporting session ", reporterID, " for client ",
               client->processIdentifier());
    return found->second;
  }
  log().error(scope(), kLookupFunction, "failed to find reporting session ", reporterID);
  return nullptr;
}
