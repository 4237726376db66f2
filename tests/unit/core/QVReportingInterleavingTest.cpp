// Several clients at once, in orders that no honest program would choose: a model that knows the
// rules predicts every reply and counts what has to reach the event services, the core runs with
// its queues driven in random bursts, and both have to agree. The seeds are fixed, so every run is
// the same.

#include "QVServices/Statistics/Service/QVReportingServer.h"
#include "tests/support/QVServiceFixture.h"

#include <algorithm>
#include <chrono>
#include <map>
#include <random>
#include <utility>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using Kind = QVFakeBeaconEvent::Kind;

// What the rules make of the same calls, one at a time in the order in which they were made.
class Model {
 public:
  struct Session {
    uint16_t serviceType = 65535;
    bool started = false;
    int recorded = 0;
    std::string waitingStart;
  };
  struct Client {
    int32_t pid = 0;
    bool listed = true;
    std::map<int64_t, Session> sessions;
  };

  std::size_t connect(int32_t pid) {
    clients_.push_back({.pid = pid, .listed = true, .sessions = {}});
    return clients_.size() - 1;
  }

  void create(std::size_t client, int64_t id) {
    clients_[client].sessions[id] = {};
    reply(client, QVText("create ", id, ": YES"));
  }
  void setServiceType(std::size_t client, uint16_t type, int64_t id) {
    Session* session = own(client, id);
    if (id != 0 && session != nullptr) session->serviceType = type;
    reply(client, QVText("setServiceType ", id, ": YES"));
  }
  void getServiceType(std::size_t client, int64_t id) {
    if (id == 0) reply(client, QVText("getServiceType ", id, ": 65535"));
    const Session* session = any(client, id);
    reply(client, QVText("getServiceType ", id, ": ",
                         session == nullptr ? uint16_t{65535} : session->serviceType));
  }
  void start(std::size_t client, int64_t id) {
    Session* session = id == 0 ? nullptr : any(client, id);
    const std::string answer = QVText("start ", id, ": YES");
    if (session == nullptr || session->started) {
      reply(client, answer);
      return;
    }
    session->started = true;
    session->recorded = 0;
    ++frameworkSessions;
    answerWaitingStart(*session);
    session->waitingStart = QVText("reply ", clients_[client].pid, ' ', answer);
  }
  void stop(std::size_t client, int64_t id) {
    if (id != 0) {
      if (Session* session = own(client, id)) {
        stop(*session);
        answerWaitingStart(*session);
      }
    }
    reply(client, QVText("stop ", id, ": YES"));
  }
  void destroy(std::size_t client, int64_t id) {
    Session* session = id == 0 ? nullptr : own(client, id);
    if (session != nullptr) {
      stop(*session);
      clients_[client].sessions.erase(id);
    }
    reply(client, QVText("destroy ", id, ": YES"));
  }
  void validate(std::size_t client, int64_t id) {
    const Session* session = any(client, id);
    const QVDictionary answer{
        {"reporterID", session == nullptr ? int64_t{0} : id},
        {"serviceType", session == nullptr ? uint16_t{65535} : session->serviceType}};
    reply(client, QVText("validate ", id, ": ", answer));
  }
  void listReporters(std::size_t client) {
    std::string text = "reporters:";
    for (const Client& each : clients_) {
      if (!each.listed) continue;
      for (const auto& [id, session] : each.sessions) text += QVText(' ', id);
    }
    reply(client, text);
  }
  void send(std::size_t client, const std::vector<int64_t>& ids) {
    if (refuses(client)) return;
    for (const int64_t id : ids) {
      Session* session = id == 0 ? nullptr : any(client, id);
      if (session != nullptr) deliver(*session);
    }
    reply(client, "send: nil");
  }
  void sendToAll(std::size_t client) {
    if (refuses(client)) return;
    bool reached = false;
    for (Client& each : clients_) {
      if (!each.listed) continue;
      for (auto& [id, session] : each.sessions) {
        if (!session.started) continue;
        deliver(session);
        reached = true;
      }
    }
    if (!reached) ++singles;
    reply(client, "send: nil");
  }
  // The connection broke; `gone`: nobody holds the client any more.
  void connectionError(std::size_t client, bool gone) {
    Client& broken = clients_[client];
    if (broken.listed) {
      for (auto& [id, session] : broken.sessions) stop(session);
    }
    broken.listed = false;
    if (gone) broken.sessions.clear();
  }

  bool enabled = true;
  std::vector<std::string> replies;
  std::size_t frameworkSessions = 0;
  std::size_t messages = 0;  // into framework sessions, summaries included
  std::size_t singles = 0;
  std::size_t flushes = 0;
  std::size_t events = 0;  // of the analytics service, without those about clients

