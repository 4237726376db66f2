// The reporting switch, as a reporter goes by it.

#include "client/QVReportingSwitch.h"
#include "tests/support/QVDescriptorLimit.h"
#include "tests/unit/client/QVReporterFixture.h"

#include <array>
#include <filesystem>
#include <fstream>
#include <optional>
#include <thread>

#include <gmock/gmock.h>
#include <poll.h>
#include <sys/stat.h>

namespace {

class QVReporterSwitchTest : public QVReporterFixture {};

TEST_F(QVReporterSwitchTest, CountsFromTheBeginning) {
  switchReporting(false);
  open();
  EXPECT_FALSE(reporter_->isReportingEnabled());
  const auto session = openSession(7);
  EXPECT_EQ(send(*session, 1), Code::disabled);
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::disabled), 1U);
  // Sessions live all the same.
  const auto service = accept();
  EXPECT_EQ(serve(*service), "create 7");
}

TEST_F(QVReporterSwitchTest, IsHeardOfOffAndOn) {
  open();
  const auto session = openSession(7);
  EXPECT_TRUE(reporter_->isReportingEnabled());
  const auto service = accept();
  serve(*service, 2);
  switchReporting(false);
  // What comes before the news is heard is sent, or dropped for one reason or the other.
  uint64_t attempts = 2;
  while (send(*session, 0) != Code::disabled) ++attempts;
  EXPECT_EQ(send(*session, 0), Code::disabled);
  switchReporting(true);
  // The drops are told of at the latest now.
  EXPECT_GE(awaitDrops(QVDropReason::disabled, 2), 2U);
  while (send(*session, 1) != Code::none) ++attempts;
  EXPECT_TRUE(reporter_->isReportingEnabled());
  uint64_t received = 0;
  while (serve(*service) == "send 7 0") ++received;
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  const QVReporterCounters counters = reporter_->counters();
  EXPECT_EQ(counters.sent, received + 1);
  EXPECT_EQ(counters.sent + counters.dropped.inAll(), attempts + 1);
}

TEST_F(QVReporterSwitchTest, DropsAreToldOfWhereAConnectionBringsTheNews) {
  switchReporting(false);
  open();
  EXPECT_EQ(
      reporter_->sendToEverySession(QVClientPayload(), kPlayback, QVClientMessageType::generic),
      Code::disabled);
  configure(true);
  const auto session = openSession(7);
  const auto service = accept();
  serve(*service, 2);
  EXPECT_EQ(awaitDrops(QVDropReason::disabled, 1), 1U);
}

TEST_F(QVReporterSwitchTest, DropsWhatIsQueued) {
  stopListening();
  open();
  const auto session = openSession(7);
  for (int i = 0; i < 10; ++i) EXPECT_EQ(send(*session, i), Code::none);
  switchReporting(false);
  while (send(*session, -1) != Code::disabled) std::this_thread::yield();
  EXPECT_EQ(session->stop(), Code::none);
  listen();
  const auto service = accept();
  EXPECT_EQ(serve(*service), "create 7");
  EXPECT_EQ(serve(*service), "type 7 2");
  EXPECT_EQ(serve(*service), "stop 7");
}

// The switch by itself, whose news the test takes in.
class QVReportingSwitchTest : public QVReporterFixture {
 protected:
  QVReportingSwitch makeSwitch() const {
    return QVReportingSwitch(root_.configuration(), root_.runtime());
  }
  std::filesystem::path notifications() const { return root_.runtime() / "notify"; }
  static void awaitNews(QVReportingSwitch& reportingSwitch) {
    pollfd entry{.fd = reportingSwitch.descriptor(), .events = POLLIN, .revents = 0};
    ASSERT_GT(::poll(&entry, 1, static_cast<int>(kPatience.count())), 0) << "no news";
    reportingSwitch.readNews();
  }
  void configure(const std::string& text) const {
    root_.configure("preferences/net.quillon.quietvox.json", text);
  }
  void configureOff(bool off) const { configure(off ? R"({"disable_reporting": true})" : "{}"); }
  bool isOffBy(const std::string& text) const {
    configure(text);
    return makeSwitch().isOff();
  }
};

