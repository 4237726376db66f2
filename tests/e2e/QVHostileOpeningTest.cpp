// Peers that break the rules before their first message. Each loses its connection, one log line
// says why, and nobody else notices.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <deque>
#include <filesystem>

#include <gmock/gmock.h>

namespace {

constexpr const char* kIdentity = "AUTH EXTERNAL ";

std::string hexadecimal(const std::string& text) {
  std::string out;
  for (const char digit : text) out.append("3").push_back(digit);  // of decimal digits
  return out;
}
std::string ownIdentity() {
  return kIdentity + hexadecimal(std::to_string(::getuid())) + "\r\n";
}
const std::string kNul(1, '\0');

class QVHostileOpeningTest : public QVEndToEndTest {
 protected:
  void expectClosed(QVRawPeer& peer, const std::string& reason) {
    peer.awaitClose();
    expectLogged("protocol violation, closing the connection of process " +
                 std::to_string(::getpid()) + ": " + reason);
    expectLogged("InterruptionHandler: connection exited");
    expectLogged("InvalidationHandler: connection exited");
    expectServes(witness_);
    EXPECT_EQ(log().count("protocol violation"), 1U);
    EXPECT_EQ(log().count("InterruptionHandler: connection exited"), 1U);
    EXPECT_EQ(log().count("InvalidationHandler: connection exited"), 1U);
  }

