// What drivers count while a session runs: published by processes of their own and by the kernel's
// texts, read at start and stop, stored as a message of the session.

#include "tests/support/QVDriverProcess.h"
#include "tests/support/QVEndToEndTest.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <sys/stat.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr uint16_t kTelephony = 2;
constexpr const char* kDriverMessages =
    "SELECT session_id, type, payload FROM beacon_message WHERE category = 9 "
    "ORDER BY session_id, id";
constexpr const char* kNothing = "nothing interesting to fetch from the drivers";

class QVDriverChannelsTest : public QVEndToEndTest {
 protected:
  QVDriverChannelsTest() { std::filesystem::create_directory(channels()); }

  std::filesystem::path channels() const { return root_.runtime() / "channels"; }
  std::string file(const std::string& group) const { return (channels() / group).string(); }
  // A text such as the kernel's, and the configuration that names it.
  void writeText(const std::string& text) const { std::ofstream(root_.path() / "status") << text; }
  void configureText(const std::string& names) const {
    root_.configure("channels.json",
                    "[{" + names + R"(, "file": ")" + (root_.path() / "status").string() + "\"}]");
  }
  // A session that has been started: its snapshot is taken.
  void startSession(QVPeerClient& client, int64_t reporterID = 7) {
    client.create(reporterID, kTelephony);
    client.start(reporterID);
    client.awaitOperations();
  }
  void expectDriverMessages(const std::vector<std::string>& messages) {
    endService();
    EXPECT_EQ(store().rows(kDriverMessages), messages);
  }
};

TEST_F(QVDriverChannelsTest, StoresWhatDriversCountedWhileASessionRan) {
  QVDriverProcess norvex(file("NorvexMCA"), {"--channel", "wakeups"});
  QVDriverProcess speaker(file("Speaker"),
                          {"--channel", "frames", "--channel", "underruns", "--step", "480"});
  QVDriverProcess card(file("Card"), {"--subgroup", "MCA", "--subgroup", "Other", "--step", "7"});
  QVDriverProcess haptics(file("Haptics"), {"--subgroup", "Stats", "--channel", "runs"});
  speaker.count();  // before the session
  auto client = connectClient();
  startSession(client);
  norvex.count();
  speaker.count();
  speaker.count();
  card.count();
  haptics.count();
  client.stop(7);
  client.awaitOperations();
  speaker.count();  // after it
  expectDriverMessages({R"(7|0|{"Haptics_Stats_runs":1,"MCA_frames":7,"NorvexMCA_wakeups":1,)"
                        R"("Speaker_frames":960,"Speaker_underruns":960})"});
  for (const char* driver : {"NorvexMCA-(null)", "Speaker-(null)", "(null)-MCA", "Haptics-Stats"}) {
    EXPECT_EQ(log().count(std::string("subscribed to group group ") + driver), 1U) << driver;
  }
}

TEST_F(QVDriverChannelsTest, StoresWhatTheKernelCounted) {
  configureText(R"("group": "Speaker", "subgroup": "pcm0p",
                   "channels": {"frames": "hw_ptr", "owner": "owner_pid"})");
  writeText("state: RUNNING\nowner_pid   : 77\nhw_ptr      : 1000\nappl_ptr    : 1100\n");
  auto client = connectClient();
  startSession(client);
  writeText("state: RUNNING\nowner_pid   : 77\nhw_ptr      : 49000\nappl_ptr    : 49100\n");
  client.stop(7);
  expectDriverMessages({R"(7|0|{"Speaker_frames":48000})"});
}

TEST_F(QVDriverChannelsTest, TakesEveryCountingLineWhereNoneIsNamed) {
  configureText(R"("group": "Haptics", "subgroup": "Stats")");
  writeText("runs 1\nfailures: 2 of them\nlevel: 1.5\nmask: 0x10\n");
  auto client = connectClient();
  startSession(client);
  writeText("runs 3\nfailures: 7 of them\nlevel: 2.5\nmask: 0x20\n");
  client.stop(7);
  expectDriverMessages({R"(7|0|{"Haptics_Stats_failures":5,"Haptics_Stats_runs":2})"});
}

TEST_F(QVDriverChannelsTest, GivesEachSessionItsOwnDifferences) {
  QVDriverProcess speaker(file("Speaker"));
  auto client = connectClient();
  startSession(client, 7);
  speaker.count();
  startSession(client, 8);
  speaker.count();
  client.stop(7);
  client.awaitOperations();
  speaker.count();
  client.stop(8);
  expectDriverMessages({R"(7|0|{"Speaker_frames":2})", R"(8|0|{"Speaker_frames":2})"});
}

TEST_F(QVDriverChannelsTest, SendsNothingWhereNothingWasCounted) {
  const QVDriverProcess speaker(file("Speaker"));
  auto client = connectClient();
  startSession(client);
  client.stop(7);
  expectDriverMessages({});
  EXPECT_EQ(log().count(kNothing), 1U);
}

TEST_F(QVDriverChannelsTest, DoesNotReadDriversThatPublishAfterItsStart) {
  auto client = connectClient();
  QVDriverProcess speaker(file("Speaker"));
  startSession(client);
  speaker.count();
  client.stop(7);
  expectDriverMessages({});
  EXPECT_EQ(log().count("subscribed to group group"), 0U);
}

