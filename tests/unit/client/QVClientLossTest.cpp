// What becomes of a client whose service goes away, at every stage, and of one that is destroyed.

#include "platform/linux/bus/QVBusAuthClient.h"
#include "tests/unit/client/QVScriptedService.h"

#include <condition_variable>
#include <mutex>

#include <gtest/gtest.h>

namespace {

using Call = QVScriptedService::Call;
using Code = QVClientError::Code;

// Counts what replies and the loss report, from whichever thread.
class Outcomes {
 public:
  void add(const std::string& what) {
    const std::lock_guard lock(mutex_);
    all_.push_back(what);
    changed_.notify_all();
  }
  // Waits until there are so many.
  std::vector<std::string> wait(std::size_t count) {
    std::unique_lock lock(mutex_);
    EXPECT_TRUE(
        changed_.wait_for(lock, std::chrono::seconds(20), [&] { return all_.size() >= count; }));
    return all_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<std::string> all_;
};

using Strings = std::vector<std::string>;

// Everything holds for both kinds of callback threads.
class QVClientLossTest : public testing::TestWithParam<QVClientOptions::Callbacks> {
 protected:
  void connect() {
    QVClientOptions options;
    options.callbacks = GetParam();
    options.connectionLost = [this](const QVClientError& error) {
      text_ = error.text();
      outcomes_.add(error.code() == Code::connectionLost ? "lost" : "another error");
    };
    client_ = service_.connectClient(std::move(options));
  }
  QVClientError create(const std::string& name) {
    return client_->createReportingSession(1, [this, name](const QVClientResult<bool>& handled) {
      if (handled) {
        outcomes_.add(name + " answered");
      } else {
        const Code code = handled.error().code();
        outcomes_.add(name + (code == Code::connectionLost ? " lost"
                              : code == Code::closed       ? " closed"
                                                           : " failed"));
      }
    });
  }
  // Lets the client work until there are so many outcomes, and answers them.
  Strings outcomes(std::size_t count) {
    if (GetParam() == QVClientOptions::Callbacks::pollLoop) {
      while (outcomes_.wait(0).size() < count && !HasFailure()) dispatchWhenReadable(*client_);
      client_->dispatch();
    }
    return outcomes_.wait(count);
  }

