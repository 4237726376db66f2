#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVServiceState.h"

#include <string>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

// A socket in a directory of its own, which this program serves itself.
class QVServiceStateTest : public testing::Test {
 protected:
  QVServiceStateTest() {
    address_.sun_family = AF_UNIX;
    root_.socket().string().copy(address_.sun_path, sizeof address_.sun_path - 1);
    EXPECT_EQ(::bind(listener_, reinterpret_cast<const sockaddr*>(&address_), sizeof address_), 0);
    EXPECT_EQ(::listen(listener_, 16), 0);
  }
  ~QVServiceStateTest() override { ::close(listener_); }

  struct Connection {
    int client = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int accepted = -1;
    ~Connection() {
      ::close(client);
      ::close(accepted);
    }
  };
  void connect(Connection& connection) const {
    ASSERT_EQ(
        ::connect(connection.client, reinterpret_cast<const sockaddr*>(&address_), sizeof address_),
        0);
    connection.accepted = ::accept(listener_, nullptr, nullptr);
    ASSERT_GE(connection.accepted, 0);
  }
  QVServiceState state() const {
    return QVServiceState::find(QVToolPlaces::find(root_.socket().string(), ""));
  }

  const QVTemporaryRoot root_;
  sockaddr_un address_{};
  const int listener_ = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
};

TEST_F(QVServiceStateTest, KnowsWhoIsConnected) {
  EXPECT_EQ(state().kind, QVServiceState::Kind::onDemand);
  Connection connection;
  connect(connection);
  EXPECT_EQ(state().kind, QVServiceState::Kind::running);
  ASSERT_EQ(state().clients.size(), 1U);
  EXPECT_EQ(state().clients[0].pid, ::getpid());
}

TEST_F(QVServiceStateTest, CountsNoClientThatHasGone) {
  Connection gone;
  Connection there;
  connect(gone);
  connect(there);
  ::close(gone.client);
  gone.client = -1;
  const auto clients = state().clients;
  ASSERT_EQ(clients.size(), 1U);
  EXPECT_EQ(clients[0].pid, ::getpid());
}

}  // namespace
