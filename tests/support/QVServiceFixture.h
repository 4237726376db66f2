#pragma once

#include "QVServices/Statistics/Service/QVReportingServiceDelegate.h"
#include "platform/fake/QVFakePlatform.h"
#include "tests/support/QVJournal.h"
#include "tests/support/QVTestClient.h"

#include <cstdint>
#include <list>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>

// Trace codes of the operations on the server queue, and of what happens inside a session.
inline constexpr uint32_t kTraceCreate = 0x21042814;
inline constexpr uint32_t kTraceStart = 0x21042818;
inline constexpr uint32_t kTraceStop = 0x2104281c;
inline constexpr uint32_t kTraceDestroy = 0x21042820;
inline constexpr uint32_t kTraceRouted = 0x21042824;
inline constexpr uint32_t kTraceSessionCreated = 0x21042828;
inline constexpr uint32_t kTraceSessionStarted = 0x2104282C;
inline constexpr uint32_t kTraceSessionStopped = 0x21042830;
inline constexpr uint32_t kTraceSessionDestroyed = 0x21042834;
inline constexpr uint32_t kTraceMessageSent = 0x21042838;

inline constexpr std::string_view kPreferencesDomain = "net.quillon.quietvox";
inline constexpr std::string_view kDefaultsNotification = "net.quillon.quietvox.reporting";

inline constexpr std::string_view kServerQueue = "net.quillon.quietvox.reporting.server";
inline constexpr std::string_view kSessionQueue = "net.quillon.quietvox.session.beacon";

// The whole core on a platform of fakes, for scenarios: clients connect, call and vanish, the test
// runs the queues and moves the time, and reads in the journal what happened in which order.
//
// The service starts with the first client, or when service() is first asked for, so that a test
// can set the verbose switches before: they are read as scopes are registered. The journal starts
// empty behind that, but for a service that startService() started.
class QVServiceFixture : public testing::Test {
 protected:
  QVServiceFixture() { journal_.listenTo(QVPlatform::shared()); }

  QVReportingServiceDelegate& service();
  void startService();
  void endService() { service_.reset(); }
  void makeServerVerbose() { platform_.log().setVerbose("reporting_server_verbose", true); }
  void makeSessionsVerbose() { platform_.log().setVerbose("reporting_session_verbose", true); }
  void makeInternalBuild() { platform_.deviceInformation().setAnswer("InternalBuild", true); }

  // What some process does that changed the preferences; the delivery waits on the server queue.
  void postDefaultsNotification() { platform_.notifications().post(kDefaultsNotification); }
  // Changes the preference and posts; the delivery has run, the journal starts empty behind it.
  void switchReporting(bool enabled);

  // Connects; the registration waits on the server queue.
  QVTestClient& connectClient(int32_t pid);
  // Connected and registered; the journal starts empty behind it.
  QVTestClient& registeredClient(int32_t pid);
  // The same with one session of the type.
  QVTestClient& clientWithSession(int32_t pid, int64_t reporterID, uint16_t serviceType = 1);
  // The same with the session started and its backends found.
  QVTestClient& clientWithStartedSession(int32_t pid, int64_t reporterID, uint16_t serviceType = 1);

  void runUntilIdle() { platform_.queues().runUntilIdle(); }
  void runServerQueue() { platform_.queues().runUntilIdle(kServerQueue); }
  void advance(QVDuration duration) { platform_.queues().advance(duration); }

  // What happened since it was last taken.
  std::vector<std::string> takeJournal() { return journal_.take(); }
  std::vector<std::string> replies() const { return journal_.entries("reply "); }

  // What the reporting framework saw since the last time: "session 1", "configuration 1", "message
  // 1: 3/1 {...}" (session, category/type, payload), "refused 1: ...", "single: 3/1 {...}",
  // "refused single: ...", "flush 1", "failed flush 1", "end 1".
  std::vector<std::string> takeBeaconStory();
  // The newest event of the kind; an empty one where there is none.
  QVFakeBeaconEvent latestBeaconEvent(QVFakeBeaconEvent::Kind kind);

  // Made before the platform and dropped after it: what goes with the platform still tells.
  QVJournal journal_;
  QVFakePlatform platform_;
  std::shared_ptr<QVReportingServiceDelegate> service_;
  std::list<QVTestClient> clients_;
};

// Journal entries of lines that the core's classes write. `operation` is the name between the
// class and the closing bracket.
std::string hostLine(QVLogLevel level, std::string_view operation, std::string_view text);
std::string clientLine(QVLogLevel level, std::string_view operation, std::string_view text);
std::string sessionLine(QVLogLevel level, std::string_view operation, std::string_view text);
std::string driverLine(QVLogLevel level, std::string_view operation, std::string_view text);
// Of the look through all clients, with the client that has the session, or where none has it.
std::string lookupHit(int64_t reporterID, int32_t pid);
std::string lookupFailure(int64_t reporterID);
// Of the session's class operation that sends single messages.
std::string singleLine(QVLogLevel level, std::string_view text, std::string_view scope = "qvrr");
// Of QVReportingUtilityWait, on the sessions' scope.
std::string waitLine(QVLogLevel level, std::string_view text);
