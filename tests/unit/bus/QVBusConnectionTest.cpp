#include "platform/linux/bus/QVBusConnection.h"
#include "tests/unit/bus/QVBusFixture.h"

#include <new>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <unistd.h>

using namespace std::string_literals;
using testing::Test;

namespace {

using Journal = std::vector<std::string>;

std::string create(int64_t reporterID, uint32_t serial, uint8_t flags = 0) {
  return QVTestCall("CreateReportingSession", reporterID, serial, 'l', flags);
}

// A message with a payload of one string of that size.
std::string sendMessage(std::size_t size, uint32_t serial, uint8_t flags = 0) {
  QVTestWire body;
  body.array(8, [&](QVTestWire& wire) { wire.entry("k", "s").string(std::string(size, 'x')); });
  body.u32(1).u16(2).u32(1).u32(0).align(8);
  return QVTestMessage{.flags = flags,
                       .serial = serial,
                       .member = "SendMessage",
                       .signature = "a{sv}uqbax",
                       .body = body.bytes}
      .bytes();
}

const std::string kViolation =
    "protocol violation, closing the connection of process " + std::to_string(::getpid()) + ": ";

}  // namespace

class QVBusConnectionTest : public QVBusFixture {};

TEST_F(QVBusConnectionTest, AnswersACall) {
  connect();
  const auto answers = exchange(create(7, 42));
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0].replySerial, 42U);
  EXPECT_TRUE(answers[0].boolean());
  EXPECT_EQ(journal_, Journal{"1 create 7"});
}

TEST_F(QVBusConnectionTest, TakesAuthenticationAndCallsInOneWrite) {
  connect(false);
  peer().send(QVBusPeer::authentication() + create(1, 1) + create(2, 2));
  run();
  const auto received = peer().receive();
  EXPECT_TRUE(received.starts_with("OK ")) << received;
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 create 2"}));
}

TEST_F(QVBusConnectionTest, TakesAuthenticationAndACallWhereverTheyAreCut) {
  const std::string all = QVBusPeer::authentication() + create(7, 1);
  for (std::size_t cut = 1; cut < all.size(); ++cut) {
    journal_.clear();
    connect(false);
    peers_.back()->send(std::string_view(all).substr(0, cut));
    run();
    peers_.back()->send(std::string_view(all).substr(cut));
    run();
    EXPECT_EQ(journal_, Journal{std::to_string(peers_.size()) + " create 7"}) << cut;
    const auto received = peers_.back()->receive();
    EXPECT_EQ(received.find("OK "), 0U) << cut;
    EXPECT_NE(received.find("l\2"), std::string::npos) << "an answer, cut at " << cut;
  }
}

TEST_F(QVBusConnectionTest, TakesBothByteOrdersMixed) {
  connect();
  const auto answers = exchange(QVTestCall("CreateReportingSession", 1, 1, 'B') + create(2, 2) +
                                QVTestCall("CreateReportingSession", -3, 0x01020304, 'B'));
  ASSERT_EQ(answers.size(), 3U);
  EXPECT_EQ(answers[2].replySerial, 0x01020304U);
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 create 2", "1 create -3"}));
}

TEST_F(QVBusConnectionTest, DeliversWhatCameWholeBeforeTheEnd) {
  connect();
  const auto third = create(3, 3);
  peer().send(create(1, 1) + create(2, 2) + third.substr(0, third.size() - 1));
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 create 2", "1 invalidation"}));
  EXPECT_TRUE(logged().empty());
  EXPECT_EQ(server_->connections(), 0U);
}

TEST_F(QVBusConnectionTest, DeliversWhatCameBeforeAPeerThatDoesNotTakeItsAnswers) {
  connect();
  // The answer to the first batch stays unread, which makes the end a reset.
  exchange(create(1, 1));
  peer().send(create(2, 2));
  run();
  peer().send(create(3, 3) + create(4, 4));
  peer().hangUp();
  run();
  EXPECT_EQ(journal_,
            (Journal{"1 create 1", "1 create 2", "1 create 3", "1 create 4", "1 invalidation"}));
  EXPECT_TRUE(logged().empty());
}

