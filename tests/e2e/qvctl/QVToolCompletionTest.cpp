// What bash and zsh offer behind "qvctl".

#include "tests/e2e/qvctl/QVToolTest.h"

#include <filesystem>
#include <fstream>
#include <sstream>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr uint16_t kTelephony = 2;

class QVToolCompletionTest : public QVToolTest {
 protected:
  static std::string folder() {
    return std::string(QV_SOURCE_DIRECTORY) + "/tools/qvctl/completions";
  }
  // What bash offers for the last of the words behind "qvctl".
  std::vector<std::string> offered(const Arguments& words) const {
    Arguments arguments{
        "bash",
        "--norc",
        "-c",
        "source \"$1\"; shift; COMP_WORDS=(\"$@\"); COMP_CWORD=$(($# - 1)); _qvctl; "
        "printf '%s\\n' \"${COMPREPLY[@]}\"",
        "bash",
        folder() + "/qvctl.bash",
        QVDaemonProcess::program("qvctl").string()};
    arguments.insert(arguments.end(), words.begin(), words.end());
    const auto out = root_.path() / "offered";
    std::filesystem::remove(out);
    QVSubprocess bash({.arguments = arguments,
                       .environment = environment(),
                       .standardOutputFile = out,
                       .standardErrorFile = out});
    EXPECT_EQ(bash.wait(std::chrono::seconds(60)), 0);
    std::vector<std::string> lines;
    std::ifstream stream(out);
    for (std::string line; std::getline(stream, line);) {
      if (!line.empty()) lines.push_back(line);
    }
    return lines;
  }
};

TEST_F(QVToolCompletionTest, OffersCommands) {
  EXPECT_THAT(offered({"se"}), ElementsAre("sessions", "send", "session"));
  EXPECT_THAT(offered({"session", "st"}), ElementsAre("start", "stop"));
  EXPECT_THAT(offered({"--root", "/nowhere", "kil"}), ElementsAre("kill"));
}

TEST_F(QVToolCompletionTest, OffersOptionsOfTheCommand) {
  EXPECT_THAT(offered({"watch", "--co"}), ElementsAre("--count"));
  EXPECT_THAT(offered({"status", "--co"}), IsEmpty());
  EXPECT_THAT(offered({"session", "run", "--an"}), ElementsAre("--anyway"));
}

TEST_F(QVToolCompletionTest, OffersNames) {
  EXPECT_THAT(offered({"events", "--service", "tel"}), ElementsAre("telephony"));
  EXPECT_THAT(offered({"events", "--service", "voxa,tel"}), ElementsAre("voxa,telephony"));
  EXPECT_THAT(offered({"events", "--category", "Session.Pl"}),
              ElementsAre("Session.Playback", "Session.PlaybackAndRecord"));
  EXPECT_THAT(offered({"send", "--type", "St"}), ElementsAre("Start", "Stop"));
  EXPECT_THAT(offered({"watch", "--kind", "an"}), ElementsAre("analytics"));
}

TEST_F(QVToolCompletionTest, OffersOnlyNamesThatAreTaken) {
  service();
  for (const std::string& option : {std::string("--service"), std::string("--category"),
                                    std::string("--type"), std::string("--kind")}) {
    const auto names = offered({"events", option, ""});
    EXPECT_THAT(names, Not(IsEmpty())) << option;
    std::ostringstream list;
    for (const std::string& name : names) list << (list.tellp() == 0 ? "" : ",") << name;
    EXPECT_EQ(run({"watch", option, list.str(), "--for", "0", "--json"}), "") << option;
  }
}

TEST_F(QVToolCompletionTest, OffersSessions) {
  startSession(4711, kTelephony);
  client().create(4712);
  EXPECT_THAT(offered({"send", "--session", ""}), ElementsAre("4711", "4712"));
  EXPECT_THAT(offered({"session", "stop", "47"}), ElementsAre("4711", "4712"));
}

TEST_F(QVToolCompletionTest, LeavesTheCommandThatIsRunToOthers) {
  EXPECT_THAT(offered({"session", "run", "--", "--an"}), IsEmpty());
}

TEST_F(QVToolCompletionTest, OffersTheSameInZsh) {
  startSession(4711, kTelephony);
  auto all = environment();
  all["TERM"] = "dumb";
  all["PS1"] = "";
  all["PATH"] = QVDaemonProcess::program("qvctl").parent_path().string() + ":/usr/bin:/bin";
  QVTerminal zsh({.arguments = {"zsh", "-f", "-i"}, .environment = all, .columns = 200});
  zsh.type("fpath=(" + folder() +
           " $fpath); autoload -Uz compinit; compinit -u -D; echo re''ady\n");
  ASSERT_TRUE(zsh.await("ready"));
  // Two tabs list what there is.
  zsh.type("qvctl \t\t");
  ASSERT_TRUE(zsh.await("whether the service runs, and how it fares")) << zsh.shown();
  EXPECT_TRUE(zsh.await("end the service at once")) << zsh.shown();
  zsh.type("\x15qvctl session run --any\t");
  EXPECT_TRUE(zsh.await("--anyway")) << zsh.shown();
  zsh.type("\x15qvctl events --service tel\t");
  EXPECT_TRUE(zsh.await("telephony")) << zsh.shown();
  zsh.type("\x15qvctl session stop \t");
  EXPECT_TRUE(zsh.await("4711")) << zsh.shown();
}

}  // namespace