TEST_F(QVReportingSwitchTest, IsReadAsTheServiceReadsIt) {
  for (const char* text :
       {R"({"disable_reporting": true})", R"({"disable_reporting": -0.5})",
        R"({"disable_reporting": "Yes"})", R"({"a": [1], "disable_reporting": "\u0031"})",
        R"({"disable_reporting": false, "disable_reporting": true})"}) {
    EXPECT_TRUE(isOffBy(text)) << text;
  }
  for (const char* text :
       {"{}", R"({"disable_reporting": false})", R"({"disable_reporting": 1e-400})",
        R"({"disable_reporting": "on"})", R"({"disable_reporting": [true]})",
        R"({"disable_reporting": null})", R"({"a": {"disable_reporting": true}})",
        R"({"disable_reporting": true, "disable_reporting": false})"}) {
    EXPECT_FALSE(isOffBy(text)) << text;
  }
}

TEST_F(QVReportingSwitchTest, IsOnWhereTheTextIsNoPreferences) {
  const std::string object = R"({"disable_reporting": true})";
  ASSERT_TRUE(isOffBy(object));
  for (const std::string& text : {std::string(), '[' + object + ']', object + " {}", object + '\0',
                                  std::string(R"({"disable_reporting": true, "a": "\udc00"})"),
                                  std::string(R"({"disable_reporting": true, "a": 1e400})"),
                                  std::string("{\"disable_reporting\": true, \"a\": \"\xff\"}")}) {
    EXPECT_FALSE(isOffBy(text)) << text;
  }
  const auto beside = [](std::size_t depth) {
    return R"({"disable_reporting": true, "a": )" + std::string(depth, '[') +
           std::string(depth, ']') + '}';
  };
  EXPECT_TRUE(isOffBy(beside(63)));
  EXPECT_FALSE(isOffBy(beside(64)));
  const std::size_t limit = std::size_t{4} << 20;
  EXPECT_TRUE(isOffBy(object + std::string(limit - object.size(), ' ')));
  EXPECT_FALSE(isOffBy(object + std::string(limit + 1 - object.size(), ' ')));
}

TEST_F(QVReportingSwitchTest, IsOnWhereTheFileIsNone) {
  configureOff(true);
  const std::filesystem::path file =
      root_.configuration() / "preferences" / "net.quillon.quietvox.json";
  ASSERT_TRUE(std::filesystem::remove(file));
  EXPECT_FALSE(makeSwitch().isOff());
  std::filesystem::create_directory(file);
  EXPECT_FALSE(makeSwitch().isOff());
  std::filesystem::remove(file);
  ASSERT_EQ(::mkfifo(file.c_str(), 0600), 0);
  EXPECT_FALSE(makeSwitch().isOff()) << "and does not wait for a writer";
}