TEST_F(QVBusConnectionTest, DeliversWhatCameBeforeAWriteFails) {
  connect();
  // While the first call is carried out the peer goes; the answer cannot be written, but what had
  // been sent is still there.
  service().onCall = [this](const std::string& call) {
    journal_.push_back(call);
    if (call == "create 1") {
      peer().send(create(2, 2));
      peer().hangUp();
    }
  };
  peer().send(create(1, 1));
  run();
  EXPECT_EQ(journal_, (Journal{"create 1", "create 2", "1 invalidation"}));
}

TEST_F(QVBusConnectionTest, InterruptsThenInvalidatesOnAViolation) {
  connect();
  peer().send(create(1, 1) + std::string(16, '\0') + create(2, 2));
  run();
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 interruption", "1 invalidation"}));
  const auto lines = platform_.log().lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].level, QVLogLevel::error);
  EXPECT_EQ(lines[0].scope, QVFakeLog::kDefaultScope);
  EXPECT_EQ(lines[0].text, kViolation + "neither byte order is named");
  EXPECT_EQ(peer().receiveAnswers().size(), 1U) << "what was answered before goes out";
  EXPECT_TRUE(peer().isClosed());
  peer().hangUp();
  run();
  EXPECT_EQ(journal_.size(), 3U);
}

TEST_F(QVBusConnectionTest, ClosesOnWhateverBreaksTheProtocol) {
  const auto bytes = [](const QVTestMessage& message) { return message.bytes(); };
  auto huge = create(1, 1);
  huge.replace(4, 4, "\0\0\x80\0"s);
  const std::vector<std::pair<std::string, std::string>> violations{
      {huge, "message larger than 8 MiB"},
      {bytes({.serial = 0}), "message without a serial"},
      {bytes({.signature = "x", .body = "1234"}), "truncated"},
      {bytes({.signature = "x", .body = "123456781"}), "body longer than its signature"},
      {bytes({.member = "Unknown", .signature = "b", .body = "\2\0\0\0"s}),
       "a boolean is neither 0 nor 1"},
      {bytes({.path = "/unknown", .signature = "b", .body = "\2\0\0\0"s}),
       "a boolean is neither 0 nor 1"},
      {bytes({.type = 4, .signature = "b", .body = "\2\0\0\0"s}), "a boolean is neither 0 nor 1"},
      {bytes({.flags = 1, .member = "SendMessage", .signature = "((("}), "not a signature"},
  };
  for (const auto& [sent, reason] : violations) {
    platform_.log().clear();
    journal_.clear();
    connect();
    peers_.back()->send(sent);
    run();
    const auto name = std::to_string(peers_.size());
    EXPECT_EQ(journal_, (Journal{name + " interruption", name + " invalidation"})) << reason;
    EXPECT_EQ(logged(), Journal{kViolation + reason});
    EXPECT_TRUE(peers_.back()->isClosed());
  }
}

TEST_F(QVBusConnectionTest, ClosesOnFailedAuthentication) {
  connect(false);
  peer().send("GET / HTTP/1.1\r\n");
  run();
  EXPECT_EQ(journal_, (Journal{"1 interruption", "1 invalidation"}));
  EXPECT_EQ(logged(), Journal{kViolation + "authentication does not begin with NUL"});
  EXPECT_TRUE(peer().isClosed());
}

TEST_F(QVBusConnectionTest, LeavesOthersAloneWhenOneViolates) {
  connect();
  connect();
  peer(1).send("garbage that is long enough to be looked at");
  peer(2).send(create(5, 1));
  run();
  EXPECT_EQ(exchange(create(6, 2), 2).size(), 2U);
  EXPECT_EQ(server_->connections(), 1U);
}