  Outcomes outcomes_;
  std::string text_;
  QVScriptedService service_;
  std::unique_ptr<QVClient> client_;
};

INSTANTIATE_TEST_SUITE_P(Callbacks, QVClientLossTest, kBothCallbackThreads, nameOfCallbackThread);

TEST_P(QVClientLossTest, BeforeItWasLetIn) {
  connect();
  EXPECT_FALSE(create("a"));
  service_.read();
  service_.hangUp();
  EXPECT_EQ(outcomes(2), (Strings{"a lost", "lost"}));
}

TEST_P(QVClientLossTest, WhenItIsNotLetIn) {
  connect();
  EXPECT_FALSE(create("a"));
  service_.read();
  service_.send("REJECTED EXTERNAL\r\n");
  EXPECT_EQ(outcomes(2), (Strings{"a lost", "lost"}));
  EXPECT_EQ(text_, "the service did not let us in");
}

TEST_P(QVClientLossTest, AfterItWasLetIn) {
  connect();
  service_.letIn();
  service_.hangUp();
  EXPECT_EQ(outcomes(1), Strings{"lost"});
  EXPECT_EQ(create("late").code(), Code::connectionLost);
  EXPECT_EQ(client_->createReportingSession(1, nullptr).code(), Code::connectionLost);
  EXPECT_EQ(client_->createReportingSessionAndWait(1).error().code(), Code::connectionLost);
  EXPECT_EQ(client_->waitUntilSent().code(), Code::connectionLost);
}

TEST_P(QVClientLossTest, WithCallsUnderWayEachFailsOnceInOrder) {
  connect();
  service_.letIn();
  for (const char* name : {"a", "b", "c"}) EXPECT_FALSE(create(name));
  service_.nextCall();
  service_.answerBoolean(service_.nextCall());
  service_.hangUp();
  EXPECT_EQ(outcomes(4), (Strings{"b answered", "a lost", "c lost", "lost"}));
}

TEST_P(QVClientLossTest, InTheMiddleOfAnAnswer) {
  connect();
  service_.letIn();
  EXPECT_FALSE(create("a"));
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.beginMessage({.type = QVBusMessageType::methodReturn,
                       .serial = 1,
                       .replySerial = service_.nextCall().serial,
                       .signature = "b"});
  writer.writeBoolean(true);
  writer.endMessage();
  service_.send(std::string_view(bytes).substr(0, bytes.size() - 1));
  service_.hangUp();
  EXPECT_EQ(outcomes(2), (Strings{"a lost", "lost"}));
}

TEST_P(QVClientLossTest, ByBytesThatAreNoMessage) {
  connect();
  service_.letIn();
  EXPECT_FALSE(create("a"));
  service_.nextCall();
  service_.send(std::string(16, '?'));
  EXPECT_EQ(outcomes(2), (Strings{"a lost", "lost"}));
  EXPECT_EQ(text_, "the service sent what is no message: neither byte order is named");
  EXPECT_EQ(create("late").code(), Code::connectionLost);
  EXPECT_TRUE(service_.read().empty()) << "the client has not hung up";
}

TEST_P(QVClientLossTest, ByAHeaderThatIsNone) {
  connect();
  service_.letIn();
  EXPECT_FALSE(create("a"));
  service_.nextCall();
  // A method return that does not say what it answers.
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.beginMessage({.type = QVBusMessageType::methodReturn, .serial = 1});
  writer.endMessage();
  service_.send(bytes);
  EXPECT_EQ(outcomes(2), (Strings{"a lost", "lost"}));
}

TEST_P(QVClientLossTest, SendingIntoTheVoidRaisesNoSignal) {
  connect();
  service_.letIn();
  service_.hangUp();
  // Taken in or not, depending on who notices first; never a signal, never a hang.
  const QVClientError error = create("a");
  const Strings expected = error ? Strings{"lost"} : Strings{"a lost", "lost"};
  EXPECT_EQ(outcomes(expected.size()), expected);
}

TEST_P(QVClientLossTest, ADestroyedClientFailsItsCallsAndReportsNoLoss) {
  connect();
  service_.letIn();
  EXPECT_FALSE(create("a"));
  EXPECT_FALSE(create("b"));
  client_.reset();
  EXPECT_EQ(outcomes_.wait(2), (Strings{"a closed", "b closed"}));
  EXPECT_EQ(service_.nextCall().member, "CreateReportingSession");
  EXPECT_EQ(service_.nextCall().member, "CreateReportingSession");
  EXPECT_EQ(service_.nextCall().member, "") << "the client has not hung up";
}

TEST_P(QVClientLossTest, AReplyMayDestroyItsClient) {
  connect();
  service_.letIn();
  EXPECT_FALSE(client_->getAllReporters([this](const auto&) {
    client_.reset();
    outcomes_.add("destroyed");
  }));
  EXPECT_FALSE(create("a"));
  const Call first = service_.nextCall();
  service_.answerBoolean(service_.nextCall(), true);
  service_.answer(first, "ax", [](QVBusWriter& writer) { writer.endArray(writer.beginArray(8)); });
  if (GetParam() == QVClientOptions::Callbacks::pollLoop) {
    while (client_ && !HasFailure()) dispatchWhenReadable(*client_);
  }
  EXPECT_EQ(outcomes_.wait(2), (Strings{"a answered", "destroyed"}));
  EXPECT_EQ(service_.nextCall().member, "") << "the client has not hung up";
}

TEST_P(QVClientLossTest, WhatFollowsAReplyThatDestroysItsClientIsClosed) {
  connect();
  service_.letIn();
  EXPECT_FALSE(client_->getAllReporters([this](const auto&) { client_.reset(); }));
  EXPECT_FALSE(create("a"));
  service_.answer(service_.nextCall(), "ax",
                  [](QVBusWriter& writer) { writer.endArray(writer.beginArray(8)); });
  if (GetParam() == QVClientOptions::Callbacks::pollLoop) {
    while (client_ && !HasFailure()) dispatchWhenReadable(*client_);
  }
  EXPECT_EQ(outcomes_.wait(1), Strings{"a closed"});
}

TEST_P(QVClientLossTest, TheLossMayDestroyTheClient) {
  QVClientOptions options;
  options.callbacks = GetParam();
  options.connectionLost = [this](const QVClientError&) {
    client_.reset();
    outcomes_.add("lost");
  };
  client_ = service_.connectClient(std::move(options));
  service_.letIn();
  service_.hangUp();
  if (GetParam() == QVClientOptions::Callbacks::pollLoop) {
    while (client_ && !HasFailure()) dispatchWhenReadable(*client_);
  }
  EXPECT_EQ(outcomes_.wait(1), Strings{"lost"});
}

}  // namespace
