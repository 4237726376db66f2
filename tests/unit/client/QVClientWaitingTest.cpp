// Calls that wait for their answers, on a thread of the program's, and the library's own thread.

#include "client/QVClientBatch.h"
#include "tests/unit/client/QVScriptedService.h"

#include <atomic>
#include <csignal>
#include <future>
#include <thread>

#include <gtest/gtest.h>

namespace {

using Call = QVScriptedService::Call;
using Code = QVClientError::Code;

constexpr QVClientCategory kPlayback{QVClientComponent::session, QVClientKind::playback};

// Answers as the real service does for a session 7 that there is, until the client hangs up.
void serve(QVScriptedService& service) {
  std::vector<Call> starts;
  for (Call call = service.nextCall(); !call.member.empty(); call = service.nextCall()) {
    if (!call.answerWanted) continue;
    if (call.member == "GetServiceNameForReporterID") {
      service.answer(call, "q", [](QVBusWriter& writer) { writer.writeNumber<uint16_t>(8); });
    } else if (call.member == "ReporterIDValid") {
      const int64_t asked = call.reader().readNumber<int64_t>();
      service.answer(call, "a{sv}", [asked](QVBusWriter& writer) {
        const auto array = writer.beginArray(8);
        writer.beginStruct();
        writer.writeString("reporterID");
        writer.beginVariant("x");
        writer.writeNumber<int64_t>(asked == 7 ? 7 : 0);
        writer.endArray(array);
      });
    } else if (call.member == "GetAllReporters") {
      service.answer(call, "ax", [](QVBusWriter& writer) {
        const auto array = writer.beginArray(8);
        writer.writeNumber<int64_t>(7);
        writer.endArray(array);
      });
    } else if (call.member == "SendMessage") {
      service.answer(call);
    } else if (call.member == "StartReportingSessionForID") {
      starts.push_back(call);
    } else if (call.member == "KillService") {
      service.hangUp();
      return;
    } else {
      if (call.member == "StopReportingSessionForID") {
        for (const Call& start : starts) service.answerBoolean(start);
        starts.clear();
      }
      service.answerBoolean(call);
    }
  }
}

class QVClientWaitingTest : public testing::TestWithParam<QVClientOptions::Callbacks> {
 protected:
  void connect() {
    QVClientOptions options;
    options.callbacks = GetParam();
    client_ = service_.connectClient(std::move(options));
  }
  void connectAndServe() {
    connect();
    server_ = std::thread([this] {
      service_.letIn();
      serve(service_);
    });
  }
  void TearDown() override {
    client_.reset();
    if (server_.joinable()) server_.join();
  }

