#include "QVServices/Statistics/Service/QVReportingSession.h"

#include "QVServices/Statistics/QVReportingUtility.h"
#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingBeaconClient.h"
#include "QVServices/Statistics/Service/QVReportingRunStep.h"
#include "QVServices/Statistics/Service/QVReportingSessionLog.h"
#include "platform/QVPlatform.h"

#include <cstdlib>
#include <utility>

namespace {

constexpr uint32_t kTraceCreated = 0x21042828;
constexpr uint32_t kTraceStarted = 0x2104282C;
constexpr uint32_t kTraceStopped = 0x21042830;
constexpr uint32_t kTraceDestroyed = 0x21042834;

// Kept as the text that it is set as, and read as a number.
constexpr const char* kBackendWaitSeconds = "9.0";

QVPlatform& platform() {
  return QVPlatform::shared();
}
QVLog& log() {
  return *platform().log;
}
const QVLogScope* scope() {
  return QVReportingSessionLog::scope();
}

// What the completion of a backend search and the waiting set-up share. The flag is written and
// read under the condition's lock.
struct BackendSearch {
  std::shared_ptr<QVCondition> condition;
  bool found;
};

void handleBackends(BackendSearch& search, const std::optional<QVArray>& backends) {
  constexpr const char* kFunction = "-[QVReportingSession start]";
  if (!backends) {
    log().error(scope(), kFunction, "No backends found, this session won't get sent to the server");
    return;
  }
  log().standard(scope(), kFunction, "List of backends ", *backends);
  const std::lock_guard lock(*search.condition);
  search.found = true;
  search.condition->signal();
}

}  // namespace

std::shared_ptr<QVReportingSession> QVReportingSession::initWithID(
    int64_t reporterID, std::vector<int32_t> processIdentifiers, std::size_t maximumBytes) {
  QVReportingSessionLog::registerScope();
  std::shared_ptr<QVReportingSession> session(
      new QVReportingSession(reporterID, std::move(processIdentifiers), maximumBytes));
  log().info(scope(), "-[QVReportingSession initWithID:processIdentifiers:]",
             "created reporting session for ID: ", reporterID);
  platform().tracePoints->mark(kTraceCreated);
  return session;
}

QVReportingSession::QVReportingSession(int64_t reporterID, std::vector<int32_t> processes,
                                       std::size_t maximumBytes)
    : reporterID_(reporterID),
      processIdentifiers_(std::move(processes)),
      userInfo_(std::make_shared<QVReportingUserInfo>()),
      beaconQueue_(platform().queues->makeSerialQueue("net.quillon.quietvox.session.beacon",
                                                      QVQualityOfService::utility, 0)),
      maximumBytes_(maximumBytes),
      serviceType_(kQVReportingServiceTypeUnknown),
      serviceName_("unknown") {
  makeEmptyPayloadArrays();
}

QVReportingSession::~QVReportingSession() {
  constexpr const char* kFunction = "-[QVReportingSession dealloc]";
  QVReportingRunStep(scope(), kFunction, "log the end of reporter", reporterID_, [this] {
    log().info(scope(), kFunction, "deallocing this session ", reporterID_);
  });
  platform().tracePoints->mark(kTraceDestroyed);
}

void QVReportingSession::setServiceType(uint16_t serviceType) {
  serviceType_ = serviceType;
  serviceName_ = QVReportingServiceTypeName(serviceType);
  log().info(scope(), "-[QVReportingSession setServiceType:]", "setting service type ",
             serviceName_);
}

void QVReportingSession::setConfiguration(const QVDictionary& configuration) {
  addUserInformation(configuration, "-[QVReportingSession setConfiguration:]", false);
}

void QVReportingSession::updateDefaults(const QVDictionary& defaults) {
  // The service's own are not what clients can keep away.
  addUserInformation(defaults, "-[QVReportingSession updateDefaults:]", true);
}

void QVReportingSession::addUserInformation(const QVDictionary& entries, const QVLogSite& site,
                                            bool mayOverdraw) {
  using enum QVReportingUserInfo::Addition;
  switch (userInfo_->addEntries(entries, mayOverdraw)) {
    case done:
      break;
    case tooLargeForOne:
      log().error(scope(), site, "user information of ", reporterID_, " would be larger than ",
                  QVReportingUserInfo::kMaximumBytes, " bytes, nothing added");
      break;
    case tooLargeForAll:
      log().error(scope(), site, "user information of all sessions would be larger than ",
                  QVReportingUserInfoAccount::kMaximumBytes, " bytes, nothing added for ",
                  reporterID_);
      break;
  }
}

void QVReportingSession::start() {
  constexpr const char* kFunction = "-[QVReportingSession start]";
  log().verbose(scope(), kFunction, "starting session owned by ", reporterID_);
  if (started_) {
    log().info(scope(), kFunction, reporterID_, " is already started");
    return;
  }
  started_ = true;
  makeEmptyPayloadArrays();
  platform().tracePoints->mark(kTraceStarted);
  if (shouldReportOrientation()) registerForOrientation();
  // Name and type are those of now, the user information is read when the set-up runs.
  beaconQueue_->async([self = shared_from_this(), serviceName = serviceName_,
                       serviceType = serviceType(), startFlag = beaconSessionStarted()] {
    self->setUpBeaconSession(serviceName, serviceType, startFlag);
  });
}