TEST_F(QVBusConnectionTest, IgnoresMessagesThatAreNoCalls) {
  connect();
  const auto reply =
      QVTestMessage{.type = 2, .moreFields = QVTestWire().u8(5).signature("u").u32(3).bytes};
  const auto answers = exchange(
      QVTestMessage{.type = 4}.bytes() + reply.bytes() +
      QVTestMessage{.type = 77, .signature = "s", .body = QVTestWire().string("x").bytes}.bytes() +
      create(1, 9));
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0].replySerial, 9U);
  EXPECT_TRUE(logged().empty());
}

TEST_F(QVBusConnectionTest, WritesNothingWhereNoReplyIsExpected) {
  connect();
  const auto answers = exchange(
      create(1, 1, 1) + QVTestMessage{.flags = 1, .serial = 2, .member = "Unknown"}.bytes() +
      QVTestMessage{
          .flags = 1, .serial = 3, .signature = "s", .body = QVTestWire().string("x").bytes}
          .bytes() +
      sendMessage(5, 4, 1) + create(2, 5));
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0].replySerial, 5U);
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 send 1", "1 create 2"}));
}

TEST_F(QVBusConnectionTest, SendsTwoReturnsToOneCallThatIsAnsweredTwice) {
  connect();
  const auto answers = exchange(QVTestCall("GetServiceNameForReporterID", 0, 77));
  ASSERT_EQ(answers.size(), 2U);
  EXPECT_EQ(answers[0].replySerial, 77U);
  EXPECT_EQ(answers[1], answers[0]);
  EXPECT_EQ(answers[0].signature, "q");
}

TEST_F(QVBusConnectionTest, SendsNothingForAReplyThatIsDropped) {
  connect();
  EXPECT_TRUE(exchange(QVTestMessage{.member = "KillService"}.bytes()).empty());
  ASSERT_EQ(service().keptReplies.size(), 1U);
  service().keptReplies.clear();
  run();
  EXPECT_TRUE(peer().receive().empty());
  EXPECT_EQ(exchange(create(1, 2)).size(), 1U) << "the connection goes on";
}

TEST_F(QVBusConnectionTest, SendsAReplyThatComesLater) {
  connect();
  EXPECT_TRUE(exchange(QVTestCall("StartReportingSessionForID", 1, 5)).empty());
  service().sessions[1].started(true);
  run();
  const auto answers = peer().receiveAnswers();
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0].replySerial, 5U);
}

TEST_F(QVBusConnectionTest, DoesNothingForAReplyAfterTheEnd) {
  connect();
  exchange(QVTestCall("StartReportingSessionForID", 1, 5));
  peer().hangUp();
  run();
  auto reply = std::move(service().sessions[1].started);
  reply(true);
  server_.reset();
  reply(true);
  run();
  EXPECT_EQ(journal_, (Journal{"1 start 1", "1 invalidation"}));
}

TEST_F(QVBusConnectionTest, TakesRepliesFromOtherThreads) {
  connect();
  constexpr uint32_t kCalls = 200;
  for (uint32_t serial = 1; serial <= kCalls; ++serial) {
    peer().send(QVTestCall("StartReportingSessionForID", serial, serial));
  }
  run();
  std::vector<Reply<bool>> first, second;
  for (uint32_t serial = 1; serial <= kCalls; ++serial) {
    (serial % 2 == 0 ? first : second).push_back(std::move(service().sessions[serial].started));
  }
  const auto replyAll = [](std::vector<Reply<bool>>& replies) {
    for (auto& reply : replies) reply(true);
  };
  std::thread one(replyAll, std::ref(first)), other(replyAll, std::ref(second));
  std::vector<QVBusAnswer> answers;
  // The loop's own wake-ups tell that there is something; a deadline only ends a failure.
  while (answers.size() < kCalls && loop_.runOne(std::chrono::seconds(20))) {
    for (auto& answer : peer().receiveAnswers()) answers.push_back(std::move(answer));
  }
  one.join();
  other.join();
  EXPECT_EQ(answers.size(), kCalls);
}