  QVScriptedService service_;
  std::thread server_;
  std::unique_ptr<QVClient> client_;
};

INSTANTIATE_TEST_SUITE_P(Callbacks, QVClientWaitingTest, kBothCallbackThreads,
                         nameOfCallbackThread);

TEST_P(QVClientWaitingTest, EveryOperationCanBeWaitedFor) {
  connectAndServe();
  QVClientPayload payload;
  payload.set("frames", 480);
  EXPECT_TRUE(client_->createReportingSessionAndWait(7).value());
  EXPECT_TRUE(client_->setServiceTypeAndWait(QVClientServiceType::telephony, 7).value());
  EXPECT_EQ(client_->getServiceNameForReporterIDAndWait(7).value(),
            QVClientServiceType::nonlongformaudio);
  EXPECT_TRUE(client_->setConfigurationAndWait(payload, 7).value());
  EXPECT_TRUE(client_->startReportingSessionForIDAndWait(7, nullptr).value());
  EXPECT_FALSE(client_->sendMessageAndWait(payload, kPlayback, QVClientMessageType::start, 7));
  EXPECT_EQ(client_->reporterIDValidAndWait(7).value().reporterID, 7);
  EXPECT_EQ(client_->getAllReportersAndWait().value(), std::vector<int64_t>{7});
  EXPECT_TRUE(client_->stopReportingSessionForIDAndWait(7).value());
  EXPECT_TRUE(client_->destroyReportingSessionAndWait(7).value());
  EXPECT_TRUE(client_->killServiceAndWait().value());
  EXPECT_EQ(client_->createReportingSessionAndWait(7).error().code(), Code::connectionLost);
}

TEST_P(QVClientWaitingTest, AStartDoesNotWaitForTheSessionsEnd) {
  connectAndServe();
  std::atomic<int> completed{0};
  const auto count = [&completed](const QVClientResult<bool>& handled) {
    EXPECT_TRUE(handled);
    ++completed;
  };
  const auto started = client_->startReportingSessionForIDAndWait(7, count);
  EXPECT_TRUE(started);
  EXPECT_TRUE(started.value());
  EXPECT_EQ(completed, 0);
  EXPECT_TRUE(client_->stopReportingSessionForIDAndWait(7));
  // Answered before the stop was; with a poll loop the reply waits for the program.
  if (GetParam() == QVClientOptions::Callbacks::pollLoop) {
    EXPECT_EQ(completed, 0);
    dispatchWhenReadable(*client_);
  }
  EXPECT_EQ(completed, 1);
}

TEST_P(QVClientWaitingTest, AStartOfNothingSaysSo) {
  connectAndServe();
  const auto started = client_->startReportingSessionForIDAndWait(8, nullptr);
  EXPECT_TRUE(started);
  EXPECT_FALSE(started.value());
  EXPECT_FALSE(client_->startReportingSessionForIDAndWait(0, nullptr).value());
}

TEST_P(QVClientWaitingTest, ItsLimitEndsAWait) {
  connect();
  service_.letIn();
  const auto handled = client_->createReportingSessionAndWait(1, std::chrono::milliseconds(1));
  EXPECT_EQ(handled.error().code(), Code::timedOut);
  // The answer that comes after all is nobody's; the next one finds its call.
  service_.answerBoolean(service_.nextCall());
  std::thread server([this] { service_.answerBoolean(service_.nextCall(), false); });
  const auto second = client_->createReportingSessionAndWait(2);
  EXPECT_TRUE(second);
  EXPECT_FALSE(second.value());
  server.join();
}

TEST_P(QVClientWaitingTest, WaitingUntilSentSendsWhatABatchKeeps) {
  connect();
  service_.letIn();
  const QVClientBatch batch(*client_);
  EXPECT_FALSE(client_->createReportingSession(1, nullptr));
  EXPECT_TRUE(service_.callsSoFar().empty());
  EXPECT_FALSE(client_->waitUntilSent());
  EXPECT_EQ(service_.nextCall().member, "CreateReportingSession");
}

TEST_P(QVClientWaitingTest, WaitingUntilSentDoesNotWaitForTheBatchesOfOthers) {
  connect();
  service_.letIn();
  // More than a socket takes: whoever waits now waits for the service to read.
  QVClientPayload payload;
  payload.set("text", std::string(std::size_t{2} << 20, 'x'));
  EXPECT_FALSE(client_->sendMessage(payload, kPlayback, QVClientMessageType::start, 7, nullptr));
  auto sent = std::async(std::launch::async, [this] { return client_->waitUntilSent(); });
  const QVClientBatch batch(*client_);
  EXPECT_EQ(client_->createReportingSession(1, nullptr).code(), Code::queueFull);
  EXPECT_EQ(service_.nextCall().member, "SendMessage");
  // There is room once the thread that waits has noted what has left.
  QVClientError kept;
  do kept = client_->createReportingSession(2, nullptr);
  while (kept.code() == Code::queueFull);
  EXPECT_FALSE(kept);
  EXPECT_FALSE(sent.get());
}

TEST_P(QVClientWaitingTest, ALimitBeyondAllTimesIsNone) {
  connectAndServe();
  EXPECT_TRUE(client_->createReportingSessionAndWait(1, std::chrono::milliseconds::max()));
}

TEST_P(QVClientWaitingTest, TheLossEndsAllWaits) {
  connect();
  std::vector<std::thread> waiting;
  for (int i = 0; i < 4; ++i) {
    waiting.emplace_back([this] {
      EXPECT_EQ(client_->createReportingSessionAndWait(1).error().code(), Code::connectionLost);
    });
  }
  service_.letIn();
  for (int i = 0; i < 4; ++i) EXPECT_EQ(service_.nextCall().member, "CreateReportingSession");
  service_.hangUp();
  for (std::thread& thread : waiting) thread.join();
}

TEST_P(QVClientWaitingTest, ManyThreadsMayWaitAtOnce) {
  connectAndServe();
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([this] {
      for (int j = 0; j < 200; ++j) EXPECT_TRUE(client_->createReportingSessionAndWait(j));
    });
  }
  for (std::thread& thread : threads) thread.join();
}

