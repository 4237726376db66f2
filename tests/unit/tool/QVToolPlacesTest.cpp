#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <cstdlib>

#include <gtest/gtest.h>

namespace {

class QVToolPlacesTest : public testing::Test {
 protected:
  void SetUp() override { clear(); }
  void TearDown() override { clear(); }

  static void clear() {
    for (const char* name : {"QUIETVOX_SOCKET", "RUNTIME_DIRECTORY", "STATE_DIRECTORY",
                             "CONFIGURATION_DIRECTORY", "LOGS_DIRECTORY"}) {
      ::unsetenv(name);
    }
  }
};

TEST_F(QVToolPlacesTest, AreTheUsualOnes) {
  const auto places = QVToolPlaces::find("", "");
  EXPECT_EQ(places.socket, "/run/quietvox/reporting.socket");
  EXPECT_EQ(places.directories.store(), "/var/lib/quietvox/reporting.db");
  EXPECT_EQ(places.servicePreferences(), "/etc/quietvox/preferences/net.quillon.quietvox.json");
  EXPECT_EQ(places.reportingNotification(), "/run/quietvox/notify/net.quillon.quietvox.reporting");
  EXPECT_EQ(places.summaries(), "/var/log/quietvox/DiagnosticLogs/Audio/Reporting");
}

TEST_F(QVToolPlacesTest, AreTakenFromTheEnvironmentAsTheServiceTakesThem) {
  ::setenv("RUNTIME_DIRECTORY", "/r:/other", 1);
  ::setenv("STATE_DIRECTORY", "/s", 1);
  EXPECT_EQ(QVToolPlaces::find("", "").socket, "/r/reporting.socket");
  EXPECT_EQ(QVToolPlaces::find("", "").directories.store(), "/s/reporting.db");
  // As the client library takes it.
  ::setenv("QUIETVOX_SOCKET", "/q", 1);
  EXPECT_EQ(QVToolPlaces::find("", "").socket, "/q");
}

TEST_F(QVToolPlacesTest, LieBelowAnotherRootWhateverTheEnvironmentSays) {
  ::setenv("RUNTIME_DIRECTORY", "/r", 1);
  ::setenv("QUIETVOX_SOCKET", "/q", 1);
  const QVTemporaryRoot directory;
  const std::string image = directory.path().string();
  const auto places = QVToolPlaces::find("", image);
  EXPECT_EQ(places.socket, image + "/run/quietvox/reporting.socket");
  EXPECT_EQ(places.directories.store(), image + "/var/lib/quietvox/reporting.db");
  EXPECT_EQ(places.root, image);
  EXPECT_EQ(QVToolPlaces::find("", "").root, "");
  EXPECT_EQ(QVToolPlaces::find("/own", image).socket, "/own");
  EXPECT_EQ(QVToolPlaces::find("/own", "").socket, "/own");
}

TEST_F(QVToolPlacesTest, SayWhatCanBeNoSocket) {
  const std::string name(99, 'x');
  EXPECT_EQ(QVToolPlaces::find("/nowhere/socket", "").socketProblem(), "");
  EXPECT_EQ(QVToolPlaces::find("/nowhere" + name, "").socketProblem(), "");
  EXPECT_EQ(QVToolPlaces::find("/nowhere/" + name, "").socketProblem(),
            "/nowhere/" + name + ": a socket's path has 107 bytes at the most");
  EXPECT_EQ(QVToolPlaces::find("/", "").socketProblem(), "/: a directory, not a socket");
  EXPECT_EQ(QVToolPlaces::find("/dev/null", "").socketProblem(), "/dev/null: not a socket");
}

}  // namespace
