// The example player, playing a real recording and reporting it.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr const char* kRecording = "/usr/share/sounds/alsa/Front_Center.wav";

class QVPlayerTest : public QVEndToEndTest {
 protected:
  QVSubprocess::Output play(const std::vector<std::string>& arguments) {
    std::vector<std::string> command{QVDaemonProcess::program("qv-player").string(), "--socket",
                                     root_.socket().string()};
    command.insert(command.end(), arguments.begin(), arguments.end());
    return QVSubprocess::run(command);
  }
};

TEST_F(QVPlayerTest, ReportsARecordingFromStartToStop) {
  service();
  const auto played =
      play({"--speed", "0", "--service-type", "telephony", "--reporter-id", "7", "--application",
            "net.example.player", "--route", "Headphones", kRecording});
  ASSERT_EQ(played.status, 0) << played.text;
  endService();

  const auto sessions = store().rows("SELECT session_id, user_info FROM beacon_session");
  ASSERT_EQ(sessions.size(), 1U);
  for (const char* entry : {R"("HostApplicationDisplayID":"net.example.player")",
                            R"("kBeaconUserInfoServiceName":"telephony_session")"}) {
    EXPECT_THAT(sessions[0], HasSubstr(entry));
  }
  // The recording's own figures, as its file states them.
  EXPECT_THAT(sessions[0], HasSubstr("48000"));
  // Playback starts and stops, with progress, a volume and a route in between; the summary last.
  EXPECT_GT(store().number("SELECT count(*) FROM beacon_message WHERE category = 3 AND type = 1"),
            0);
  EXPECT_GT(store().number("SELECT count(*) FROM beacon_message WHERE category = 3 AND type = 2"),
            0);
  for (const char* category : {"7", "10", "11"}) {
    EXPECT_GT(
        store().number(
            std::string("SELECT count(*) FROM beacon_message WHERE category = ").append(category)),
        0)
        << category;
  }
  EXPECT_THAT(store().rows("SELECT category FROM beacon_message ORDER BY id DESC LIMIT 1"),
              ElementsAre("65535"));
  EXPECT_THAT(store().rows("SELECT * FROM loss"), IsEmpty());
}

TEST_F(QVPlayerTest, SaysWhichFileItCannotPlay) {
  service();
  const auto played = play({"--speed", "0", root_.log().string()});
  EXPECT_EQ(played.status, 1);
  EXPECT_THAT(played.text, HasSubstr(root_.log().string()));
}

}  // namespace
