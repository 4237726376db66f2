// What scripts/package takes for a container that runs, one that is refused, and a fault: with a
// stand-in for systemd-nspawn, as only some machines let one be made.

#include "tests/support/QVSubprocess.h"
#include "tests/support/QVTemporaryRoot.h"

#include <fstream>
#include <string>

#include <gmock/gmock.h>

namespace {

using ::testing::HasSubstr;

// Seconds: what ends does so long before, what does not is not waited for.
constexpr const char* kPlenty = "60";
constexpr const char* kLittle = "1";

// Ends for nothing but a kill, or for what timeout asks for, with and without success.
constexpr const char* kHangs = "trap '' TERM; exec tail -f /dev/null";
constexpr const char* kHangsUntilAsked = "exec tail -f /dev/null";
constexpr const char* kObeysLate = "trap 'exit 0' TERM; tail -f /dev/null & wait";

class QVContainerTest : public ::testing::Test {
 protected:
  QVContainerTest() { std::filesystem::create_directories(tree() / "opt"); }

  std::filesystem::path tree() const { return root_.path() / "tree"; }

  // What the stand-in does.
  void nspawnDoes(const std::string& commands) const {
    const auto program = root_.path() / "bin" / "systemd-nspawn";
    std::filesystem::create_directories(program.parent_path());
    std::ofstream(program) << "#!/bin/bash\n" << commands << "\n";
    std::filesystem::permissions(program, std::filesystem::perms::owner_all);
  }

  // What the root's manager is to have written in the end: the status of what it ran.
  std::string endsWith(const std::string& status) const {
    return "echo said >" + (tree() / "opt" / "log").string() + "; echo " + status + " >" +
           (tree() / "opt" / "status").string() + "; ";
  }

  QVSubprocess::Output run(const std::string& function, const char* limit) const {
    const std::string folder = QV_SOURCE_DIRECTORY "/scripts/lib/";
    return QVSubprocess::run({"env", "PATH=" + (root_.path() / "bin").string() + ":/usr/bin:/bin",
                              "bash", "-euo", "pipefail", "-c",
                              "source " + folder + "common.sh; source " + folder +
                                  "container.sh; container_grace=1; " + function,
                              "try", limit, tree().string(), (root_.path() / "log").string()});
  }

  // Whether none can be made: "yes", "no", or why that is not known.
  void expectRefused(const char* answer, const char* limit = kPlenty) const {
    const auto output = run(
        "if are_containers_refused \"$@\"; then echo answer: yes; else echo answer: no; fi", limit);
    EXPECT_THAT(output.text, HasSubstr(answer));
    EXPECT_EQ(output.status == 0, std::string(answer).starts_with("answer:")) << output.text;
  }

  void expectBootFails(const char* why, const char* limit = kPlenty) const {
    const auto output = run("boot \"$@\"; echo proved", limit);
    EXPECT_NE(output.status, 0) << output.text;
    EXPECT_THAT(output.text, HasSubstr(why));
    EXPECT_THAT(output.text, Not(HasSubstr("proved")));
  }

 private:
  const QVTemporaryRoot root_;
};

TEST_F(QVContainerTest, AreNotRefusedWhereOneRuns) {
  nspawnDoes("[ \"${!#}\" = /bin/true ]");
  expectRefused("answer: no");
}

TEST_F(QVContainerTest, AreRefusedWhereNoneMayBeMade) {
  nspawnDoes("echo 'clone() failed: Operation not permitted'; exit 1");
  expectRefused("answer: yes");
}

TEST_F(QVContainerTest, AreNotRefusedByAFaultOfTheRoot) {
  nspawnDoes("echo 'execv(/bin/true) failed: No such file or directory'; exit 1");
  expectRefused("nothing refuses it: failed 1");
  nspawnDoes("echo 'Operation not permitted'; exit 3");
  expectRefused("nothing refuses it: failed 3");
}

TEST_F(QVContainerTest, AreNotRefusedWhereOneHangs) {
  for (const char* hang : {kHangs, kHangsUntilAsked, kObeysLate}) {
    nspawnDoes(std::string("echo 'Operation not permitted'; ").append(hang));
    expectRefused("neither starts nor is refused", kLittle);
  }
}

TEST_F(QVContainerTest, ProveWithABootThatEnds) {
  nspawnDoes("[ \"${!#}\" = --boot ] || exit 1; " + endsWith("0"));
  const auto output = run("boot \"$@\"; echo proved", kPlenty);
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_EQ(output.text, "said\nproved\n");
}

TEST_F(QVContainerTest, ProveNothingWithABootThatHangsInTheEnd) {
  for (const char* hang : {kHangs, kHangsUntilAsked, kObeysLate}) {
    nspawnDoes(endsWith("0") + hang);
    expectBootFails("was not through within", kLittle);
  }
}

TEST_F(QVContainerTest, ProveNothingWithABootThatFails) {
  nspawnDoes(endsWith("0") + "exit 1");
  expectBootFails("did not end as it should: failed 1");
  nspawnDoes(endsWith("1"));
  expectBootFails("does not hold what it should");
}

TEST_F(QVContainerTest, ProveNothingWithWhatAnEarlierBootLeft) {
  nspawnDoes(endsWith("0"));
  ASSERT_EQ(run("boot \"$@\"", kPlenty).status, 0);
  nspawnDoes("exit 0");
  expectBootFails("does not hold what it should");
}

}  // namespace
