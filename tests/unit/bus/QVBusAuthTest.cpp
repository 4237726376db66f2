#include "platform/linux/bus/QVBusAuthClient.h"
#include "platform/linux/bus/QVBusAuthServer.h"
#include "platform/linux/bus/QVBusHexadecimal.h"

#include <string>
#include <string_view>

#include <gtest/gtest.h>

using namespace std::string_literals;

namespace {

constexpr std::string_view kServerID = "0123456789abcdef0123456789abcdef";
constexpr uint32_t kUser = 1000;
const std::string kUserHex = "31303030";
const std::string kOK = "OK " + std::string(kServerID) + "\r\n";

using State = QVBusAuthServer::State;

struct Transcript {
  std::string answers;
  std::string rest;  // what was not taken
  State state;
  std::string failure;

  bool operator==(const Transcript&) const = default;
};

// Feeds all that a peer sends, in pieces of a given size.
Transcript talk(const std::string& sent, std::size_t pieceSize = std::string::npos) {
  QVBusAuthServer server(kUser, kServerID);
  Transcript transcript{};
  for (std::size_t at = 0; at < sent.size();) {
    const auto piece = sent.substr(at, pieceSize);
    const std::size_t taken = server.feed(piece, transcript.answers);
    at += taken;
    if (taken < piece.size() || server.state() == State::done) {
      transcript.rest = sent.substr(at);
      break;
    }
    if (server.state() == State::failed) break;
  }
  transcript.state = server.state();
  transcript.failure = server.failure() == nullptr ? "" : server.failure();
  return transcript;
}

}  // namespace

TEST(QVBusAuthServer, TakesTheIdentityWithTheMechanism) {
  const auto transcript = talk("\0AUTH EXTERNAL "s + kUserHex + "\r\nBEGIN\r\n");
  EXPECT_EQ(transcript, (Transcript{kOK, "", State::done, ""}));
}

TEST(QVBusAuthServer, AsksForTheIdentityWhereItDidNotCome) {
  EXPECT_EQ(talk("\0AUTH EXTERNAL\r\nDATA "s + kUserHex + "\r\nBEGIN\r\n"),
            (Transcript{"DATA\r\n" + kOK, "", State::done, ""}));
  EXPECT_EQ(talk("\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"s),
            (Transcript{"DATA\r\n" + kOK, "", State::done, ""}));
}

TEST(QVBusAuthServer, TakesAnEmptyIdentityAsTheKernels) {
  EXPECT_EQ(talk("\0AUTH EXTERNAL \r\nBEGIN\r\n"s), (Transcript{kOK, "", State::done, ""}));
}

TEST(QVBusAuthServer, ListsItsMechanisms) {
  EXPECT_EQ(talk("\0AUTH\r\n"s),
            (Transcript{"REJECTED EXTERNAL\r\n", "", State::waitingForAuth, ""}));
  EXPECT_EQ(
      talk("\0AUTH DBUS_COOKIE_SHA1 6d65\r\nAUTH ANONYMOUS\r\nAUTH EXTERNAL "s + kUserHex + "\r\n"),
      (Transcript{"REJECTED EXTERNAL\r\nREJECTED EXTERNAL\r\n" + kOK, "", State::waitingForBegin,
                  ""}));
}

TEST(QVBusAuthServer, RejectsAnIdentityThatTheKernelDoesNotConfirm) {
  for (const auto* identity : {"31303031", "3130303030", "30", "2031303030", "313", "zz", "-"}) {
    EXPECT_EQ(talk("\0AUTH EXTERNAL "s + identity + "\r\n"),
              (Transcript{"REJECTED EXTERNAL\r\n", "", State::waitingForAuth, ""}))
        << identity;
    EXPECT_EQ(talk("\0AUTH EXTERNAL\r\nDATA "s + identity + "\r\n"),
              (Transcript{"DATA\r\nREJECTED EXTERNAL\r\n", "", State::waitingForAuth, ""}))
        << identity;
  }
}