  QVPeerClient witness_{connectClient()};
};

TEST_F(QVHostileOpeningTest, GarbageIsRefused) {
  auto peer = connectSilently();
  peer.send("GET / HTTP/1.1\r\n\r\n");
  expectClosed(peer, "authentication does not begin with NUL");
}

TEST_F(QVHostileOpeningTest, AnotherUsersIdentityIsRejected) {
  auto peer = connectSilently();
  peer.send(kNul + kIdentity + hexadecimal(std::to_string(::getuid() + 1)) + "\r\n");
  EXPECT_EQ(peer.receiveLine(), "REJECTED EXTERNAL");
  peer.send("BEGIN\r\n");
  expectClosed(peer, "BEGIN before authentication");
}

TEST_F(QVHostileOpeningTest, AnotherUsersIdentityWithEverythingAtOnceIsRejected) {
  auto peer = connectSilently();
  peer.send(kNul + kIdentity + hexadecimal("4294967294") + "\r\nBEGIN\r\n" +
            createCall(7).bytes(1));
  expectClosed(peer, "BEGIN before authentication");
  EXPECT_FALSE(witness_.isValid(7));
}

TEST_F(QVHostileOpeningTest, CallsWithoutAuthenticationAreRefused) {
  auto peer = connectSilently();
  peer.send(kNul + createCall(7).bytes(1) + "\r\n");
  // Not a line of the exchange at all, so the peer may try again; its call is lost.
  EXPECT_TRUE(peer.receiveLine().starts_with("ERROR"));
  peer.send("BEGIN\r\n");
  expectClosed(peer, "BEGIN before authentication");
  EXPECT_FALSE(witness_.isValid(7));
}

TEST_F(QVHostileOpeningTest, EndlessAttemptsAreRefused) {
  auto peer = connectSilently();
  std::string attempts = kNul;
  for (int i = 0; i < 100; ++i) attempts += "AUTH ANONYMOUS\r\n";
  peer.send(attempts);
  expectClosed(peer, "too many attempts to authenticate");
}

TEST_F(QVHostileOpeningTest, AnEndlessLineIsRefused) {
  auto peer = connectSilently();
  peer.send(kNul + std::string(5000, 'A'));
  expectClosed(peer, "line of authentication too long");
}

TEST_F(QVHostileOpeningTest, ALineWithoutCarriageReturnIsRefused) {
  auto peer = connectSilently();
  peer.send(kNul + "AUTH\n");
  expectClosed(peer, "line of authentication not ended by CR LF");
}

TEST_F(QVHostileOpeningTest, VanishingInTheMiddleIsNoViolation) {
  const std::string opening = QVRawPeer::opening();
  for (std::size_t length = 0; length < opening.size(); ++length) {
    auto peer = connectSilently();
    peer.send(opening.substr(0, length));
  }
  expectLogged("InvalidationHandler: connection exited", opening.size());
  EXPECT_EQ(log().count("protocol violation"), 0U);
  expectServes(witness_);
}

// ---- What is allowed

class QVOpeningTest : public QVEndToEndTest {
 protected:
  static void expectLetIn(QVRawPeer& peer) {
    EXPECT_TRUE(peer.receiveLine().starts_with("OK "));
    peer.send("BEGIN\r\n");
    EXPECT_TRUE(peer.call(createCall(7)).boolean());
  }
};

TEST_F(QVOpeningTest, TellsTheMechanismsToAPlainAuth) {
  auto peer = connectSilently();
  peer.send(kNul + "AUTH\r\n");
  EXPECT_EQ(peer.receiveLine(), "REJECTED EXTERNAL");
  peer.send(ownIdentity());
  expectLetIn(peer);
}

TEST_F(QVOpeningTest, TakesTheIdentityAfterwards) {
  auto peer = connectSilently();
  peer.send(kNul + "AUTH EXTERNAL\r\n");
  EXPECT_EQ(peer.receiveLine(), "DATA");
  peer.send("DATA " + hexadecimal(std::to_string(::getuid())) + "\r\n");
  expectLetIn(peer);
}

TEST_F(QVOpeningTest, TakesTheKernelsWordForAnEmptyIdentity) {
  auto peer = connectSilently();
  peer.send(kNul + "AUTH EXTERNAL\r\n");
  EXPECT_EQ(peer.receiveLine(), "DATA");
  peer.send("DATA\r\n");
  expectLetIn(peer);
}

TEST_F(QVOpeningTest, TakesNoDescriptors) {
  auto peer = connectSilently();
  peer.send(kNul + ownIdentity() + "NEGOTIATE_UNIX_FD\r\n");
  EXPECT_TRUE(peer.receiveLine().starts_with("OK "));
  EXPECT_TRUE(peer.receiveLine().starts_with("ERROR"));
  peer.send("BEGIN\r\n");
  EXPECT_TRUE(peer.call(createCall(7)).boolean());
}

TEST_F(QVOpeningTest, TriesAgainAfterOtherMechanisms) {
  auto peer = connectSilently();
  peer.send(kNul + "AUTH ANONYMOUS\r\nAUTH DBUS_COOKIE_SHA1 30\r\nCANCEL\r\n" + ownIdentity());
  EXPECT_EQ(peer.receiveLine(), "REJECTED EXTERNAL");
  EXPECT_EQ(peer.receiveLine(), "REJECTED EXTERNAL");
  EXPECT_TRUE(peer.receiveLine().starts_with("ERROR"));
  expectLetIn(peer);
}

TEST_F(QVOpeningTest, MayBeCutAnywhere) {
  auto witness = connectClient();
  const std::string bytes = QVRawPeer::opening() + createCall(7).bytes(1);
  for (std::size_t cut = 1; cut < bytes.size(); ++cut) {
    SCOPED_TRACE(cut);
    auto peer = connectSilently();
    peer.send(bytes.substr(0, cut));
    // Once this is answered, what was sent before has been read.
    witness.call(pingCall());
    peer.send(bytes.substr(cut));
    EXPECT_TRUE(peer.receiveLine().starts_with("OK "));
    ASSERT_TRUE(peer.awaitReply(1).boolean());
  }
  EXPECT_EQ(log().count("protocol violation"), 0U);
}

// Whoever the socket's mode lets connect is let in.
TEST_F(QVOpeningTest, LetsOtherUsersInWhereTheSocketDoes) {
  if (::getuid() != 0) GTEST_SKIP() << "only root can become another user";
  auto witness = connectClient();
  for (const auto& path : {root_.path(), root_.runtime()}) {
    std::filesystem::permissions(path, std::filesystem::perms(0755));
  }
  const std::vector<std::string> list{"setpriv",
                                      "--reuid=65534",
                                      "--regid=65534",
                                      "--clear-groups",
                                      "busctl",
                                      "--address=" + address(),
                                      "call",
                                      "net.quillon.quietvox",
                                      "/net/quillon/quietvox/ReportingService",
                                      "net.quillon.quietvox.ReportingService",
                                      "GetAllReporters"};
  EXPECT_THAT(QVSubprocess::run(list).text, ::testing::HasSubstr("Permission denied"));
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0666));
  EXPECT_EQ(QVSubprocess::run(list).text, "ax 0\n");
}

// Each connection takes a descriptor of this process and one of the service.
TEST_F(QVOpeningTest, LetsAFloodOfClientsIn) {
  constexpr std::size_t kClients = 200;
  auto witness = connectClient();
  std::deque<QVRawPeer> peers;
  for (std::size_t i = 0; i < kClients; ++i) {
    auto& peer = peers.emplace_back(root_.socket(), QVRawPeer::Opening::silent);
    peer.send(QVRawPeer::opening() + createCall(static_cast<int64_t>(i) + 1).bytes(1));
  }
  for (auto& peer : peers) {
    EXPECT_TRUE(peer.receiveLine().starts_with("OK "));
    EXPECT_TRUE(peer.awaitReply(1).boolean());
  }
  EXPECT_EQ(witness.reporters().size(), kClients);
  peers.clear();
  expectLogged("deallocing this session", kClients);
  EXPECT_TRUE(witness.reporters().empty());
}

}  // namespace