TEST(QVClientOwnThread, RepliesMustNotWait) {
  QVScriptedService service;
  const auto client = service.connectClient();
  service.letIn();
  std::promise<std::vector<Code>> codes;
  EXPECT_FALSE(client->createReportingSession(1, [&](const auto&) {
    codes.set_value({client->createReportingSessionAndWait(2).error().code(),
                     client->sendMessageAndWait({}, kPlayback, QVClientMessageType::stop, 1).code(),
                     client->startReportingSessionForIDAndWait(2, nullptr).error().code(),
                     client->waitUntilSent().code()});
  }));
  service.answerBoolean(service.nextCall());
  EXPECT_EQ(codes.get_future().get(), std::vector<Code>(4, Code::wouldDeadlock));
  EXPECT_TRUE(service.callsSoFar().empty());
}

TEST(QVClientOwnThread, RunsRepliesWithoutHelp) {
  QVScriptedService service;
  const auto client = service.connectClient();
  service.letIn();
  EXPECT_EQ(client->fileDescriptor(), -1);
  client->dispatch();
  std::promise<std::thread::id> thread;
  EXPECT_FALSE(client->createReportingSession(
      1, [&](const auto&) { thread.set_value(std::this_thread::get_id()); }));
  service.answerBoolean(service.nextCall());
  EXPECT_NE(thread.get_future().get(), std::this_thread::get_id());
}

TEST(QVClientOwnThread, TakesNoSignals) {
  QVScriptedService service;
  const auto client = service.connectClient();
  service.letIn();
  std::promise<sigset_t> blocked;
  EXPECT_FALSE(client->createReportingSession(1, [&](const auto&) {
    sigset_t set;
    pthread_sigmask(SIG_BLOCK, nullptr, &set);
    blocked.set_value(set);
  }));
  service.answerBoolean(service.nextCall());
  const sigset_t set = blocked.get_future().get();
  EXPECT_EQ(sigismember(&set, SIGTERM), 1);
  EXPECT_EQ(sigismember(&set, SIGUSR1), 1);
  sigset_t own;
  pthread_sigmask(SIG_BLOCK, nullptr, &own);
  EXPECT_EQ(sigismember(&own, SIGTERM), 0);
}

TEST(QVClientOwnThread, ManyThreadsMaySendAtOnce) {
  constexpr int kThreads = 4;
  constexpr int kCalls = 2000;
  QVScriptedService service;
  QVClientOptions options;
  options.maximumQueuedBytes = std::size_t{8} << 20;
  auto client = service.connectClient(std::move(options));
  std::thread server([&service] {
    service.letIn();
    serve(service);
  });
  std::atomic<int> replies{0};
  std::promise<void> all;
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&] {
      QVClientPayload payload;
      for (int j = 0; j < kCalls; ++j) {
        payload.clear();
        payload.set("number", j);
        EXPECT_FALSE(client->sendMessage(payload, kPlayback, QVClientMessageType::generic, 7,
                                         [&](const QVClientError& error) {
                                           EXPECT_FALSE(error);
                                           if (++replies == kThreads * kCalls) all.set_value();
                                         }));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(all.get_future().wait_for(std::chrono::seconds(60)), std::future_status::ready);
  EXPECT_EQ(replies, kThreads * kCalls);
  client.reset();
  server.join();
}

}  // namespace
