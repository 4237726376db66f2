#pragma once

#include "platform/linux/QVDescriptor.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVToolPlaces.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

// Something in the service's place that is connected to, and never accepts nor answers.
//
// Threads: the test's.
class QVSilentServiceTest : public testing::Test {
 protected:
  QVSilentServiceTest() {
    places_.socket = root_.socket();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    places_.socket.string().copy(address.sun_path, sizeof address.sun_path - 1);
    // One may wait to be accepted; whoever comes next is not even connected.
    listen(silent_, address, 0);
  }
  static void listen(const QVDescriptor& socket, const sockaddr_un& address, int backlog) {
    EXPECT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(::listen(socket.get(), backlog), 0);
  }

  const QVTemporaryRoot root_;
  const QVDescriptor silent_{::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
  QVToolPlaces places_;
};