void QVReportingSession::setUpBeaconSession(std::optional<std::string_view> name, uint16_t type,
                                            bool startFlag) {
  if (type == kQVReportingServiceTypeTest) return;

  QVBeacon& beacon = *platform().beacon;
  beaconAgentToken_ = beacon.newSecureHierarchyTokenFromParentToken(nullptr);
  const bool realtime = type == kQVReportingServiceTypeAPIUsage;
  const QVDictionary sessionInfo{
      {kBeaconSessionInfoClientType, QVReportingBeaconClient::kType},
      {kBeaconSessionInfoClientVersion, QVReportingBeaconClient::version()},
      {kBeaconSessionInfoSessionID, reporterID_},
      {kBeaconSessionInfoBatchEvent, !realtime},
      {kBeaconSessionInfoHierarchyToken, beaconAgentToken_->description()},
      {kBeaconSessionInfoContainsRealtimeEvents, realtime}};
  // The client's entries come last: they may replace the two names.
  const QVDictionary userInfo = QVDictionary{
      {kBeaconUserInfoClientName, QVReportingBeaconClient::kName},
      {kBeaconUserInfoServiceName,
       QVText(name, "_session")}}.merging(this->userInfo());
  beaconSession_ = beacon.initWithSessionInfo(sessionInfo, userInfo, {});

  const auto search =
      std::make_shared<BackendSearch>(platform().conditions->makeCondition(), startFlag);
  beaconSession_->startConfigurationWithCompletionHandler(
      [search](const std::optional<QVArray>& backends) { handleBackends(*search, backends); });
  if (!QVReportingUtilityWait(*search->condition, search->found,
                              "waiting for beacond to find backends", "failed to find backend",
                              scope(), std::strtod(kBackendWaitSeconds, nullptr))) {
    beaconSession_ = nullptr;
    beaconSessionStarted_ = false;
  }
  // Success is not stored: it is known to the search alone, and `beaconSessionStarted` stays false.
}

void QVReportingSession::stop() noexcept {
  constexpr const char* kFunction = "-[QVReportingSession stop]";
  const auto run = [this](std::string_view what, auto&& step) {
    QVReportingRunStep(scope(), kFunction, what, reporterID_, step);
  };
  const auto logEnd = [this] { log().verbose(scope(), kFunction, "ending session ", reporterID_); };
  run("log the end of reporter", logEnd);
  run("unregister the callbacks of reporter", [this] {
    if (shouldReportOrientation()) unregisterFromOrientation(kFunction);
  });
  if (!started_) return;

  // Written again for a started session; tools count on two lines.
  run("log the end of reporter", logEnd);
  platform().tracePoints->mark(kTraceStopped);
  run("send the summary event of reporter", [this] {
    const QVDictionary summary = createSummaryEventForSession();
    if (summary.isAbsent()) return;
    log().standard(scope(), kFunction, "sending summary event for reporter ", reporterID_);
    sendMessage(summary, kQVReportingCategorySummary, kQVReportingMessageTypeSummary, true, {});
  });
  run("write the summary file of reporter", [this] { writeSummaryJson(); });
  run("flush the messages of reporter",
      [this] { beaconQueue_->async([self = shared_from_this()] { self->flushBeaconSession(); }); });
  replacePayloadArrays(nullptr, nullptr);
  started_ = false;
}

void QVReportingSession::flushBeaconSession() {
  if (serviceType() == kQVReportingServiceTypeTest || beaconSession_ == nullptr) return;
  beaconSession_->flushMessagesWithCompletion([](const std::optional<QVError>& error) {
    if (error) {
      log().error(scope(), "-[QVReportingSession stop]", "flush error ", error->description());
    }
  });
  beaconSession_ = nullptr;
}

std::shared_ptr<QVReportingPayloadArray> QVReportingSession::aggregatedPayloadData() const {
  const std::lock_guard lock(propertiesMutex_);
  return aggregatedPayloadData_;
}

std::shared_ptr<QVReportingPayloadArray> QVReportingSession::nestedAggregatedPayloadData() const {
  const std::lock_guard lock(propertiesMutex_);
  return nestedAggregatedPayloadData_;
}

void QVReportingSession::replacePayloadArrays(std::shared_ptr<QVReportingPayloadArray> aggregated,
                                              std::shared_ptr<QVReportingPayloadArray> nested) {
  // Each property changes under the lock of the array that it held, so that whoever has that lock
  // works on the array that the session means; the lock is let go before the array may go.
  const auto replace = [this](std::shared_ptr<QVReportingPayloadArray>& property,
                              std::shared_ptr<QVReportingPayloadArray>& replacement) {
    std::shared_ptr<QVReportingPayloadArray> old;
    {
      const std::lock_guard lock(propertiesMutex_);
      old = property;
    }
    std::unique_lock<QVReportingPayloadArray> arrayLock;
    if (old) arrayLock = std::unique_lock(*old);
    const std::lock_guard lock(propertiesMutex_);
    property = std::move(replacement);
  };
  replace(aggregatedPayloadData_, aggregated);
  replace(nestedAggregatedPayloadData_, nested);
}

void QVReportingSession::setTransactionCompleteBlock(Reply<bool> block) {
  transactionCompleteBlock_ = std::move(block);
}

std::string QVReportingSession::description() const {
  return QVText("<QVReportingSession ", reporterID_, '>');
}
