#include "tests/unit/store/QVStoreFixture.h"

#include <future>
#include <utility>

namespace {

// No test takes so long.
constexpr std::chrono::hours kNever{24};
// Only a test that has failed waits for so long.
constexpr std::chrono::seconds kDeadline{60};

template <class Value>
Value await(std::future<Value> future) {
  if (future.wait_for(kDeadline) != std::future_status::ready) {
    ADD_FAILURE() << "the store does not answer";
    std::abort();
  }
  return future.get();
}

}  // namespace

QVStoreFixture::QVStoreFixture() {
  options_.path = path();
  options_.commitInterval = kNever;
  options_.retryInterval = kNever;
}

QVStoreFixture::~QVStoreFixture() {
  close();
}

std::shared_ptr<QVSQLiteEventStore> QVStoreFixture::shared() {
  if (store_ == nullptr) {
    store_ = std::make_shared<QVSQLiteEventStore>(log_, clock_, preferences_, options_);
  }
  return store_;
}

QVSQLiteEventStore& QVStoreFixture::store() {
  return *shared();
}

void QVStoreFixture::restart() {
  close();
  store_.reset();
}

void QVStoreFixture::close() {
  if (store_ != nullptr) store_->close();
}

std::shared_ptr<QVBeaconSession> QVStoreFixture::openSession(const SessionOptions& session) {
  return beacon().initWithSessionInfo(
      {{kBeaconSessionInfoClientType, 19},
       {kBeaconSessionInfoClientVersion, 2.0},
       {kBeaconSessionInfoSessionID, session.sessionID},
       {kBeaconSessionInfoBatchEvent, !session.realtime},
       {kBeaconSessionInfoHierarchyToken, QVText("token of ", session.sessionID)},
       {kBeaconSessionInfoContainsRealtimeEvents, session.realtime}},
      session.userInfo, {});
}

void QVStoreFixture::send(QVBeaconSession& session, const QVDictionary& payload, uint16_t category,
                          uint16_t type) {
  std::optional<QVError> error;
  EXPECT_TRUE(session.sendMessageWithCategory(category, type, payload, error));
  EXPECT_EQ(error, std::nullopt);
}

void QVStoreFixture::sendSingle(const QVDictionary& payload) {
  std::optional<QVError> error;
  EXPECT_TRUE(beacon().sendOneMessageWithSessionInfo(
      {{kBeaconSessionInfoClientType, 19}, {kBeaconSessionInfoSessionID, -1}},
      {{kBeaconUserInfoClientName, "net.quillon.quietvox"},
       {kBeaconUserInfoServiceName, "standalone"}},
      5, 2, payload, error));
  EXPECT_EQ(error, std::nullopt);
}

void QVStoreFixture::sendCountwise(const std::string& name, const QVDictionary& payload) {
  QVStoreCountwise(shared()).sendEventLazily(name, [payload] { return payload; });
}

void QVStoreFixture::logJoulewell(const QVDictionary& event) {
  QVStoreJoulewell(shared()).logEvent(28, "Vidra_Haptics", event, {});
}

std::optional<QVArray> QVStoreFixture::findBackends() {
  std::promise<std::optional<QVArray>> answer;
  store().findBackends([&answer](std::optional<QVArray> list) { answer.set_value(list); });
  return await(answer.get_future());
}

std::optional<QVError> QVStoreFixture::flush(QVBeaconSession& session) {
  std::promise<std::optional<QVError>> answer;
  session.flushMessagesWithCompletion(
      [&answer](std::optional<QVError> error) { answer.set_value(std::move(error)); });
  return await(answer.get_future());
}

void QVStoreFixture::flushAll() {
  std::promise<std::optional<QVError>> answer;
  store().flush(std::make_shared<QVEventSession>(),
                [&answer](std::optional<QVError> error) { answer.set_value(std::move(error)); });
  EXPECT_EQ(await(answer.get_future()), std::nullopt);
}

void QVStoreFixture::awaitWriter() {
  // What was due is taken with the first search at the latest, and done before the second.
  findBackends();
  findBackends();
}

std::vector<std::string> QVStoreFixture::rows(const std::string& query) const {
  return QVStoreReader(path()).rows(query);
}

int64_t QVStoreFixture::count(const std::string& table) const {
  return QVStoreReader(path()).count(table);
}

int64_t QVStoreFixture::number(const std::string& query) const {
  return QVStoreReader(path()).number(query);
}

int64_t QVStoreFixture::expectNewest(int64_t ofEach) const {
  const int64_t messages = count("beacon_message");
  const int64_t events = count("countwise_event");
  EXPECT_GT(messages, 25);
  EXPECT_LT(messages, ofEach / 2);
  EXPECT_LE(events - messages, 1);
  EXPECT_LE(messages - events, 1);
  for (const std::string table : {"beacon_message", "countwise_event"}) {
    EXPECT_EQ(number("SELECT max(json_extract(payload, '$.n')) FROM " + table), ofEach - 1);
    EXPECT_EQ(number("SELECT min(json_extract(payload, '$.n')) FROM " + table),
              ofEach - count(table))
        << "others than the oldest were given up";
  }
  return 2 * ofEach - messages - events;
}

std::vector<std::string> QVStoreFixture::losses() const {
  return rows("SELECT cause, sum(count) FROM loss GROUP BY cause ORDER BY cause");
}

std::vector<std::string> QVStoreFixture::lines(QVLogLevel level) const {
  std::vector<std::string> texts;
  for (const QVFakeLog::Line& line : log_.lines()) {
    if (line.level == level) texts.push_back(line.text);
  }
  return texts;
}
