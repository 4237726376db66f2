// Finding the service.

#include "client/QVClientSocket.h"
#include "tests/unit/client/QVScriptedService.h"

#include <algorithm>
#include <array>
#include <cstdlib>
#include <filesystem>
#include <thread>

#include <gtest/gtest.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

using Code = QVClientError::Code;

class QVClientConnectTest : public testing::Test {
 protected:
  void SetUp() override {
    std::string pattern = testing::TempDir() + "qv-client-XXXXXX";
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    directory_ = pattern;
    options_.socketPath = directory_ / "socket";
    options_.callbacks = QVClientOptions::Callbacks::pollLoop;
    unsetenv(kQVClientSocketVariable);
  }
  void TearDown() override {
    unsetenv(kQVClientSocketVariable);
    std::filesystem::remove_all(directory_);
  }
  // A socket that accepts nobody by itself.
  QVDescriptor listen(const std::string& path, int queue = 8) {
    QVDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::copy(path.begin(), path.end(), address.sun_path);
    EXPECT_EQ(bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(::listen(socket.get(), queue), 0);
    return socket;
  }

  std::filesystem::path directory_;
  QVClientOptions options_;
};

TEST_F(QVClientConnectTest, OptionsComeBeforeTheEnvironmentBeforeTheDefault) {
  EXPECT_EQ(QVClientSocketPath({}), "/run/quietvox/reporting.socket");
  setenv(kQVClientSocketVariable, "/elsewhere/socket", 1);
  EXPECT_EQ(QVClientSocketPath({}), "/elsewhere/socket");
  EXPECT_EQ(QVClientSocketPath(options_), options_.socketPath);
  setenv(kQVClientSocketVariable, "", 1);
  EXPECT_EQ(QVClientSocketPath({}), "/run/quietvox/reporting.socket");
}

TEST_F(QVClientConnectTest, ConnectsAndTalks) {
  const QVDescriptor listener = listen(options_.socketPath);
  auto connected = QVClient::connect(options_);
  ASSERT_TRUE(connected) << connected.error().text();
  const auto service = QVScriptedService::accepted(accept(listener.get(), nullptr, nullptr));
  int replies = 0;
  EXPECT_FALSE(connected.value()->createReportingSession(1, [&](const auto&) { ++replies; }));
  service->letIn();
  service->answerBoolean(service->nextCall());
  while (replies == 0 && !HasFailure()) dispatchWhenReadable(*connected.value());
  EXPECT_EQ(replies, 1);
}

TEST_F(QVClientConnectTest, AServiceThatStartsLaterGetsWhatWasSentBefore) {
  const QVDescriptor listener = listen(options_.socketPath);
  auto connected = QVClient::connect(options_);
  EXPECT_FALSE(connected.value()->createReportingSession(1, nullptr));
  const auto service = QVScriptedService::accepted(accept(listener.get(), nullptr, nullptr));
  service->letIn();
  EXPECT_EQ(service->nextCall().member, "CreateReportingSession");
}

TEST_F(QVClientConnectTest, AMissingSocketIsNamedWithTheReason) {
  const auto connected = QVClient::connect(options_);
  EXPECT_EQ(connected.error().code(), Code::cannotConnect);
  EXPECT_EQ(connected.error().text(), options_.socketPath + ": No such file or directory");
}

TEST_F(QVClientConnectTest, ASocketThatNobodyListensOnIsNamedWithTheReason) {
  { const QVDescriptor gone = listen(options_.socketPath); }
  const auto connected = QVClient::connect(options_);
  EXPECT_EQ(connected.error().text(), options_.socketPath + ": Connection refused");
}

TEST_F(QVClientConnectTest, APathThatNoSocketCanHaveIsNamed) {
  options_.socketPath = "/" + std::string(200, 'x');
  const auto connected = QVClient::connect(options_);
  EXPECT_EQ(connected.error().text(), options_.socketPath + ": path too long");
}

TEST_F(QVClientConnectTest, DoesNotWaitForEverForAServiceThatAcceptsNobody) {
  const QVDescriptor listener = listen(options_.socketPath, 0);
  options_.connectTimeLimit = std::chrono::milliseconds(1);
  std::vector<std::unique_ptr<QVClient>> clients;
  QVClientError error;
  while (!error && clients.size() < 100) {
    auto connected = QVClient::connect(options_);
    error = connected.error();
    clients.push_back(std::move(connected.value()));
  }
  EXPECT_EQ(error.text(), options_.socketPath + ": the service does not accept clients");
}

TEST_F(QVClientConnectTest, WhatIsNoSocketIsRefused) {
  EXPECT_EQ(QVClient::connectedTo(-1).error().code(), Code::cannotConnect);
}

}  // namespace