TEST_F(QVBusConnectionTest, LetsGoOfTheObjectAfterTheInvalidationHandler) {
  connect();
  std::weak_ptr<QVRecordingService> weak = services_[0];
  services_.clear();
  ASSERT_FALSE(weak.expired());
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, Journal{"1 invalidation"});
  EXPECT_TRUE(weak.expired());
}

TEST_F(QVBusConnectionTest, KeepsTheObjectThroughTheHandlers) {
  auto service = std::make_shared<QVRecordingService>();
  const std::weak_ptr<QVRecordingService> weak = service;
  connect();
  services_.clear();
  const auto connection = accept();
  connection->setExportedObject(std::move(service));
  std::string seen;
  connection->setInterruptionHandler([&] { seen += weak.expired() ? "gone " : "there "; });
  connection->setInvalidationHandler([&] { seen += weak.expired() ? "gone " : "there "; });
  connection->resume();
  peers_.back()->send("garbage");
  run();
  EXPECT_EQ(seen, "there there ");
  EXPECT_TRUE(weak.expired());
  EXPECT_EQ(connection->exportedObject(), nullptr);
}

// A queue that carries out what a test runs.
class QVBusCallsTest : public QVBusConnectionTest {
 protected:
  QVBusCallsTest() {
    server_->setAfterCalls(
        [this](QVFunction<void()> work) { waiting_.push_back(std::move(work)); });
  }
  void carryOut() {
    for (QVFunction<void()>& work : std::exchange(waiting_, {})) work();
    run();
  }

  std::vector<QVFunction<void()>> waiting_;
};

TEST_F(QVBusCallsTest, OfAClientThatIsGoneAtOnceAreCarriedOutBeforeItsInvalidation) {
  connect();
  peer().send(create(1, 1));
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, Journal{"1 create 1"});
  EXPECT_EQ(server_->connections(), 0U) << "its descriptor is free";
  carryOut();
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 invalidation"}));
}

TEST_F(QVBusCallsTest, AreCarriedOutBeforeTheInvalidationThatFollowsAnInterruption) {
  connect();
  peer().send(std::string(16, '\0'));
  run();
  EXPECT_EQ(journal_, Journal{"1 interruption"});
  carryOut();
  EXPECT_EQ(journal_, (Journal{"1 interruption", "1 invalidation"}));
}

TEST_F(QVBusCallsTest, AreEnqueuedBeforeTheInvalidationOfAClientThatHasBeenThere) {
  connect();
  carryOut();
  peer().send(create(1, 1));
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, (Journal{"1 create 1", "1 invalidation"}));
}

TEST_F(QVBusCallsTest, ThatCannotBeWaitedForHoldUpNoEnd) {
  connect();
  server_->setAfterCalls([](QVFunction<void()>) { throw std::bad_alloc(); });
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, Journal{"1 invalidation"});
}

TEST_F(QVBusCallsTest, AreWhereTheObjectIsLetGoOf) {
  connect();
  const std::weak_ptr<QVRecordingService> weak = services_[0];
  services_.clear();
  carryOut();
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, Journal{"1 invalidation"});
  EXPECT_FALSE(weak.expired());
  carryOut();
  EXPECT_TRUE(weak.expired());
}

TEST_F(QVBusCallsTest, AreAwaitedWhenTheServiceEnds) {
  connect();
  connect();
  server_->invalidateAll();
  EXPECT_EQ(journal_, Journal{});
  std::thread queue([waiting = std::exchange(waiting_, {})]() mutable {
    for (QVFunction<void()>& work : waiting) work();
  });
  server_->awaitEnds();
  queue.join();
  EXPECT_EQ(journal_.size(), 2U);
}

// ---- What goes wrong here is the end of one connection

