// Many clients at once that do whatever they may, and what they may not.

#include "client/quietvox_channels.h"
#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"
#include "tests/support/QVTestMessage.h"

#include <atomic>
#include <exception>
#include <filesystem>
#include <fstream>
#include <random>
#include <stop_token>
#include <thread>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr int kClients = 20;
constexpr int kLives = 15;         // connections of each client, one after the other
constexpr int kOperations = 40;    // of each connection
constexpr int64_t kReporters = 8;  // shared by all, so that they meet

// One client's doings, the same at every run for the same seed.
class SoakingClient {
 public:
  SoakingClient(std::filesystem::path socket, unsigned seed)
      : socket_(std::move(socket)), random_(seed) {}

  void run() {
    for (int life = 0; life < kLives; ++life) live();
  }

 private:
  int64_t below(int64_t bound) {
    return static_cast<int64_t>(random_() % static_cast<uint64_t>(bound));
  }

  void live() {
    QVRawPeer peer(socket_);
    // Registered now, so its end will be told.
    peer.call(listCall());
    bool ended = false;
    for (int i = 0; i < kOperations && !ended; ++i) ended = !act(peer);
    if (ended) {
      peer.awaitClose();
    } else if (below(2) == 0) {
      // In good order; otherwise with all replies unread.
      peer.call(listCall());
    }
  }

  // False where the connection is over.
  bool act(QVRawPeer& peer) {
    const int64_t reporter = 1 + below(kReporters);
    switch (below(16)) {
      case 0:
      case 1:
        peer.post(createCall(reporter));
        break;
      case 2:
        // Any type but alarms, whose single messages wait for up to a minute.
        peer.post(setServiceTypeCall(static_cast<uint16_t>(5 + below(8)), reporter));
        break;
      case 3:
        peer.post(configureCall({{"HostApplicationDisplayID", "soak"}, {"n", below(9)}}, reporter));
        break;
      case 4:
      case 5:
        peer.post(startCall(reporter));
        break;
      case 6:
      case 7:
        peer.post(stopCall(reporter));
        break;
      case 8:
        peer.post(destroyCall(reporter));
        break;
      case 9:
        EXPECT_TRUE(peer.call(validateCall(reporter)).isReturn());
        break;
      case 10:
        peer.call(getServiceTypeCall(reporter));
        break;
      case 11:
        peer.post(sendToAllCall({{"to", "all"}}, kSessionPlayback, kStart));
        break;
      case 12:
        if (below(20) == 0) {
          peer.send(QVTestMessage{.version = 9}.bytes());
          return false;
        }
        break;
      default:
        peer.post(sendCall({{"EngineOnTime", 0.5}, {"some key", below(1000)}},
                           {reporter, 1 + below(kReporters)}, kSessionPlayback, kStart));
        break;
    }
    return true;
  }

  const std::filesystem::path socket_;
  std::mt19937_64 random_;
};

class QVSoakTest : public QVEndToEndTest {
 protected:
  // Lets the clients live their lives, all at once.
  void runClients() {
    std::vector<std::jthread> threads;
    for (int i = 0; i < kClients; ++i) {
      threads.emplace_back([this, i] {
        try {
          SoakingClient(root_.socket(), 4711U + static_cast<unsigned>(i)).run();
        } catch (const std::exception& failure) {
          ADD_FAILURE() << failure.what();
        }
      });
    }
  }

  // The service has done what the clients asked for, and ends in good order.
  void expectGoodOrder(QVPeerClient& witness) {
    // Removals run on the server's queue behind everything else that was asked for.
    expectServes(witness);
    expectStored("SELECT * FROM countwise_event WHERE name LIKE '%uptime'",
                 static_cast<std::size_t>(kClients * kLives));
    EXPECT_THAT(witness.reporters(), IsEmpty());
    endService();
    EXPECT_THAT(store().rows("PRAGMA integrity_check"), ElementsAre("ok"));
    EXPECT_GT(store().count("beacon_message"), 0);
    EXPECT_GT(store().count("joulewell_event"), 0);
    EXPECT_EQ(store().count("loss"), 0);
    EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE NOT json_valid(payload)"),
              0);
    EXPECT_EQ(log().count("exception in work queue"), 0U);
  }
};

TEST_F(QVSoakTest, ManyClientsLeaveTheServiceInGoodOrder) {
  auto witness = connectClient();
  runClients();
  expectGoodOrder(witness);
}

// What happens around the clients while they live: preferences are posted, the user interface
// turns, and a driver counts.
class Surroundings {
 public:
  explicit Surroundings(const QVTemporaryRoot& root)
      : root_(root), channels_(root.runtime() / "channels") {
    std::filesystem::create_directory(channels_);
    const char* const names[] = {"frames", "underruns"};
    EXPECT_EQ(quietvox_channels_create(&driver_, (channels_ / "Speaker").c_str(), nullptr, 0, names,
                                       std::size(names)),
              0);
  }
  ~Surroundings() { quietvox_channels_close(&driver_, QUIETVOX_CHANNELS_REMOVE); }
  Surroundings(const Surroundings&) = delete;
  Surroundings& operator=(const Surroundings&) = delete;

  void change(const std::stop_token& stop) {
    for (unsigned round = 0; !stop.stop_requested(); ++round) {
      const bool off = round % 8 == 0;
      root_.configure("preferences/net.quillon.quietvox.json",
                      off ? R"({"disable_reporting": true})" : R"({"device_name": "soak"})");
      write(root_.runtime() / "notify" / "net.quillon.quietvox.reporting", "");
      write(root_.runtime() / "ui-orientation", round % 2 == 0 ? "left-up" : "normal");
      quietvox_channels_add(&driver_, 0, 0, 480);
    }
    // On again, however it ended.
    root_.configure("preferences/net.quillon.quietvox.json", "{}");
    write(root_.runtime() / "notify" / "net.quillon.quietvox.reporting", "");
  }

 private:
  static void write(const std::filesystem::path& path, const char* text) {
    std::ofstream(path) << text;
  }

  const QVTemporaryRoot& root_;
  const std::filesystem::path channels_;
  QuietVoxChannels driver_{};
};

TEST_F(QVSoakTest, ChangesAroundTheClientsLeaveTheServiceInGoodOrder) {
  root_.configure("device.json", R"({"InternalBuild": true})");
  Surroundings surroundings(root_);
  auto witness = connectClient();
  {
    const std::jthread changes(
        [&surroundings](const std::stop_token& stop) { surroundings.change(stop); });
    runClients();
  }
  expectGoodOrder(witness);

  EXPECT_GT(log().count("re-reading quietvox defaults"), 0U);
  EXPECT_GT(store().number("SELECT count(*) FROM beacon_message WHERE category = 65535 AND "
                           "payload LIKE '%\"ui_orientation\"%'"),
            0);
  EXPECT_GT(store().number("SELECT count(*) FROM beacon_message WHERE category = 9 AND "
                           "payload LIKE '%\"Speaker_frames\"%'"),
            0);
  std::size_t files = 0;
  for (const auto& file : std::filesystem::directory_iterator(root_.logs() / "DiagnosticLogs" /
                                                              "Audio" / "Reporting")) {
    EXPECT_EQ(file.path().extension(), ".json") << file.path();
    EXPECT_EQ(QVSubprocess::run({"/usr/bin/python3", "-m", "json.tool", file.path()}).status, 0);
    ++files;
  }
  EXPECT_GT(files, 0U);
}

}  // namespace