 private:
  void reply(std::size_t client, const std::string& text) {
    replies.push_back(QVText("reply ", clients_[client].pid, ' ', text));
  }
  bool refuses(std::size_t client) {
    if (!enabled) reply(client, "send: net.quillon.audio.reporting 1 {}");
    return !enabled;
  }
  void answerWaitingStart(Session& session) {
    if (!session.waitingStart.empty()) replies.push_back(std::exchange(session.waitingStart, {}));
  }
  void deliver(Session& session) {
    ++events;
    ++(session.started ? messages : singles);
    ++session.recorded;
  }
  void stop(Session& session) {
    if (!session.started) return;
    if (session.recorded > 0) ++messages;
    ++flushes;
    session.started = false;
  }
  Session* own(std::size_t client, int64_t id) {
    const auto found = clients_[client].sessions.find(id);
    return found == clients_[client].sessions.end() ? nullptr : &found->second;
  }
  Session* any(std::size_t client, int64_t id) {
    if (Session* session = own(client, id)) return session;
    if (id == 0 || !enabled) return nullptr;
    for (Client& each : clients_) {
      if (!each.listed) continue;
      const auto found = each.sessions.find(id);
      if (found != each.sessions.end()) return &found->second;
    }
    return nullptr;
  }

  std::vector<Client> clients_;
};

class QVReportingInterleavingTest : public QVServiceFixture,
                                    public testing::WithParamInterface<uint32_t> {
 protected:
  static constexpr int kSteps = 2000;
  static constexpr std::size_t kMostClients = 4;

  struct Connected {
    QVTestClient* client;
    std::size_t inModel;
    std::weak_ptr<QVReportingServerInstance> instance;
  };

  uint32_t draw(uint32_t bound) { return static_cast<uint32_t>(random_()) % bound; }
  int64_t drawID() { return int64_t{draw(6)} - 1; }

  void connect() {
    const auto pid = static_cast<int32_t>(100 + nextPid_++);
    QVTestClient& client = connectClient(pid);
    connected_.push_back({&client, model_.connect(pid), client.instance()});
    instances_.push_back(client.instance());
  }
  void disconnect(std::size_t index) {
    connected_[index].client->disconnect();
    model_.connectionError(connected_[index].inModel, true);
    connected_.erase(connected_.begin() + static_cast<std::ptrdiff_t>(index));
  }
  void setReportingEnabled(bool enabled) {
    // In its place among the operations: the preference changes right before it is read.
    QVReportingServer::queue().async([this, enabled] {
      platform_.preferences().setValue(kPreferencesDomain, "disable_reporting", !enabled);
    });
    postDefaultsNotification();
    model_.enabled = enabled;
  }

  void callSomething() {
    const Connected& caller = connected_[draw(static_cast<uint32_t>(connected_.size()))];
    QVTestClient& client = *caller.client;
    const std::size_t inModel = caller.inModel;
    const int64_t id = drawID();
    // Service types whose messages are neither delayed nor dropped.
    constexpr std::array<uint16_t, 4> kServiceTypes{1, 3, 12, 13};
    switch (draw(13)) {
      case 0:
      case 1:
        client.create(id);
        model_.create(inModel, id);
        break;
      case 2: {
        const uint16_t type = kServiceTypes[draw(kServiceTypes.size())];
        client.setServiceType(type, id);
        model_.setServiceType(inModel, type, id);
        break;
      }
      case 3:
        client.getServiceType(id);
        model_.getServiceType(inModel, id);
        break;
      case 4:
      case 5:
        client.start(id);
        model_.start(inModel, id);
        break;
      case 6:
        client.stop(id);
        model_.stop(inModel, id);
        break;
      case 7:
        client.destroy(id);
        model_.destroy(inModel, id);
        break;
      case 8:
        client.validate(id);
        model_.validate(inModel, id);
        break;
      case 9:
        client.listReporters();
        model_.listReporters(inModel);
        break;
      case 10:
        client.sendToAll({{"n", ++messageNumber_}});
        model_.sendToAll(inModel);
        break;
      default: {
        std::vector<int64_t> ids;
        for (uint32_t count = draw(4); count > 0; --count) ids.push_back(drawID());
        client.send({{"n", ++messageNumber_}}, ids);
        model_.send(inModel, ids);
      }
    }
  }

  void doSomething() {
    const uint32_t choice = draw(1000);
    if (connected_.empty() || (choice < 20 && connected_.size() < kMostClients)) {
      connect();
    } else if (choice < 30) {
      disconnect(draw(static_cast<uint32_t>(connected_.size())));
    } else if (choice < 35) {
      const Connected& broken = connected_[draw(static_cast<uint32_t>(connected_.size()))];
      broken.client->interrupt();
      model_.connectionError(broken.inModel, false);
    } else if (choice < 45) {
      setReportingEnabled(draw(4) != 0);
    } else if (choice < 95) {
      runServerQueue();
    } else if (choice < 145) {
      platform_.queues().runUntilIdle(kSessionQueue);
    } else if (choice < 160) {
      runUntilIdle();
    } else {
      callSomething();
    }
  }
  void disconnectAll() {
    while (!connected_.empty()) disconnect(0);
    runUntilIdle();
  }

  std::mt19937 random_{GetParam()};
  Model model_;
  std::vector<Connected> connected_;
  std::vector<std::weak_ptr<QVReportingServerInstance>> instances_;
  int nextPid_ = 0;
  int messageNumber_ = 0;
};

