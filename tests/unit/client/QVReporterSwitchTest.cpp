// The reporting switch, as a reporter goes by it.

#include "client/QVReportingPreference.h"
#include "client/QVReportingSwitch.h"
#include "platform/QVPreferences.h"
#include "platform/linux/QVJSONFile.h"
#include "tests/unit/client/QVReporterFixture.h"

#include <array>
#include <filesystem>
#include <fstream>
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

TEST_F(QVReporterSwitchTest, ReadsWhatTheServiceReads) {
  const auto byService = [](const std::string& text) {
    QVJSONFailure failure;
    const auto value = QVJSONFile::parse(text, failure);
    return value && value->kind() == QVValue::Kind::dictionary &&
           QVPreferences::booleanReading(value->dictionary().find("disable_reporting"));
  };
  const std::string key = R"("disable_reporting": )";
  int off = 0;
  for (const std::string value :
       {"true",        "false",       "null",        "1",
        "0",           "-0.5",        "0.0",         "-0",
        "1e300",       "1e-300",      "1e-400",      "1e400",
        "0.0001e-320", "1000e-330",   "9e999999",    "1e-999999",
        "\"true\"",    "\"TRUE\"",    "\"yes\"",     "\"Yes\"",
        "\"1\"",       "\"on\"",      "\"2\"",       "\"\"",
        "[true]",      "{\"a\":1}",   "[]",          "yes",
        "tru",         "\"\\uDC00\"", "\"\\u0031\"", "18446744073709551616",
        "0x1",         "+1",          "01"}) {
    for (const std::string& text :
         {"{" + key + value + "}", "{" + key + value + ", " + key + "false}",
          "{" + key + "true, " + key + value + "}", "{\"a\": {" + key + value + "}}",
          "{\"a\": [1, {" + key + "true}], " + key + value + "}", "[{" + key + value + "}]",
          "{" + key + value + "} {}", "{" + key + value + "}" + std::string(1, '\0'),
          "{" + key + value + ", \"b\": \"\xff\"}", value}) {
      EXPECT_EQ(QVReportingIsSwitchedOff(text), byService(text)) << text;
      off += byService(text) ? 1 : 0;
    }
  }
  EXPECT_GT(off, 30);
  for (const int depth : {62, 63, 64, 65}) {
    std::string text = "{\"a\": ";
    for (int i = 0; i < depth; ++i) text += '[';
    for (int i = 0; i < depth; ++i) text += ']';
    text += ", " + key + "true}";
    EXPECT_EQ(QVReportingIsSwitchedOff(text), byService(text)) << depth;
  }
}

TEST_F(QVReporterSwitchTest, IsOnWhereTheFileIsNone) {
  const std::string path = root_.configuration() / "file";
  EXPECT_FALSE(QVReportingIsSwitchedOffByFile(path));
  std::filesystem::create_directory(path);
  EXPECT_FALSE(QVReportingIsSwitchedOffByFile(path));
  std::filesystem::remove(path);
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
  EXPECT_FALSE(QVReportingIsSwitchedOffByFile(path));
  std::filesystem::remove(path);
  root_.configure("file", R"({"disable_reporting": true})");
  EXPECT_TRUE(QVReportingIsSwitchedOffByFile(path));
  root_.configure("file", R"({"disable_reporting": true})" + std::string(4 << 20, ' '));
  EXPECT_FALSE(QVReportingIsSwitchedOffByFile(path));
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
  void configureOff(bool off) const {
    root_.configure("preferences/net.quillon.quietvox.json",
                    off ? R"({"disable_reporting": true})" : "{}");
  }
};

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

TEST_F(QVReportingSwitchTest, LooksAgainForWhatWasNotThere) {
  const std::filesystem::path runtime = root_.path() / "later";
  QVReportingSwitch reportingSwitch(root_.configuration(), runtime);
  std::filesystem::create_directories(runtime / "notify");
  configureOff(true);
  EXPECT_FALSE(reportingSwitch.isOff());
  reportingSwitch.lookAgain();
  EXPECT_TRUE(reportingSwitch.isOff());
  configureOff(false);
  std::ofstream(runtime / "notify" / "net.quillon.quietvox.reporting") << "posted";
  awaitNews(reportingSwitch);
  EXPECT_FALSE(reportingSwitch.isOff());
}

}  // namespace