TEST_F(QVDriverChannelsTest, CountsWhatACrashedDriverLeft) {
  QVDriverProcess speaker(file("Speaker"));
  auto client = connectClient();
  startSession(client);
  speaker.count();
  speaker.signal(SIGKILL);
  ASSERT_EQ(speaker.wait(), -SIGKILL);
  client.stop(7);
  expectDriverMessages({R"(7|0|{"Speaker_frames":1})"});
}

TEST_F(QVDriverChannelsTest, LeavesOutCountersThatWentBackwards) {
  std::optional<QVDriverProcess> speaker;
  speaker.emplace(file("Speaker"), std::vector<std::string>{"--channel", "frames", "--step", "10"});
  speaker->count();
  auto client = connectClient();
  startSession(client);
  // A driver that starts anew counts from zero.
  speaker->signal(SIGKILL);
  ASSERT_EQ(speaker->wait(), -SIGKILL);
  speaker.emplace(file("Speaker"), std::vector<std::string>{"--channel", "frames", "--step", "3"});
  speaker->count();
  client.stop(7);
  expectDriverMessages({});
  EXPECT_EQ(log().count(kNothing), 1U);
}

TEST_F(QVDriverChannelsTest, LeavesOutADriverThatIsGoneAndNoOther) {
  QVDriverProcess speaker(file("Speaker"));
  // Of one driver, as the service sees it: any group may have this subgroup.
  QVDriverProcess leaving(file("CardA"), {"--subgroup", "MCA"});
  QVDriverProcess staying(file("CardB"), {"--subgroup", "MCA"});
  auto client = connectClient();
  startSession(client);
  EXPECT_EQ(speaker.end(), 0);
  EXPECT_EQ(leaving.end(), 0);
  staying.count();
  client.stop(7);
  expectDriverMessages({R"(7|0|{"MCA_frames":1})"});
  EXPECT_EQ(log().count("TallyCreateSamples error"), 0U);
}

TEST_F(QVDriverChannelsTest, LogsTheErrorNumberOfFilesThatAreNoChannels) {
  std::ofstream(file("Speaker")) << "no channels";
  ASSERT_EQ(::mkfifo(file("NorvexMCA").c_str(), 0600), 0);
  QVDriverProcess haptics(file("Haptics"), {"--subgroup", "Stats"});
  auto client = connectClient();
  startSession(client);
  haptics.count();
  client.stop(7);
  expectServes(client);
  expectDriverMessages({R"(7|0|{"Haptics_Stats_frames":1})"});
  EXPECT_EQ(log().count("error 22 getting channels for driver NorvexMCA-(null)"), 1U);
  EXPECT_EQ(log().count("error 74 getting channels for driver Speaker-(null)"), 1U);
  // Any group may have this subgroup; the first file that is wrong is named.
  EXPECT_EQ(log().count("error 22 getting channels for driver (null)-MCA"), 1U);
  EXPECT_EQ(log().count("getting channels for driver"), 3U);
}

TEST_F(QVDriverChannelsTest, DoesNotWaitForAPipeInPlaceOfADriversFile) {
  QVDriverProcess speaker(file("Speaker"));
  auto client = connectClient();
  startSession(client);
  std::filesystem::remove(file("Speaker"));
  ASSERT_EQ(::mkfifo(file("Speaker").c_str(), 0600), 0);
  client.stop(7);
  expectServes(client);
  expectDriverMessages({});
  EXPECT_EQ(log().count("TallyCreateSamples error 22"), 1U);
}

TEST_F(QVDriverChannelsTest, TellsAGroupWithoutChannelsFromNone) {
  configureText(R"("group": "Speaker")");
  writeText("closed\n");
  auto client = connectClient();
  startSession(client);
  client.stop(7);
  expectDriverMessages({});
  EXPECT_EQ(log().count("couldn't find any channels for driver group Speaker-(null)"), 1U);
  EXPECT_EQ(log().count("subscribed to group group Speaker-(null)"), 1U);
  EXPECT_EQ(log().count("couldn't find any channels"), 1U);
}

TEST_F(QVDriverChannelsTest, ServesWithAConfigurationThatIsNoJSON) {
  root_.configure("channels.json", "[\n  {\"group\": \"Speaker\" \"file\": \"/f\"}\n]\n");
  QVDriverProcess speaker(file("Speaker"));
  auto client = connectClient();
  startSession(client);
  speaker.count();
  client.stop(7);
  expectDriverMessages({R"(7|0|{"Speaker_frames":1})"});
  EXPECT_THAT(
      log().lines("cannot read driver channels"),
      ElementsAre(testing::HasSubstr(
          "cannot read driver channels " + (root_.configuration() / "channels.json").string() +
          ": line 2, column 23: Missing a comma or '}' after an object member.")));
}

TEST_F(QVDriverChannelsTest, StartsWithoutADirectory) {
  std::filesystem::remove(channels());
  auto client = connectClient();
  startSession(client);
  client.stop(7);
  expectDriverMessages({});
  EXPECT_THAT(log().lines("getting channels for driver"), IsEmpty());
}

}  // namespace
