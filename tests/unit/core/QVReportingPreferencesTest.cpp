// The service-wide preferences and the reporting switch: when they are read, and what of it.

#include "QVServices/Statistics/Service/QVReportingServer.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVLogDetour.h"

#include <string>
#include <utility>
#include <vector>

namespace {

using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::string_view kListen = "listenForDefaultsNotification";

class QVReportingPreferencesTest : public QVServiceFixture {
 protected:
  void setPreference(std::string_view key, QVValue value) {
    platform_.preferences().setValue(kPreferencesDomain, key, std::move(value));
  }
  void removePreference(std::string_view key) {
    platform_.preferences().removeValue(kPreferencesDomain, key);
  }
  void postAndRun() {
    postDefaultsNotification();
    runServerQueue();
  }
  // Leaves sessions too little room for the device name of the next notification: they say so, and
  // so tell when they were given the defaults.
  void fillUserInformation(QVTestClient& client, int64_t reporterID) {
    client.setConfiguration({{"text", std::string(65'000, 'x')}}, reporterID);
    setPreference("device_name", std::string(1000, 'n'));
  }
  static std::string complaint(int64_t reporterID) {
    return sessionLine(error, "updateDefaults:",
                       QVText("user information of ", reporterID,
                              " would be larger than 65536 bytes, nothing added"));
  }
  // What is written before the sessions are given them.
  std::string readingLine() { return hostLine(standard, kListen, "re-reading quietvox defaults"); }
  std::string defaultsLine() {
    return hostLine(info, kListen, QVText("defaults ", service().getDefaults()));
  }
  std::string refusal(int32_t pid) {
    return QVText("reply ", pid, " send: net.quillon.audio.reporting 1 {}");
  }
};

// ---- registration

TEST_F(QVReportingPreferencesTest, RegistersForTheNotificationOnTheServerQueue) {
  startService();
  EXPECT_EQ(platform_.notifications().registrationCount(kDefaultsNotification), 1U);
  EXPECT_EQ(platform_.notifications().registrationCount(), 1U);
  postDefaultsNotification();
  EXPECT_EQ(platform_.queues().pendingCount(kServerQueue), 1U);
}

TEST_F(QVReportingPreferencesTest, RunsOnEnabledAndWithoutDefaultsWhereTheRegistrationFails) {
  platform_.notifications().setRegistrationStatus(QVNotifications::kStatusFailed);
  setPreference("disable_reporting", true);
  startService();
  EXPECT_THAT(takeJournal(),
              ElementsAre(hostLine(standard, kListen, "notify setup result 1000000"),
                          driverLine(info, "init", "creating tallying driver utility")));
  postAndRun();
  EXPECT_THAT(takeJournal(), IsEmpty());
  EXPECT_TRUE(service().isReportingEnabled());
  EXPECT_TRUE(service().getDefaults().isAbsent());
}

TEST_F(QVReportingPreferencesTest, PrintsTheSignedReadingOfTheStatus) {
  platform_.notifications().setRegistrationStatus(0xFFFFFFFF);
  startService();
  EXPECT_EQ(takeJournal().at(0), hostLine(standard, kListen, "notify setup result -1"));
}

TEST_F(QVReportingPreferencesTest, EndsItsRegistrationWithTheService) {
  startService();
  endService();
  EXPECT_EQ(platform_.notifications().registrationCount(), 0U);
}

TEST_F(QVReportingPreferencesTest, IsNotKeptAliveByItsRegistrationOrADelivery) {
  startService();
  const std::weak_ptr<QVReportingServiceDelegate> watched = service_;
  platform_.listener().setDelegate({});
  postDefaultsNotification();
  endService();
  EXPECT_TRUE(watched.expired());
  journal_.forget();
  EXPECT_EQ(platform_.queues().runUntilIdle(), 1U) << "what was enqueued still runs";
  EXPECT_THAT(takeJournal(), IsEmpty()) << "but finds nobody";
  EXPECT_EQ(platform_.preferences().readingsOfDomain(kPreferencesDomain), 0U);
}

// ---- deliveries

TEST_F(QVReportingPreferencesTest, ReadsThePreferencesWhenTheNotificationIsPosted) {
  setPreference("device_name", "Kitchen");
  setPreference("disable_reporting", false);
  setPreference("reporting_server_verbose", true);
  service();
  postDefaultsNotification();
  EXPECT_TRUE(service().getDefaults().isAbsent()) << "not before the delivery has run";
  runServerQueue();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(hostLine(standard, kListen, "re-reading quietvox defaults"),
                  hostLine(info, kListen,
                           R"(defaults {"device_name":"Kitchen","disable_reporting":false})")));
  EXPECT_EQ(service().getDefaults(),
            (QVDictionary{{"device_name", "Kitchen"}, {"disable_reporting", false}}))
      << "and nothing else of the domain";
  EXPECT_EQ(platform_.preferences().readingsOfDomain(kPreferencesDomain), 1U);
}

TEST_F(QVReportingPreferencesTest, ReadsThePreferencesAfreshAtEachDelivery) {
  service();
  setPreference("device_name", "Kitchen");
  postAndRun();
  setPreference("device_name", "Hall");
  EXPECT_EQ(*service().getDefaults().find("device_name"), QVValue("Kitchen"))
      << "a change takes effect with the next post";
  postAndRun();
  EXPECT_EQ(*service().getDefaults().find("device_name"), QVValue("Hall"));
  removePreference("device_name");
  postAndRun();
  EXPECT_FALSE(service().getDefaults().contains("device_name"));
}

TEST_F(QVReportingPreferencesTest, TakesReportingAsEnabledWithoutPreferences) {
  service();
  postAndRun();
  EXPECT_THAT(takeJournal(),
              ElementsAre(hostLine(standard, kListen, "re-reading quietvox defaults"),
                          hostLine(info, kListen, R"(defaults {"disable_reporting":0})")));
  EXPECT_EQ(service().getDefaults().size(), 1U);
  EXPECT_EQ(*service().getDefaults().find("disable_reporting"), QVValue(0)) << "not a boolean";
  EXPECT_TRUE(service().isReportingEnabled());
}

TEST_F(QVReportingPreferencesTest, ReadsTheDeviceNameAsAString) {
  const std::vector<std::pair<QVValue, QVValue>> readings{{"", ""},
                                                          {17, "17"},
                                                          {1.5, "1.5"},
                                                          {QVArray{"a"}, QVValue()},
                                                          {QVDictionary{{"a", 1}}, QVValue()},
                                                          {QVValue(), QVValue()}};
  for (const auto& [value, reading] : readings) {
    setPreference("device_name", value);
    const QVDictionary defaults = QVReportingServiceDelegate::QVReportingDefaults();
    const QVValue* name = defaults.find("device_name");
    EXPECT_EQ(name == nullptr ? QVValue() : *name, reading) << QVText(value);
    EXPECT_EQ(name == nullptr, reading.isAbsent()) << QVText(value);
  }
}

TEST_F(QVReportingPreferencesTest, ReadsTheSwitchAsABooleanWhereItHasAValue) {
  const std::vector<std::pair<QVValue, QVValue>> readings{
      {true, true},      {false, false}, {1, true},           {0, false},
      {0.5, true},       {"YES", true},  {"true", true},      {"1", true},
      {"no", false},     {"off", false}, {QVArray{1}, false}, {QVDictionary{{"a", 1}}, false},
      {QVValue(), false}};
  service();
  for (const auto& [value, reading] : readings) {
    setPreference("disable_reporting", value);
    postAndRun();
    EXPECT_EQ(*service().getDefaults().find("disable_reporting"), reading) << QVText(value);
    EXPECT_EQ(service().isReportingEnabled(), reading != QVValue(true)) << QVText(value);
  }
}

TEST_F(QVReportingPreferencesTest, IgnoresADeliveryWithAForeignToken) {
  QVTestClient& client = clientWithSession(42, 7);
  setPreference("disable_reporting", true);
  setPreference("device_name", "Kitchen");
  EXPECT_EQ(platform_.notifications().postWithForeignToken(kDefaultsNotification), 1U);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), IsEmpty());
  EXPECT_TRUE(service().getDefaults().isAbsent());
  EXPECT_TRUE(service().isReportingEnabled());
  EXPECT_TRUE(client.session(7)->userInfo().empty());
  EXPECT_EQ(platform_.preferences().readingsOfDomain(kPreferencesDomain), 0U);
}

// ---- sessions

TEST_F(QVReportingPreferencesTest, GivesTheDefaultsToEverySessionStartedOrNot) {
  QVTestClient& first = clientWithStartedSession(42, 7);
  QVTestClient& second = clientWithSession(43, 7);
  second.create(8);
  second.setConfiguration({{"device_name", "mine"}, {"rate", 48000}}, 8);
  runUntilIdle();
  setPreference("device_name", "Kitchen");
  postAndRun();
  const QVDictionary defaults{{"device_name", "Kitchen"}, {"disable_reporting", 0}};
  EXPECT_EQ(first.session(7)->userInfo(), defaults);
  EXPECT_EQ(second.session(7)->userInfo(), defaults);
  EXPECT_EQ(second.session(8)->userInfo(), defaults.merging({{"rate", 48000}}))
      << "the later entry of a key counts";
}

TEST_F(QVReportingPreferencesTest, HandsTheDefaultsOutInTheOrderOfClientsAndSessions) {
  for (const int32_t pid : {43, 42}) {
    QVTestClient& client = connectClient(pid);
    for (const int64_t reporterID : {int64_t{pid} * 10 + 2, int64_t{pid} * 10 + 1}) {
      client.create(reporterID);
      fillUserInformation(client, reporterID);
    }
  }
  runUntilIdle();
  journal_.forget();
  postAndRun();
  EXPECT_THAT(takeJournal(), ElementsAre(readingLine(), defaultsLine(), complaint(431),
                                         complaint(432), complaint(421), complaint(422)));
}

TEST_F(QVReportingPreferencesTest, GivesNewSessionsNoDefaultsUntilTheNextNotification) {
  setPreference("device_name", "Kitchen");
  service();
  postAndRun();
  QVTestClient& client = clientWithSession(42, 7);
  EXPECT_TRUE(client.session(7)->userInfo().empty());
  postAndRun();
  EXPECT_EQ(client.session(7)->userInfo(), service().getDefaults());
}

// ---- the switch

TEST_F(QVReportingPreferencesTest, SwitchesReportingOffAndOnAgain) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  setPreference("disable_reporting", true);
  client.send({{"a", 1}}, {7});
  postDefaultsNotification();
  client.send({{"b", 2}}, {7});
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil", refusal(42)));
  EXPECT_FALSE(service().isReportingEnabled());
  EXPECT_TRUE(client.session(7)->started()) << "running sessions go on";