TEST_P(QVReportingInterleavingTest, AnswersAndDeliversAsTheRulesSay) {
  for (int step = 0; step < kSteps; ++step) doSomething();
  disconnectAll();

  EXPECT_THAT(replies(), ElementsAreArray(model_.replies));
  QVFakeBeacon& beacon = platform_.beacon();
  EXPECT_EQ(beacon.count(Kind::session), model_.frameworkSessions);
  EXPECT_EQ(beacon.count(Kind::message), model_.messages);
  EXPECT_EQ(beacon.count(Kind::singleMessage), model_.singles);
  EXPECT_EQ(beacon.count(Kind::flush), model_.flushes);
  EXPECT_EQ(std::ranges::count_if(
                platform_.countwise().sentNames(),
                [](const std::string& name) { return name.ends_with("Session_Playback.Start"); }),
            static_cast<std::ptrdiff_t>(model_.events));
  EXPECT_GT(model_.messages, 100u) << "the run is not worth its time";
  EXPECT_GT(model_.singles, 50u);

  // Within one framework session messages arrive in the order in which they were sent, and nothing
  // follows the flush.
  std::map<int, int64_t> latest;
  std::map<int, bool> flushed;
  for (const auto& event : beacon.events()) {
    if (event.kind == Kind::flush) flushed[event.session] = true;
    if (event.kind != Kind::message) continue;
    EXPECT_FALSE(flushed[event.session]);
    if (const QVValue* number = event.payload.find("n"); number->kind() == QVValue::Kind::integer) {
      EXPECT_GE(number->integer(), latest[event.session]);
      latest[event.session] = number->integer();
    }
  }
}

TEST_P(QVReportingInterleavingTest, AnswersTheSameWhateverTheBackendsDo) {
  constexpr std::array<QVFakeBeacon::Backends, 4> kBackends{
      QVFakeBeacon::Backends::atOnce, QVFakeBeacon::Backends::noList,
      QVFakeBeacon::Backends::whenTold, QVFakeBeacon::Backends::never};
  for (int step = 0; step < kSteps / 4; ++step) {
    platform_.beacon().setBackends(kBackends[draw(4)]);
    doSomething();
    if (draw(10) == 0) platform_.beacon().answerBackends();
    if (draw(20) == 0) advance(3s);
  }
  disconnectAll();
  platform_.beacon().answerBackends();
  EXPECT_THAT(replies(), ElementsAreArray(model_.replies));
  EXPECT_EQ(platform_.beacon().count(Kind::session), model_.frameworkSessions);
  EXPECT_EQ(platform_.beacon().count(Kind::singleMessage), model_.singles);
  EXPECT_EQ(platform_.beacon().liveSessions(), 0);
}

TEST_P(QVReportingInterleavingTest, LeavesNothingBehind) {
  for (int step = 0; step < kSteps; ++step) doSomething();
  disconnectAll();
  EXPECT_THAT(service().getAllClients(), IsEmpty());
  EXPECT_TRUE(std::ranges::all_of(instances_, [](const auto& weak) { return weak.expired(); }));
  EXPECT_EQ(journal_.entries(traceEntry(kTraceSessionCreated)).size(),
            journal_.entries(traceEntry(kTraceSessionDestroyed)).size());
  EXPECT_EQ(platform_.beacon().liveSessions(), 0);
  EXPECT_EQ(platform_.beacon().liveTokens(), 0);
  EXPECT_EQ(platform_.queues().pendingCount(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Seeds, QVReportingInterleavingTest, testing::Range(1u, 13u));

}  // namespace
