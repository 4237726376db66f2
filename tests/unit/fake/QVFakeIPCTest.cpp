#include "platform/fake/QVFakeIPCListener.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;

// An exported object that answers one operation and ignores the rest.
class Service final : public QVReportingServiceProtocol {
 public:
  void createReportingSession(int64_t reporterID, Reply<bool> reply) override {
    reply(reporterID == 7);
  }
  void setServiceType(uint16_t, int64_t, Reply<bool>) override {}
  void getServiceNameForReporterID(int64_t, Reply<uint16_t>) override {}
  void setConfiguration(QVDictionary, int64_t, Reply<bool>) override {}
  void startReportingSessionForID(int64_t, Reply<bool>) override {}
  void sendMessage(QVDictionary, uint32_t, uint16_t, ReporterIDs,
                   Reply<std::optional<QVError>>) override {}
  void stopReportingSessionForID(int64_t, Reply<bool>) override {}
  void destroyReportingSession(int64_t, Reply<bool>) override {}
  void reporterID(int64_t, Reply<QVDictionary>) override {}
  void getAllReporters(Reply<std::vector<int64_t>>) override {}
  void killService(Reply<bool>) override {}
};

// Accepts whom it likes and notes what happens to them.
class Delegate final : public QVIPCListenerDelegate {
 public:
  bool listener(QVIPCListener&, const std::shared_ptr<QVIPCConnection>& connection) override {
    if (connection->processIdentifier() == kUnwanted) return false;
    connection->setExportedInterface(QVIPCInterface::reportingService);
    connection->setExportedObject(service);
    connection->setInterruptionHandler([this] { events.emplace_back("interruption"); });
    connection->setInvalidationHandler([this] { events.emplace_back("invalidation"); });
    connection->resume();
    return true;
  }

  static constexpr int32_t kUnwanted = 13;
  std::shared_ptr<Service> service = std::make_shared<Service>();
  std::vector<std::string> events;
};

class QVFakeIPCTest : public testing::Test {
 protected:
  QVFakeIPCTest() { listener_.setDelegate(delegate_); }

  std::shared_ptr<Delegate> delegate_ = std::make_shared<Delegate>();
  QVFakeIPCListener listener_;
};

TEST_F(QVFakeIPCTest, DeliversCallsToTheExportedObject) {
  const auto connection = listener_.connect(42);
  EXPECT_EQ(connection->processIdentifier(), 42);
  EXPECT_EQ(connection->description(), "connection 1 of process 42");
  EXPECT_TRUE(connection->isResumed());
  EXPECT_EQ(connection->exportedInterface(), QVIPCInterface::reportingService);
  std::optional<bool> answer;
  connection->call().createReportingSession(7, [&answer](bool result) { answer = result; });
  EXPECT_EQ(answer, true);
}

TEST_F(QVFakeIPCTest, InvalidatesWhomTheDelegateRefuses) {
  EXPECT_TRUE(listener_.connect(Delegate::kUnwanted)->isInvalidated());
  EXPECT_TRUE(listener_.connections().empty());
  delegate_.reset();
  EXPECT_TRUE(listener_.connect(42)->isInvalidated()) << "the delegate is held weakly";
}

TEST_F(QVFakeIPCTest, InvalidatesOnceAndLetsGoOfEverything) {
  const auto connection = listener_.connect(42);
  connection->interrupt();
  connection->invalidate();
  connection->invalidate();
  connection->interrupt();
  EXPECT_THAT(delegate_->events, ElementsAre("interruption", "invalidation"));
  EXPECT_EQ(connection->exportedObject(), nullptr);
  EXPECT_EQ(delegate_->service.use_count(), 1);
}

TEST_F(QVFakeIPCTest, EndsEveryConnectionWhenTheServiceEnds) {
  std::shared_ptr<QVFakeIPCConnection> connection;
  listener_.onResume([&] { connection = listener_.connect(42); });
  EXPECT_FALSE(listener_.hasResumed());
  listener_.resume();
  EXPECT_TRUE(listener_.hasResumed());
  EXPECT_TRUE(connection->isInvalidated());
  EXPECT_THAT(delegate_->events, ElementsAre("invalidation"));
}

TEST_F(QVFakeIPCTest, AbandonsConnectionsWithoutAHandler) {
  const auto connection = listener_.connect(42);
  listener_.abandonConnections();
  EXPECT_TRUE(connection->isInvalidated());
  EXPECT_EQ(delegate_->service.use_count(), 1);
  EXPECT_TRUE(delegate_->events.empty());
}

TEST(QVFakeIPCConnectionDeathTest, RefusesCallsThatNoTransportWouldDeliver) {
  QVFakeIPCConnection connection(42, 1);
  connection.setExportedInterface(QVIPCInterface::reportingService);
  EXPECT_DEATH(connection.call(), "has not been resumed");
  connection.resume();
  EXPECT_DEATH(connection.call(), "exports no object");
  connection.setExportedObject(std::make_shared<Service>());
  connection.setExportedInterface(QVIPCInterface::none);
  EXPECT_DEATH(connection.call(), "exports no interface");
  connection.invalidate();
  EXPECT_DEATH(connection.call(), "has been invalidated");
}

}  // namespace