TEST_F(QVReportingSwitchTest, IsReadWhenItsNotificationIsPosted) {
  QVReportingSwitch reportingSwitch = makeSwitch();
  EXPECT_FALSE(reportingSwitch.isOff());
  configureOff(true);
  std::ofstream(notifications() / "net.quillon.quietvox.other") << "posted";
  awaitNews(reportingSwitch);
  EXPECT_FALSE(reportingSwitch.isOff());
  post();
  awaitNews(reportingSwitch);
  EXPECT_TRUE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, HearsOfADirectoryThatIsMadeLater) {
  std::filesystem::remove(notifications());
  QVReportingSwitch reportingSwitch = makeSwitch();
  // It was posted before anyone could hear it.
  configureOff(true);
  std::filesystem::create_directory(notifications());
  awaitNews(reportingSwitch);
  EXPECT_TRUE(reportingSwitch.isOff());
  switchReporting(true);
  awaitNews(reportingSwitch);
  EXPECT_FALSE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, HearsOfADirectoryThatIsMadeAnew) {
  QVReportingSwitch reportingSwitch = makeSwitch();
  configureOff(true);
  std::filesystem::remove(notifications());
  awaitNews(reportingSwitch);
  EXPECT_TRUE(reportingSwitch.isOff());
  std::filesystem::create_directory(notifications());
  awaitNews(reportingSwitch);
  switchReporting(true);
  awaitNews(reportingSwitch);
  EXPECT_FALSE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, HearsOfADirectoryThatIsMadeAnewBehindLostEvents) {
  QVReportingSwitch reportingSwitch = makeSwitch();
  std::size_t kept = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> kept;
  ASSERT_GT(kept, 0U);
  // Equal events in a row are one, so they come of two files in turn.
  const std::array<std::string, 2> files{notifications() / "a", notifications() / "b"};
  for (const std::string& file : files) std::ofstream(file) << "posted";
  for (std::size_t i = 0; i <= kept; ++i) ASSERT_EQ(::chmod(files[i % 2].c_str(), 0600), 0);
  std::filesystem::remove_all(notifications());
  std::filesystem::create_directory(notifications());
  awaitNews(reportingSwitch);
  configureOff(true);
  post();
  awaitNews(reportingSwitch);
  EXPECT_TRUE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, HearsOfDirectoriesThatAreMadeOneByOneLater) {
  const std::filesystem::path runtime = root_.path() / "much" / "later";
  QVReportingSwitch reportingSwitch(root_.configuration(), runtime);
  std::filesystem::create_directory(root_.path() / "much");
  awaitNews(reportingSwitch);
  std::filesystem::create_directory(runtime);
  awaitNews(reportingSwitch);
  configureOff(true);
  std::filesystem::create_directory(runtime / "notify");
  awaitNews(reportingSwitch);
  EXPECT_TRUE(reportingSwitch.isOff());
  configureOff(false);
  std::ofstream(runtime / "notify" / "net.quillon.quietvox.reporting") << "posted";
  awaitNews(reportingSwitch);
  EXPECT_FALSE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, HearsOfADirectoryAboveThatIsMadeAnew) {
  const std::filesystem::path runtime = root_.path() / "other";
  std::filesystem::create_directories(runtime / "notify");
  QVReportingSwitch reportingSwitch(root_.configuration(), runtime);
  std::filesystem::remove_all(runtime);
  awaitNews(reportingSwitch);
  configureOff(true);
  std::filesystem::create_directories(runtime / "notify");
  awaitNews(reportingSwitch);
  EXPECT_TRUE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, FindsADirectoryOfAnotherPathWhenItLooksAgain) {
  const std::filesystem::path above = root_.path() / "above";
  std::filesystem::create_directories(above / "run" / "notify");
  QVReportingSwitch reportingSwitch(root_.configuration(), above / "run");
  std::filesystem::rename(above, root_.path() / "elsewhere");
  std::filesystem::create_directories(above / "run" / "notify");
  configureOff(true);
  reportingSwitch.lookAgain();
  EXPECT_TRUE(reportingSwitch.isOff());
  configureOff(false);
  std::ofstream(above / "run" / "notify" / "net.quillon.quietvox.reporting") << "posted";
  awaitNews(reportingSwitch);
  EXPECT_FALSE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, KeepsWhatItKnowsWhereThePreferenceCannotBeReadNow) {
  configureOff(true);
  QVReportingSwitch reportingSwitch = makeSwitch();
  {
    const QVDescriptorLimit noMore;
    reportingSwitch.lookAgain();
  }
  EXPECT_TRUE(reportingSwitch.isOff());
}

TEST_F(QVReportingSwitchTest, LooksAgainWhenAskedToWhereNothingCanBeWatched) {
  std::optional<QVReportingSwitch> reportingSwitch;
  {
    const QVDescriptorLimit noMore;
    reportingSwitch.emplace(root_.configuration(), root_.runtime());
  }
  EXPECT_LT(reportingSwitch->descriptor(), 0);
  configureOff(true);
  reportingSwitch->readNews();
  EXPECT_FALSE(reportingSwitch->isOff());
  reportingSwitch->lookAgain();
  EXPECT_TRUE(reportingSwitch->isOff());
}

}  // namespace
