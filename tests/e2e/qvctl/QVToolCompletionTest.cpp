// What bash and zsh offer behind "qvctl".

#include "tests/e2e/qvctl/QVToolTest.h"
#include "tests/support/QVDriverProcess.h"

#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::SizeIs;

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
        "cd \"$1\"; source \"$2\"; shift 2; COMP_WORDS=(\"$@\"); COMP_CWORD=$(($# - 1)); _qvctl; "
        "printf '%s\\n' \"${COMPREPLY[@]}\"",
        "bash",
        root_.path().string(),
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
  // A zsh with the completions, in the root.
  std::unique_ptr<QVTerminal> zsh() const {
    auto all = environment();
    all["TERM"] = "dumb";
    all["PS1"] = "";
    all["PATH"] = QVDaemonProcess::program("qvctl").parent_path().string() + ":/usr/bin:/bin";
    auto shell = std::make_unique<QVTerminal>(
        QVTerminal::Options{.arguments = {"zsh", "-f", "-i"}, .environment = all, .columns = 200});
    shell->type("cd " + root_.path().string() + "; fpath=(" + folder() +
                " $fpath); autoload -Uz compinit; compinit -u -D; echo re''ady\n");
    EXPECT_TRUE(shell->await("ready")) << shell->shown();
    return shell;
  }
  // A summary of an application of that name; the summary's.
  std::string leaveSummary(const std::string& application) const {
    const auto directory = root_.logs() / "DiagnosticLogs" / "Audio" / "Reporting";
    std::filesystem::create_directories(directory);
    const std::string name = "20261121-075814+0000-quietvox-" + application + "-telephony.json";
    std::ofstream(directory / name) << "[{}]";
    return name;
  }
  // Whether a command left this behind.
  bool hasRun(const std::string& file) const {
    return std::filesystem::exists(root_.path() / file);
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

TEST_F(QVToolCompletionTest, OffersNamesBehindAnEqualsSign) {
  // As bash parts the words, and where it is told not to.
  EXPECT_THAT(offered({"send", "--category", "=", "Session.Rec"}), ElementsAre("Session.Record"));
  EXPECT_THAT(offered({"watch", "--for", "="}), ElementsAre("1s", "10s", "1m"));
  EXPECT_THAT(offered({"events", "--service=voxa,tel"}), ElementsAre("--service=voxa,telephony"));
}

TEST_F(QVToolCompletionTest, OffersShortOptions) {
  EXPECT_THAT(offered({"events", "-n"}), ElementsAre("-n"));
  EXPECT_THAT(offered({"summary", "-h"}), ElementsAre("-h"));
}

TEST_F(QVToolCompletionTest, OffersSummaries) {
  const std::string first = leaveSummary("net.example.player");
  EXPECT_THAT(offered({"summary", "show", "2026"}), ElementsAre(first));
  leaveSummary("a b");
  EXPECT_THAT(offered({"summary", "plot", "20261121-075814+0000-quietvox-a"}),
              ElementsAre("20261121-075814+0000-quietvox-a\\ b-telephony.json"));
}

TEST_F(QVToolCompletionTest, NeverRunsWhatClientsAndDriversCallThings) {
  leaveSummary("x$(touch${IFS}ran1)");
  leaveSummary("y`touch${IFS}ran2`");
  const std::string start = "20261121-075814+0000-quietvox-";
  EXPECT_THAT(offered({"summary", "show", ""}), SizeIs(2));
  EXPECT_THAT(offered({"summary", "show", start + "x"}),
              ElementsAre(start + R"(x\$\(touch\$\{IFS\}ran1\)-telephony.json)"));
  EXPECT_THAT(offered({"summary", "show", start + R"(x\$)"}), SizeIs(1));
  std::filesystem::create_directory(root_.runtime() / "channels");
  QVDriverProcess driver(root_.runtime() / "channels/G$(touch${IFS}ran3)", {"--channel", "frames"});
  EXPECT_THAT(offered({"channels", "--group", ""}), ElementsAre(R"(G\$\(touch\$\{IFS\}ran3\))"));
  for (const char* const file : {"ran1", "ran2", "ran3"}) EXPECT_FALSE(hasRun(file)) << file;
}

TEST_F(QVToolCompletionTest, NeverRunsWhatClientsCallThingsInZsh) {
  leaveSummary("x path[$(>ran1)]");
  leaveSummary("path[$(>ran2)]");
  leaveSummary("z$(>ran3)");
  const auto shell = zsh();
  shell->type("qvctl summary show \t\t");
  EXPECT_TRUE(shell->await(R"(path\[\$\(\>ran2\)\]-telephony.json)")) << shell->shown();
  // What is inserted is quoted, and so reaches the command as it is.
  shell->type("\x15qvctl summary show 20261121-075814+0000-quietvox-z\t; echo sho''wn\n");
  EXPECT_TRUE(shell->await("\nshown")) << shell->shown();
  EXPECT_THAT(shell->shown(), HasSubstr(R"(z\$\(\>ran3\)-telephony.json)"));
  for (const char* const file : {"ran1", "ran2", "ran3"}) EXPECT_FALSE(hasRun(file)) << file;
}

TEST_F(QVToolCompletionTest, OffersTheSameInZsh) {
  startSession(4711, kTelephony);
  leaveSummary("net.example.player");
  const auto shell = zsh();
  // Two tabs list what there is.
  shell->type("qvctl \t\t");
  ASSERT_TRUE(shell->await("whether the service runs, and how it fares")) << shell->shown();
  EXPECT_TRUE(shell->await("end the service at once")) << shell->shown();
  shell->type("\x15qvctl session run --any\t");
  EXPECT_TRUE(shell->await("--anyway")) << shell->shown();
  shell->type("\x15qvctl events --service tel\t");
  EXPECT_TRUE(shell->await("telephony")) << shell->shown();
  shell->type("\x15qvctl session stop \t");
  EXPECT_TRUE(shell->await("4711")) << shell->shown();
  shell->type("\x15qvctl summary plot 2026\t");
  EXPECT_TRUE(shell->await("net.example.player-telephony.json")) << shell->shown();
}

TEST_F(QVToolCompletionTest, OffersProgramsToRunInZsh) {
  // Found in a directory of PATH, beside the shell's own commands.
  std::filesystem::create_directory(root_.path() / "programs");
  const auto program = root_.path() / "programs/qv-offered-program";
  std::ofstream(program) << "#!/bin/sh\n";
  std::filesystem::permissions(program, std::filesystem::perms(0755));
  for (const char* start : {"qvctl session run -- qv-off", "qvctl session run qv-off"}) {
    const auto shell = zsh();
    shell->type("path+=(" + program.parent_path().string() + "); rehash; echo g''o\n");
    ASSERT_TRUE(shell->await("\ngo")) << shell->shown();
    shell->type(std::string(start) + "\t\x01: \x05; echo sho''wn\n");
    EXPECT_TRUE(shell->await("\nshown")) << shell->shown();
    EXPECT_THAT(shell->shown(), HasSubstr("qv-offered-program")) << start;
    EXPECT_THAT(shell->shown(), Not(HasSubstr("bad math"))) << start;
  }
}

TEST_F(QVToolCompletionTest, AsksTheSystemOfTheCommandLineInZsh) {
  const auto image = root_.path() / "an image";
  const auto directory = image / "var/log/quietvox/DiagnosticLogs/Audio/Reporting";
  std::filesystem::create_directories(directory);
  std::ofstream(directory / "20261121-075814+0000-quietvox-elsewhere-telephony.json") << "[{}]";
  leaveSummary("here");
  std::filesystem::create_directories(image / "run/quietvox/channels");
  QVDriverProcess driver(image / "run/quietvox/channels/Elsewhere", {"--channel", "frames"});
  const auto shell = zsh();
  shell->type("qvctl summary show --root an\\ image 2026\t");
  EXPECT_TRUE(shell->await("elsewhere-telephony.json")) << shell->shown();
  shell->type("\x15qvctl --root=an\\ image channels --group El\t");
  EXPECT_TRUE(shell->await("--group Elsewhere")) << shell->shown();
  shell->type("\x15qvctl summary show --root '$(>ran1)' 2026\t; echo sho''wn\n");
  EXPECT_TRUE(shell->await("\nshown")) << shell->shown();
  EXPECT_FALSE(hasRun("ran1"));
}

TEST_F(QVToolCompletionTest, OffersShortOptionsInZsh) {
  const auto shell = zsh();
  shell->type("qvctl kill -\t\t");
  EXPECT_TRUE(shell->await("-h ")) << shell->shown();
}

}  // namespace
