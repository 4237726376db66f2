// The C interface: errors, sizes of structs, handles that are none, and the way through to the
// service. That it is C at all is what quietvox_c99.c is compiled for.

#include "client/QVClientPayload.h"
#include "client/quietvox.h"
#include "client/quietvox_handles.h"
#include "tests/unit/client/QVReporterFixture.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstring>
#include <future>
#include <set>
#include <string>
#include <thread>

#include <gmock/gmock.h>

extern "C" {
// Of quietvox_c99.c: answers the first error, and 0 where there is none.
int quietvox_c99_report(QuietVoxReporter* reporter, QuietVoxRealtimeQueue** queue,
                        QuietVoxSession** session);
int quietvox_c99_fill(QuietVoxPayload* payload);
}

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::UnorderedElementsAre;

constexpr uint32_t kCategory = QUIETVOX_COMPONENT_SESSION + QUIETVOX_KIND_PLAYBACK;

class QVClientCInterfaceTest : public QVReporterFixture {
 protected:
  ~QVClientCInterfaceTest() override { quietvox_reporter_close(handle_); }

  void openReporter() {
    const std::string socket = root_.socket();
    const std::string configuration = root_.configuration();
    const std::string runtime = root_.runtime();
    QuietVoxReporterOptions given{};
    given.size = sizeof given;
    given.socketPath = socket.c_str();
    given.configurationDirectory = configuration.c_str();
    given.runtimeDirectory = runtime.c_str();
    given.flags = QUIETVOX_END_AT_ONCE;
    given.shortestReconnectDelay = 1;
    given.longestReconnectDelay = 8;
    given.realtimePeriod = 1;
    given.dropReportInterval = 1;
    given.dropped = [](void* context, const QuietVoxCounters* dropped) {
      const auto told = static_cast<std::promise<QuietVoxCounters>*>(context);
      told->set_value(*dropped);
    };
    given.context = &drops_;
    ASSERT_EQ(quietvox_reporter_open(&given, &handle_), QUIETVOX_OK);
    ASSERT_NE(handle_, nullptr);
  }
  QuietVoxCounters counters() {
    QuietVoxCounters counters{};
    counters.size = sizeof counters;
    EXPECT_EQ(quietvox_reporter_counters(handle_, &counters), QUIETVOX_OK);
    return counters;
  }

  std::promise<QuietVoxCounters> drops_;
  QuietVoxReporter* handle_ = nullptr;
};

