// Files that PCP's own library writes are read.

#include "platform/QVText.h"
#include "platform/linux/tally/QVMMVSource.h"
#include "tests/support/QVDaemonProcess.h"
#include "tests/support/QVSubprocess.h"
#include "tests/support/QVTemporaryRoot.h"

#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;

class QVPCPTest : public testing::Test {
 protected:
  void SetUp() override { std::filesystem::create_directory(directory()); }
  std::filesystem::path directory() const { return root_.path() / "mmv"; }

  // Has the library publish "Speaker", and ends.
  void publish(int flags) const {
    QVSubprocess publisher({.arguments = {"sh", "-c", "exec \"$0\" Speaker \"$1\" </dev/null",
                                          QVDaemonProcess::program("qv_pcp_publisher").string(),
                                          std::to_string(flags)},
                            .environment = {{"PCP_TMP_DIR", root_.path().string()}},
                            .standardOutputFile = (root_.path() / "output").string()});
    ASSERT_EQ(publisher.wait(std::chrono::seconds(60)), 0);
  }
  std::vector<std::string> contents() const {
    QVChannelReadings readings;
    EXPECT_EQ(QVMMVSource(directory().string(), "Speaker").read(readings), 0);
    std::vector<std::string> contents;
    for (const auto& channel : readings.channels) {
      contents.push_back(QVText(channel.subgroup, ' ', channel.name, ' ', channel.value));
    }
    return contents;
  }

  const QVTemporaryRoot root_;
};

TEST_F(QVPCPTest, ReadsWhatItsLibraryPublishes) {
  publish(0);
  const auto dump = QVSubprocess::run({QV_MMVDUMP, (directory() / "Speaker").string()});
  EXPECT_EQ(dump.status, 0);
  EXPECT_THAT(dump.text, HasSubstr("Version    = 1\n"));
  EXPECT_THAT(contents(),
              ElementsAre("pcm0p frames 500", "pcm1p frames 48000", "pcm0p underruns 1",
                          "pcm1p underruns 2", "(null) opens 4000000000", "(null) drift -5",
                          "(null) load 99", "(null) level 0", "(null) busy 1500",
                          "(null) untouched 0", "(null) untouched32 0"));
}

TEST_F(QVPCPTest, ReadsWhatItsDeadProcessesLeft) {
  publish(2);  // PCP's own agent would look for the process
  EXPECT_THAT(contents(), Contains("pcm0p frames 500"));
}

}  // namespace
