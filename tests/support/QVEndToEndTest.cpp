#include "tests/support/QVEndToEndTest.h"

#include <gmock/gmock.h>

QVDaemonProcess& QVEndToEndTest::startService(const QVDaemonProcess::Options& options) {
  return service_.emplace(root_, options);
}

QVPeerClient QVEndToEndTest::connectClient() {
  service();
  return QVPeerClient(root_.socket());
}

QVRawPeer QVEndToEndTest::connectSilently() {
  service();
  return QVRawPeer(root_.socket(), QVRawPeer::Opening::silent);
}

void QVEndToEndTest::expectServes(QVPeerClient& client) {
  constexpr int64_t kReporter = 990'099;
  client.create(kReporter, 8);
  EXPECT_EQ(client.serviceType(kReporter), 8);
  client.destroy(kReporter);
  EXPECT_FALSE(client.isValid(kReporter));
}

void QVEndToEndTest::expectLogged(std::string_view text, std::size_t count) {
  EXPECT_TRUE(log_.await(text, count)) << "not " << count << " times in the log: " << text << "\n"
                                       << ::testing::PrintToString(log_.lines());
}

void QVEndToEndTest::endService() {
  ASSERT_TRUE(service_.has_value());
  ASSERT_EQ(service_->terminate(), 0) << service_->log();
}

void QVEndToEndTest::expectStored(const std::string& query, std::size_t count) {
  EXPECT_TRUE(QVStoreReader::await(root_.store(), query, count))
      << "not " << count << " rows: " << query;
}
