#pragma once

#include "QVServices/Statistics/QVReportingDriverSnapShot.h"
#include "QVServices/Statistics/QVReportingSessionInformation.h"
#include "QVServices/Statistics/QVReportingUserInfo.h"
#include "QVServices/Statistics/Service/QVReportingPayloadArray.h"
#include "platform/QVBeacon.h"
#include "platform/QVDate.h"
#include "platform/QVLog.h"
#include "platform/QVReportingServiceProtocol.h"
#include "platform/QVWorkQueue.h"

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// One reporting session of one audio client, named by the reporter ID that the client chose. Its
// client's QVReportingServerInstance makes and owns it; while started it drives a session of the
// real-time reporting framework on a serial queue of its own.
//
//   Created --start--> Starting --backends found--> Started
//                          |  `---none found------> Started without backends
//   any of the three --stop--> Stopped --start--> Starting
//
// Created and Stopped: messages are counted and go out as single messages. From `start` on they are
// collected for the summary and sent into the framework session (dropped without backends). Those
// of the time before the first start are collected, too, and thrown away by it. Dropping a started
// session neither stops nor summarises it. One that reports its orientation is kept alive by the
// orientation service until it is stopped.
//
// Threads: the operations run on the server queue; properties that other threads read are atomic or
// locked as noted. Everything of the framework session happens on `beaconQueue`, in the order in
// which it was queued; the set-up there waits for backends, so no message overtakes it. Changes of
// the orientation come on the orientation service's thread.
class QVReportingSession final : public QVReportingSessionInformation,
                                 public std::enable_shared_from_this<QVReportingSession> {
 public:
  using SendReply = Reply<std::optional<QVError>>;
  using DriverSnapShot = std::shared_ptr<const QVReportingDriverSnapShot>;
  using MessageTypeCounts = std::map<std::string, uint32_t, std::less<>>;

  // Collects up to `maximumBytes` at a time; what comes after that is sent all the same, and one
  // error line says so.
  static std::shared_ptr<QVReportingSession> initWithID(
      int64_t reporterID, std::vector<int32_t> processIdentifiers,
      std::size_t maximumBytes = QVReportingPayloadStore::kMaximumBytes);
  ~QVReportingSession() override;
  QVReportingSession(const QVReportingSession&) = delete;
  QVReportingSession& operator=(const QVReportingSession&) = delete;

  void setServiceType(uint16_t serviceType);
  // Merge a client's configuration, or the service's defaults, into the user information.
  void setConfiguration(const QVDictionary& configuration);
  void updateDefaults(const QVDictionary& defaults);

  // Both return at once; the framework's work goes on behind. A second `start`, or a `stop` of a
  // session that is not started, changes nothing. A `stop` always comes to its end: a step that
  // fails costs an error line and what that step was to do.
  void start();
  void stop() noexcept;

  // Numbers, records and sends one message. The reply (may be empty) is answered with no error,
  // without waiting for the framework; what becomes of the send is never told.
  void sendMessage(const QVDictionary& message, uint32_t category, uint16_t type, SendReply reply);
  // `sync` is accepted and ignored: every send is asynchronous.
  void sendMessage(const QVDictionary& message, uint32_t category, uint16_t type, bool sync,
                   SendReply reply);

  // The same for one session of many: `payload` is the message's normalised payload, made once for
  // all of them.
  void sendMessage(const QVDictionary& message, const QVDictionary& payload, uint32_t category,
                   uint16_t type);

  // Sends a message that belongs to no session, on the shared background queue, for alarms after a
  // random delay of up to 59 s. `userInfo` is ignored. The reply (may be empty) gets the outcome.
  static void sendSingleMessage(const QVDictionary& message, uint32_t category, uint16_t type,
                                uint16_t serviceType, const QVDictionary& userInfo,
                                SendReply reply);

  // CATEGORY_TYPE_N, where N counts the messages of that category and type from 1, over all starts.
  // Counts as a side effect. Server queue.
  std::string messageIdForCategory(uint32_t category, uint16_t type);

  // The columns of everything recorded; absent where nothing was.
  QVDictionary createSummaryEventForSession() const;
  // On an internal build, writes what was recorded to a file, behind the user information that it
  // puts before it. Takes its time; a failure is logged, and nothing else comes of it.
  void writeSummaryJson();
  bool shouldReportOrientation() const;

  bool started() const { return started_; }
  bool beaconSessionStarted() const { return beaconSessionStarted_; }
  uint16_t serviceType() const { return serviceType_; }
  std::optional<std::string_view> serviceName() const { return serviceName_; }
  int64_t reporterID() const { return reporterID_; }
  const std::vector<int32_t>& processIdentifiers() const { return processIdentifiers_; }
  QVDictionary userInfo() const override { return userInfo_->contents(); }
  // Absent after a stop. Take one copy, lock that object.
  std::shared_ptr<QVReportingPayloadArray> aggregatedPayloadData() const;
  std::shared_ptr<QVReportingPayloadArray> nestedAggregatedPayloadData() const;
  const MessageTypeCounts& messageTypeCounts() const { return messageTypeCounts_; }
  // While orientation callbacks are registered, and after it where they stay registered.
  std::optional<std::string> orientationCallbackID() const;
  std::optional<QVDate> startDate() const;

  // Kept here for the operations that start and stop the session; absent when cleared.
  const DriverSnapShot& driverSnapShot() const { return driverSnapShot_; }
  void setDriverSnapShot(DriverSnapShot snapShot) { driverSnapShot_ = std::move(snapShot); }
  Reply<bool>& transactionCompleteBlock() { return transactionCompleteBlock_; }
  void setTransactionCompleteBlock(Reply<bool> block);

  std::string description() const;

 private:
  struct Message;
  struct MessageIdentifier;

  QVReportingSession(int64_t reporterID, std::vector<int32_t> processes, std::size_t maximumBytes);

  void addUserInformation(const QVDictionary& entries, const QVLogSite& site, bool mayOverdraw);
  void setUpBeaconSession(std::optional<std::string_view> name, uint16_t type, bool startFlag);
  void sendOnBeaconQueue(const Message& message);
  void flushBeaconSession();

  void registerForOrientation();
  void unregisterFromOrientation(const QVLogSite& site);

  MessageIdentifier nextIdentifier(uint32_t category, uint16_t type);
  void replacePayloadArrays(std::shared_ptr<QVReportingPayloadArray> aggregated,
                            std::shared_ptr<QVReportingPayloadArray> nested);
  void makeEmptyPayloadArrays();

  // Constant after creation.
  const int64_t reporterID_;
  const std::vector<int32_t> processIdentifiers_;
  const std::shared_ptr<QVReportingUserInfo> userInfo_;  // locked inside
  const std::shared_ptr<QVWorkQueue> beaconQueue_;
  const std::size_t maximumBytes_;

  // Any thread.
  std::atomic<bool> started_{false};
  std::atomic<bool> beaconSessionStarted_{false};
  std::atomic<uint16_t> serviceType_;
  mutable std::mutex propertiesMutex_;
  // Guarded by propertiesMutex_; of the arrays the pointers, not what they point to.
  std::shared_ptr<QVReportingPayloadArray> aggregatedPayloadData_;
  std::shared_ptr<QVReportingPayloadArray> nestedAggregatedPayloadData_;
  std::optional<std::string> orientationCallbackID_;
  std::optional<QVDate> startDate_;

  // Server queue only.
  std::optional<std::string_view> serviceName_;
  DriverSnapShot driverSnapShot_;
  Reply<bool> transactionCompleteBlock_;
  MessageTypeCounts messageTypeCounts_;

  // beaconQueue only.
  std::shared_ptr<QVBeaconSession> beaconSession_;
  std::shared_ptr<BeaconSecureHierarchyToken> beaconAgentToken_;
};