  removePreference("disable_reporting");
  postDefaultsNotification();
  client.send({{"c", 3}}, {7});
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil", refusal(42), "reply 42 send: nil"));
  EXPECT_TRUE(service().isReportingEnabled());
}

TEST_F(QVReportingPreferencesTest, SwitchesReportingOffOnceTheSessionsHaveTheDefaults) {
  fillUserInformation(clientWithSession(42, 7), 7);
  runUntilIdle();
  journal_.forget();
  QVLogDetour::install([this](std::string_view text) {
    if (!text.starts_with("user information")) return;
    journal_.note(service().isReportingEnabled() ? "still enabled" : "switched off already");
  });
  setPreference("disable_reporting", true);
  postAndRun();
  EXPECT_THAT(takeJournal(),
              ElementsAre(readingLine(), defaultsLine(), "still enabled", complaint(7)));
  EXPECT_FALSE(service().isReportingEnabled());
}

TEST_F(QVReportingPreferencesTest, FindsSessionsOfOtherClientsAgainOnceItIsSwitchedOn) {
  QVTestClient& owner = clientWithSession(42, 7);
  setPreference("disable_reporting", "yes");
  postAndRun();
  EXPECT_EQ(service().findReportingSessionForID(7), nullptr);
  setPreference("disable_reporting", "anything else");
  postAndRun();
  EXPECT_EQ(service().findReportingSessionForID(7), owner.session(7));
}

}  // namespace