TEST_F(QVBusConnectionTest, GoesOnWhereAHandlerThrows) {
  const auto connection = accept();
  connection->setInterruptionHandler([] { throw std::runtime_error("no thread"); });
  connection->setInvalidationHandler([] { throw std::runtime_error("no memory"); });
  connection->resume();
  connect();
  peer(1).send("garbage");
  run();
  EXPECT_TRUE(peer(1).isClosed());
  const std::string pid = std::to_string(::getpid());
  EXPECT_EQ(logged().back(), "exception in the connection of process " + pid + ": no memory");
  EXPECT_EQ(logged()[1], "exception in the connection of process " + pid + ": no thread");
  EXPECT_TRUE(exchange(create(1, 1), 2).at(0).boolean());
}

TEST_F(QVBusConnectionTest, EndsAloneWhereACallThrows) {
  connect();
  connect();
  service(1).onCall = [](const std::string&) { throw std::runtime_error("no thread"); };
  peer(1).send(create(1, 1));
  run();
  EXPECT_EQ(journal_, Journal{"1 invalidation"});
  EXPECT_TRUE(peer(1).isClosed());
  EXPECT_EQ(logged(), (Journal{"exception in the connection of process " +
                               std::to_string(::getpid()) + ": no thread"}));
  EXPECT_TRUE(exchange(create(1, 1), 2).at(0).boolean());
}

TEST_F(QVBusConnectionTest, DeliversNothingBeforeItIsResumed) {
  const auto connection = accept();
  peer().send(QVBusPeer::authentication() + create(1, 1));
  run();
  EXPECT_TRUE(peer().receive().empty());
  connection->resume();
  run();
  EXPECT_TRUE(peer().receive().starts_with("OK "));
}

TEST_F(QVBusConnectionTest, KnowsItsPeer) {
  connect();
  const auto connection = accept();
  EXPECT_EQ(connection->processIdentifier(), ::getpid());
  EXPECT_EQ(connection->description(),
            "<QVBusConnection :1.2 pid " + std::to_string(::getpid()) + ">");
}

TEST_F(QVBusConnectionTest, InvalidatesAllWhenTheServiceEnds) {
  connect();
  connect();
  peer(1).send(create(1, 1));
  run();
  server_->invalidateAll();
  EXPECT_EQ(journal_.size(), 3U);
  EXPECT_EQ(server_->connections(), 0U);
  EXPECT_EQ(peer(1).receiveAnswers().size(), 1U);
  EXPECT_TRUE(peer(1).isClosed());
  EXPECT_TRUE(peer(2).isClosed());
  server_->invalidateAll();
  EXPECT_EQ(journal_.size(), 3U);
}

TEST_F(QVBusConnectionTest, StopsReadingAPeerThatDoesNotReadItsAnswers) {
  connect();
  // Each call has an answer of about 5 kB; the socket's own buffers hold some, 1 MiB more may wait.
  const QVTestMessage introspect{.interface = "org.freedesktop.DBus.Introspectable",
                                 .member = "Introspect"};
  const auto one = introspect.bytes();
  std::string batch;
  for (int i = 0; i < 100; ++i) batch += one;
  std::size_t calls = 0;
  // Until the socket takes no more although the service had its turn.
  for (;;) {
    const std::size_t sent = peer().sendSome(batch);
    calls += sent / one.size();
    run();
    if (sent % one.size() != 0 || sent == 0) break;
    ASSERT_LT(calls, 100000U) << "the service reads on and on";
  }
  // Everybody else is served.
  connect();
  EXPECT_EQ(exchange(create(1, 1), 2).size(), 1U);
  // When it reads at last, everything that it sent whole is answered, and reading goes on.
  std::string received;
  for (auto more = peer(1).receive(); !more.empty(); more = peer(1).receive()) {
    received += more;
    run();
  }
  QVBusFrameDecoder decoder;
  decoder.feed(received);
  std::size_t answers = 0;
  for (std::string_view frame; decoder.next(frame) == QVBusFrameDecoder::Result::message;)
    ++answers;
  EXPECT_EQ(answers, calls);
  EXPECT_GT(received.size(), std::size_t{1} << 20);
}