TEST_F(QVClientCInterfaceTest, ReportsFromPlainC) {
  openReporter();
  QuietVoxSession* session = nullptr;
  QuietVoxRealtimeQueue* queue = nullptr;
  EXPECT_EQ(quietvox_c99_report(handle_, &queue, &session), QUIETVOX_OK);
  const auto service = accept();
  EXPECT_THAT(serve(*service, 5),
              ElementsAre("create 7", "type 7 2", "configure 7 48000", "start 7", "valid 7"));
  // The queues take turns.
  EXPECT_THAT(serve(*service, 3), UnorderedElementsAre("send 7 480", "send * 481", "send 7 482"));
  EXPECT_EQ(quietvox_session_set_service_type(session, QUIETVOX_SERVICE_ALARMS), QUIETVOX_OK);
  EXPECT_EQ(quietvox_session_stop(session), QUIETVOX_OK);
  quietvox_realtime_close(queue);
  quietvox_session_destroy(session);
  EXPECT_THAT(serve(*service, 3), ElementsAre("type 7 4", "stop 7", "destroy 7"));
  EXPECT_EQ(quietvox_reporter_flush(handle_, 20'000), QUIETVOX_OK);
  EXPECT_EQ(counters().sent, 3U);
  EXPECT_EQ(counters().connections, 1U);
  EXPECT_EQ(counters().queuedMessages, 0U);
}

TEST_F(QVClientCInterfaceTest, WritesWhatTheOtherInterfaceWrites) {
  QVClientPayload expected;
  expected.set("int", int64_t{-1}).set("uint", UINT64_MAX).set("double", 0.5).set("bool", true);
  expected.set("string", "speaker").set("text", std::string_view("pcm"));
  const std::array<int64_t, 2> ints{1, 2};
  const std::array<double, 2> doubles{0.5, -60};
  expected.set("ints", std::span<const int64_t>(ints));
  expected.set("doubles", std::span<const double>(doubles));
  expected.beginDictionary("device").set("name", "pcm0").endDictionary();
  expected.beginArray("items").add(int64_t{1}).beginArray().endArray();
  expected.beginDictionary().endDictionary().endArray();
  QuietVoxPayload* payload = quietvox_payload_new();
  EXPECT_EQ(quietvox_c99_fill(payload), QUIETVOX_OK);
  EXPECT_EQ(QVFromHandle(payload)->entries(), expected.entries());
  EXPECT_EQ(quietvox_payload_clear(payload), QUIETVOX_OK);
  EXPECT_TRUE(QVFromHandle(payload)->entries().empty());
  quietvox_payload_free(payload);
}

TEST_F(QVClientCInterfaceTest, ErrorsOfPayloadsStick) {
  openReporter();
  QuietVoxPayload* payload = quietvox_payload_new();
  EXPECT_EQ(quietvox_payload_begin_array(payload, "a"), QUIETVOX_OK);
  EXPECT_EQ(quietvox_payload_error(payload), QUIETVOX_ERROR_INVALID_PAYLOAD);
  EXPECT_EQ(quietvox_payload_set_int(payload, "key", 1), QUIETVOX_ERROR_INVALID_PAYLOAD);
  EXPECT_EQ(quietvox_payload_end_array(payload), QUIETVOX_ERROR_INVALID_PAYLOAD);
  EXPECT_EQ(quietvox_reporter_send_to_every_session(handle_, payload, kCategory, 0),
            QUIETVOX_ERROR_INVALID_PAYLOAD);
  const QuietVoxCounters told = drops_.get_future().get();
  EXPECT_EQ(told.size, sizeof told);
  EXPECT_EQ(told.droppedInvalid, 1U);
  EXPECT_EQ(told.sent, 0U);
  quietvox_payload_free(payload);
}

TEST_F(QVClientCInterfaceTest, SaysInWordsWhatAnErrorIs) {
  std::set<std::string> texts;
  for (int error = QUIETVOX_OK; error >= QUIETVOX_ERROR_INVALID_ARGUMENT; --error) {
    EXPECT_TRUE(texts.insert(quietvox_error_text(error)).second) << error;
  }
  EXPECT_STREQ(quietvox_error_text(QUIETVOX_OK), "no error");
  EXPECT_STREQ(quietvox_error_text(1), "unknown error");
  EXPECT_STREQ(quietvox_error_text(QUIETVOX_ERROR_INVALID_ARGUMENT - 1), "unknown error");
  EXPECT_STREQ(quietvox_error_text(INT32_MIN), "unknown error");
  EXPECT_FALSE(texts.contains("unknown error"));
}

TEST_F(QVClientCInterfaceTest, HandlesThatAreNoneAreAnswered) {
  constexpr int kInvalid = QUIETVOX_ERROR_INVALID_ARGUMENT;
  QuietVoxCounters counters{};
  EXPECT_EQ(quietvox_reporter_open(nullptr, nullptr), kInvalid);
  EXPECT_EQ(quietvox_reporter_flush(nullptr, 0), kInvalid);
  EXPECT_EQ(quietvox_reporter_counters(nullptr, &counters), kInvalid);
  EXPECT_EQ(quietvox_reporter_connection_error(nullptr, nullptr, 0), kInvalid);
  EXPECT_EQ(quietvox_reporter_is_reporting_enabled(nullptr), kInvalid);
  EXPECT_EQ(quietvox_reporter_send_to_every_session(nullptr, nullptr, 0, 0), kInvalid);
  QuietVoxSession* session = nullptr;
  EXPECT_EQ(quietvox_session_open(nullptr, 0, 0, &session), kInvalid);
  EXPECT_EQ(quietvox_session_reporter_id(nullptr), 0);
  EXPECT_EQ(quietvox_session_set_service_type(nullptr, 0), kInvalid);
  EXPECT_EQ(quietvox_session_configure(nullptr, nullptr), kInvalid);
  EXPECT_EQ(quietvox_session_start(nullptr), kInvalid);
  EXPECT_EQ(quietvox_session_send(nullptr, nullptr, 0, 0), kInvalid);
  EXPECT_EQ(quietvox_session_stop(nullptr), kInvalid);
  QuietVoxRealtimeQueue* queue = nullptr;
  EXPECT_EQ(quietvox_realtime_open(nullptr, 1, 64, &queue), kInvalid);
  EXPECT_EQ(quietvox_realtime_begin(nullptr), nullptr);
  EXPECT_EQ(quietvox_realtime_commit(nullptr, 0, 0), kInvalid);
  EXPECT_EQ(quietvox_payload_clear(nullptr), kInvalid);
  EXPECT_EQ(quietvox_payload_error(nullptr), kInvalid);
  EXPECT_EQ(quietvox_payload_set_int(nullptr, "a", 1), kInvalid);
  EXPECT_EQ(quietvox_payload_begin_array(nullptr, "a"), kInvalid);
  EXPECT_EQ(quietvox_payload_end_array(nullptr), kInvalid);
  EXPECT_EQ(quietvox_payload_begin_dictionary(nullptr, "a"), kInvalid);
  EXPECT_EQ(quietvox_payload_end_dictionary(nullptr), kInvalid);
  quietvox_payload_free(nullptr);
  quietvox_realtime_close(nullptr);
  quietvox_session_destroy(nullptr);
  quietvox_reporter_close(nullptr);
  QuietVoxPayload* payload = quietvox_payload_new();
  EXPECT_EQ(quietvox_payload_set_string(payload, "a", nullptr), kInvalid);
  EXPECT_EQ(quietvox_payload_set_text(payload, "a", nullptr, 1), kInvalid);
  EXPECT_EQ(quietvox_payload_set_ints(payload, "a", nullptr, 1), kInvalid);
  EXPECT_EQ(quietvox_payload_set_doubles(payload, "a", nullptr, 1), kInvalid);
  EXPECT_EQ(quietvox_payload_error(payload), QUIETVOX_OK);
  quietvox_payload_free(payload);
}

TEST_F(QVClientCInterfaceTest, StructsMayBeLonger) {
  openReporter();
  struct LongerCounters {
    QuietVoxCounters counters;
    uint64_t more;
  };
  LongerCounters counters{};
  counters.counters.size = sizeof counters;
  counters.more = 4711;
  EXPECT_EQ(quietvox_reporter_counters(handle_, &counters.counters), QUIETVOX_OK);
  EXPECT_EQ(counters.counters.size, sizeof counters);
  EXPECT_EQ(counters.more, 4711U);

  struct LongerOptions {
    QuietVoxReporterOptions options;
    std::array<char, 64> more;
  };
  LongerOptions options{};
  options.options.size = sizeof options;
  options.more.fill('x');
  QuietVoxReporter* reporter = nullptr;
  EXPECT_EQ(quietvox_reporter_open(&options.options, &reporter), QUIETVOX_OK);
  quietvox_reporter_close(reporter);
}

TEST_F(QVClientCInterfaceTest, StructsMustHaveASize) {
  openReporter();
  QuietVoxReporter* reporter = nullptr;
  for (const std::size_t size :
       {std::size_t{0}, std::size_t{1}, offsetof(QuietVoxReporterOptions, socketPath) + 1,
        offsetof(QuietVoxReporterOptions, context)}) {
    QuietVoxReporterOptions options{};
    options.size = size;
    EXPECT_EQ(quietvox_reporter_open(&options, &reporter), QUIETVOX_ERROR_INVALID_ARGUMENT) << size;
    EXPECT_EQ(reporter, nullptr);
  }
  for (const std::size_t size :
       {std::size_t{0}, std::size_t{1}, offsetof(QuietVoxCounters, queuedBytes)}) {
    QuietVoxCounters counters{};
    counters.size = size;
    counters.connections = 4711;
    EXPECT_EQ(quietvox_reporter_counters(handle_, &counters), QUIETVOX_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(counters.connections, 4711U);
  }
}

TEST_F(QVClientCInterfaceTest, RefusesOptionsThatThereAreNot) {
  QuietVoxReporter* reporter = nullptr;
  QuietVoxReporterOptions options{};
  options.size = sizeof options;
  options.flags = 4;
  EXPECT_EQ(quietvox_reporter_open(&options, &reporter), QUIETVOX_ERROR_INVALID_ARGUMENT);
  options.flags = 0;
  options.maximumQueuedBytes = (uint64_t{1} << 32) + 1;
  EXPECT_EQ(quietvox_reporter_open(&options, &reporter), QUIETVOX_ERROR_INVALID_ARGUMENT);
  options.maximumQueuedBytes = 0;
  options.maximumQueuedMessages = (uint64_t{1} << 32) + 1;
  EXPECT_EQ(quietvox_reporter_open(&options, &reporter), QUIETVOX_ERROR_INVALID_ARGUMENT);
  EXPECT_EQ(reporter, nullptr);
}

TEST_F(QVClientCInterfaceTest, SaysWhatKeepsItFromTheService) {
  openReporter();
  std::array<char, 256> text{'x'};
  const auto error = [this, &text](std::size_t bytes) {
    return quietvox_reporter_connection_error(handle_, text.data(), bytes);
  };
  EXPECT_EQ(error(text.size()), QUIETVOX_OK);
  EXPECT_STREQ(text.data(), "");
  stopListening();
  QuietVoxSession* session = nullptr;
  ASSERT_EQ(quietvox_session_open(handle_, 7, 0, &session), QUIETVOX_OK);
  const auto limit = std::chrono::steady_clock::now() + kPatience;
  while (error(text.size()) == QUIETVOX_OK && std::chrono::steady_clock::now() < limit) {
    std::this_thread::yield();
  }
  EXPECT_EQ(error(text.size()), QUIETVOX_ERROR_CANNOT_CONNECT);
  EXPECT_THAT(text.data(), HasSubstr(root_.socket().string()));
  // Cut, and ended all the same.
  EXPECT_EQ(error(3), QUIETVOX_ERROR_CANNOT_CONNECT);
  EXPECT_EQ(std::strlen(text.data()), 2U);
  EXPECT_EQ(quietvox_reporter_connection_error(handle_, nullptr, 0), QUIETVOX_ERROR_CANNOT_CONNECT);
  quietvox_session_destroy(session);
}

TEST_F(QVClientCInterfaceTest, AnswersErrorsOfTheLibrary) {
  QuietVoxReporterOptions given{};
  given.size = sizeof given;
  given.shortestReconnectDelay = 1'000;
  given.longestReconnectDelay = 1;
  QuietVoxReporter* none = nullptr;
  EXPECT_EQ(quietvox_reporter_open(&given, &none), QUIETVOX_ERROR_INVALID_ARGUMENT);
  EXPECT_EQ(none, nullptr);

  openReporter();
  QuietVoxSession* session = nullptr;
  QuietVoxSession* same = nullptr;
  ASSERT_EQ(quietvox_session_open(handle_, 7, 0, &session), QUIETVOX_OK);
  EXPECT_EQ(quietvox_session_reporter_id(session), 7);
  EXPECT_EQ(quietvox_session_open(handle_, 7, 0, &same), QUIETVOX_ERROR_REPORTER_ID_TAKEN);
  EXPECT_EQ(same, nullptr);
  QuietVoxRealtimeQueue* queue = nullptr;
  EXPECT_EQ(quietvox_realtime_open(session, 0, 64, &queue), QUIETVOX_ERROR_INVALID_ARGUMENT);
  ASSERT_EQ(quietvox_realtime_open(session, 1, 64, &queue), QUIETVOX_OK);
  EXPECT_EQ(quietvox_realtime_commit(queue, kCategory, 0), QUIETVOX_ERROR_INVALID_PAYLOAD);
  EXPECT_EQ(quietvox_reporter_is_reporting_enabled(handle_), 1);
  quietvox_reporter_close(handle_);
  handle_ = nullptr;
  EXPECT_EQ(quietvox_session_start(session), QUIETVOX_ERROR_CLOSED);
  EXPECT_EQ(quietvox_realtime_begin(queue), nullptr);
  EXPECT_EQ(quietvox_realtime_commit(queue, kCategory, 0), QUIETVOX_ERROR_CLOSED);
  quietvox_realtime_close(queue);
  quietvox_session_destroy(session);
}

TEST_F(QVClientCInterfaceTest, KnowsWhenReportingIsOff) {
  switchReporting(false);
  openReporter();
  EXPECT_EQ(quietvox_reporter_is_reporting_enabled(handle_), 0);
  QuietVoxSession* session = nullptr;
  ASSERT_EQ(quietvox_session_open(handle_, 0, 0, &session), QUIETVOX_OK);
  QuietVoxPayload* payload = quietvox_payload_new();
  EXPECT_EQ(quietvox_session_send(session, payload, kCategory, 0), QUIETVOX_ERROR_DISABLED);
  EXPECT_EQ(counters().droppedDisabled, 1U);
  quietvox_payload_free(payload);
  quietvox_session_destroy(session);
}

}  // namespace