TEST(QVBusAuthServer, RefusesToTakeDescriptors) {
  EXPECT_EQ(talk("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s),
            (Transcript{"DATA\r\n" + kOK + "ERROR file descriptors are not taken\r\n", "",
                        State::done, ""}));
}

TEST(QVBusAuthServer, StartsAnewAfterCancelAndError) {
  const auto again = "AUTH EXTERNAL " + kUserHex + "\r\nBEGIN\r\n";
  for (const auto* command : {"CANCEL", "ERROR", "ERROR some reason"}) {
    EXPECT_EQ(talk("\0AUTH EXTERNAL\r\n"s + command + "\r\n" + again),
              (Transcript{"DATA\r\nREJECTED EXTERNAL\r\n" + kOK, "", State::done, ""}));
    EXPECT_EQ(talk("\0AUTH EXTERNAL "s + kUserHex + "\r\n" + command + "\r\n" + again),
              (Transcript{kOK + "REJECTED EXTERNAL\r\n" + kOK, "", State::done, ""}));
  }
}

TEST(QVBusAuthServer, AnswersWhatItDoesNotKnowWithAnError) {
  EXPECT_EQ(
      talk("\0HELLO\r\nDATA 31\r\nCANCEL\r\nNEGOTIATE_UNIX_FD\r\n\r\n"s),
      (Transcript{"ERROR\r\nERROR\r\nERROR\r\nERROR\r\nERROR\r\n", "", State::waitingForAuth, ""}));
  EXPECT_EQ(talk("\0AUTH EXTERNAL "s + kUserHex + "\r\nAUTH EXTERNAL\r\nBEGIN\r\n"),
            (Transcript{kOK + "ERROR\r\n", "", State::done, ""}));
}

TEST(QVBusAuthServer, LeavesWhatFollowsBeginAlone) {
  const std::string message = "l\1\0\1 and so on, with \r\nBEGIN\r\n in it";
  for (const std::string& lines : {"\0AUTH EXTERNAL "s + kUserHex + "\r\nBEGIN\r\n",
                                   "\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"s}) {
    const auto transcript = talk(lines + message);
    EXPECT_EQ(transcript.state, State::done);
    EXPECT_EQ(transcript.rest, message);
  }
}

TEST(QVBusAuthServer, GivesTheSameAnswersWhereverTheLinesAreCut) {
  const auto sent = "\0AUTH\r\nAUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\nl\1\0\1"s;
  const auto whole = talk(sent);
  ASSERT_EQ(whole.state, State::done);
  for (std::size_t size = 1; size < sent.size(); ++size) EXPECT_EQ(talk(sent, size), whole) << size;
}

TEST(QVBusAuthServer, FailsWithoutTheFirstNul) {
  EXPECT_EQ(talk("AUTH EXTERNAL\r\n").failure, "authentication does not begin with NUL");
}

TEST(QVBusAuthServer, FailsOnBeginBeforeItsTime) {
  EXPECT_EQ(talk("\0BEGIN\r\n"s).failure, "BEGIN before authentication");
  EXPECT_EQ(talk("\0AUTH EXTERNAL\r\nBEGIN\r\n"s).failure, "BEGIN before authentication");
  EXPECT_EQ(talk("\0AUTH EXTERNAL 30\r\nBEGIN\r\n"s).failure, "BEGIN before authentication");
}

TEST(QVBusAuthServer, FailsOnLinesThatAreTooLongOrEndWrongly) {
  EXPECT_EQ(talk("\0"s + std::string(4095, 'A') + "\n").failure,
            "line of authentication not ended by CR LF");
  EXPECT_EQ(talk("\0"s + std::string(4097, 'A')).failure, "line of authentication too long");
  EXPECT_EQ(talk("\0"s + std::string(4097, 'A'), 100).failure, "line of authentication too long");
  EXPECT_EQ(talk("\0AUTH\n"s).failure, "line of authentication not ended by CR LF");
  EXPECT_EQ(talk("\0"s + std::string(4094, 'A') + "\r\n").answers, "ERROR\r\n");
}

TEST(QVBusAuthServer, FailsAfterTooManyAttempts) {
  std::string lines(1, '\0');
  for (int i = 0; i < 16; ++i) lines += "AUTH\r\n";
  EXPECT_EQ(talk(lines).state, State::waitingForAuth);
  EXPECT_EQ(talk(lines + "AUTH\r\n").failure, "too many attempts to authenticate");
}

TEST(QVBusAuthClient, SaysEverythingAtOnceAndIsUnderstood) {
  const auto opening = QVBusAuthClient::opening(kUser);
  EXPECT_EQ(talk(opening + "message"), (Transcript{kOK, "message", State::done, ""}));
}

TEST(QVBusAuthClient, TakesTheAnswerWhereverItIsCut) {
  const auto answer = kOK + "l\2\1\1";
  for (std::size_t cut = 0; cut <= answer.size(); ++cut) {
    QVBusAuthClient client;
    std::size_t taken = client.feed(std::string_view(answer).substr(0, cut));
    if (client.state() == QVBusAuthClient::State::waitingForAnswer) {
      EXPECT_EQ(taken, cut);
      taken += client.feed(std::string_view(answer).substr(cut));
    }
    EXPECT_EQ(client.state(), QVBusAuthClient::State::done);
    EXPECT_EQ(answer.substr(taken), "l\2\1\1");
  }
}

TEST(QVBusAuthClient, FailsOnAnyOtherAnswer) {
  for (const auto& answer :
       {"REJECTED EXTERNAL\r\n"s, "OK\n"s, "OKAY 1\r\n"s, "\r\n"s, std::string(300, 'x')}) {
    QVBusAuthClient client;
    EXPECT_EQ(client.feed(answer), answer.size());
    EXPECT_EQ(client.state(), QVBusAuthClient::State::failed) << answer;
  }
}

TEST(QVBusHexadecimal, GoesThereAndBack) {
  EXPECT_EQ(QVBusToHexadecimal("0\xff\n"), "30ff0a");
  std::string bytes;
  EXPECT_TRUE(QVBusFromHexadecimal("30fF0A", bytes));
  EXPECT_EQ(bytes, "0\xff\n");
  EXPECT_FALSE(QVBusFromHexadecimal("3", bytes));
  EXPECT_FALSE(QVBusFromHexadecimal("3g", bytes));
}