TEST_F(QVBusConnectionTest, GivesUpAPeerForWhichTooManyAnswersWait) {
  connect();
  for (int64_t reporterID = 0; reporterID < 65'536; ++reporterID) {
    service().sessions[reporterID] = {};
  }
  // Half a MiB each; all of them are taken in with one read.
  std::string batch;
  for (int i = 0; i < 40; ++i) batch += QVTestMessage{.member = "GetAllReporters"}.bytes();
  peer().send(batch);
  run();
  EXPECT_EQ(server_->connections(), 0U);
  EXPECT_EQ(journal_[journal_.size() - 2], "1 interruption");
  EXPECT_EQ(journal_.back(), "1 invalidation");
  ASSERT_EQ(logged().size(), 1U);
  EXPECT_THAT(logged().front(), testing::HasSubstr("more than 16 MiB of answers wait"));
}

TEST_F(QVBusConnectionTest, EndsAConnectionThatIsNotReadWhenItsPeerGoes) {
  connect();
  std::string batch;
  for (int i = 0; i < 1000; ++i) {
    batch +=
        QVTestMessage{.interface = "org.freedesktop.DBus.Introspectable", .member = "Introspect"}
            .bytes();
  }
  while (peer().sendSome(batch) == batch.size()) run();
  run();
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, Journal{"1 invalidation"});
  EXPECT_EQ(server_->connections(), 0U);
}

TEST_F(QVBusConnectionTest, StopsReadingTheHeaviestAboveTheBoundAndGoesOnBelow) {
  makeServer(kSmallBound);
  connect();
  connect();
  // Alone above the bound and above its share of it.
  exchange(sendMessage(kSmallBound, 1));
  ASSERT_EQ(service(1).messages.size(), 1U);
  peer(1).send(create(1, 2));
  peer(2).send(create(2, 1));
  run();
  EXPECT_EQ(journal_, (Journal{"1 send 1", "2 create 2"}));
  // What it waits for: the message goes, on whatever thread.
  std::thread([this] { service(1).messages.clear(); }).join();
  run();
  EXPECT_EQ(journal_.back(), "1 create 1");
  EXPECT_EQ(server_->budget().total(), 0U);
}

TEST_F(QVBusConnectionTest, DeliversTheRestOfAPeerThatGoesWhileItIsNotRead) {
  makeServer(kSmallBound);
  connect();
  exchange(sendMessage(kSmallBound, 1));
  peer().send(create(1, 2));
  run();
  EXPECT_EQ(journal_, Journal{"1 send 1"});
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, (Journal{"1 send 1", "1 create 1", "1 invalidation"}));
}

TEST_F(QVBusConnectionTest, ChargesMessagesThatCameByHalf) {
  makeServer(kSmallBound);
  connect();
  const auto message = sendMessage(3 * kSmallBound, 1);
  peer().send(std::string_view(message).substr(0, message.size() / 2));
  run();
  EXPECT_GE(server_->budget().total(), message.size() / 2);
  // It can only get rid of that by going.
  peer().send(create(1, 2));
  run();
  EXPECT_TRUE(journal_.empty());
  peer().hangUp();
  run();
  EXPECT_EQ(journal_, Journal{"1 invalidation"});
  EXPECT_EQ(server_->budget().total(), 0U);
}

TEST_F(QVBusConnectionTest, LeavesChargesToTheMessagesThatOutliveTheConnection) {
  connect();
  exchange(sendMessage(1000, 1));
  auto payload = service().messages.at(0).payload;
  service().messages.clear();
  peer().hangUp();
  run();
  EXPECT_EQ(journal_.back(), "1 invalidation");
  EXPECT_EQ(server_->budget().total(), payload.footprint());
  server_.reset();
  EXPECT_EQ(payload.find("k")->string().size(), 1000U);
  payload = {};
}
