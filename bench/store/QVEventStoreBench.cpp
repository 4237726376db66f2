// What the event store costs: time a message on the writer's thread and in all, and bytes written.
// A message is one row of beacon_message and one of countwise_event, with ten entries of about 250
// bytes of content.

#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/linux/store/QVJSONText.h"
#include "platform/linux/store/QVSQLiteEventStore.h"
#include "platform/linux/store/QVStoreBeacon.h"
#include "platform/linux/store/QVStoreCountwise.h"
#include "platform/linux/system/QVSystemClock.h"
#include "tests/support/QVTemporaryRoot.h"

#include <chrono>
#include <cstdint>
#include <ctime>
#include <fstream>
#include <future>
#include <optional>
#include <string>
#include <thread>

#include <benchmark/benchmark.h>

namespace {

double seconds(clockid_t clock) {
  timespec time{};
  clock_gettime(clock, &time);
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

double bytesWritten() {
  std::ifstream file("/proc/self/io");
  std::string key;
  double value = 0;
  while (file >> key >> value) {
    if (key == "write_bytes:") return value;
  }
  return 0;
}

QVDictionary messagePayload() {
  return {{"application", "net.quillon.player"},
          {"buffer_frames", 4096},
          {"channels", 2},
          {"codec", "aac-low-complexity"},
          {"duration", 12.5},
          {"route", "headphones/bluetooth a2dp, left and right"},
          {"sample_rate", 44100.0},
          {"state", "running with all of the effects switched on and off"},
          {"underruns", 0},
          {"volume", 0.75}};
}

// A store in a directory of its own, and one session in it.
class Store {
 public:
  explicit Store(int64_t limitMebibytes) {
    preferences_.setValue("net.quillon.beacon", "store_limit_mib", limitMebibytes);
    store_ = std::make_shared<QVSQLiteEventStore>(
        log_, clock_, preferences_, QVEventStoreOptions{.path = root_.store().string()});
    beacon_.emplace(store_);
    countwise_.emplace(store_);
    session_ = beacon_->initWithSessionInfo(
        {{kBeaconSessionInfoClientType, 19}, {kBeaconSessionInfoSessionID, 4711}},
        {{kBeaconUserInfoClientName, "net.quillon.quietvox"},
         {kBeaconUserInfoServiceName, "media_session"}},
        {});
  }

  void sendMessage() {
    std::optional<QVError> error;
    if (!session_->sendMessageWithCategory(3, 1, payload_, error)) std::abort();
    countwise_->sendEventLazily("net.quillon.quietvox.Session_Generic.Start",
                                [payload = countwisePayload_] { return payload; });
  }
  void flush() {
    std::promise<bool> done;
    session_->flushMessagesWithCompletion(
        [&done](const std::optional<QVError>& error) { done.set_value(!error.has_value()); });
    if (!done.get_future().get()) std::abort();
  }
  // The writer's thread tells its time in a payload callback.
  double writerSeconds() {
    double time = 0;
    countwise_->sendEventLazily("time", [&time] {
      time = seconds(CLOCK_THREAD_CPUTIME_ID);
      return QVDictionary{};
    });
    flush();
    return time;
  }

 private:
  const QVTemporaryRoot root_;
  QVFakeLog log_;
  QVSystemClock clock_;
  QVFakePreferences preferences_;
  std::shared_ptr<QVSQLiteEventStore> store_;
  std::optional<QVStoreBeacon> beacon_;
  std::optional<QVStoreCountwise> countwise_;
  std::shared_ptr<QVBeaconSession> session_;
  const QVDictionary payload_ = messagePayload();
  const QVDictionary countwisePayload_ =
      messagePayload().merging({{"HostApplicationDisplayID", "net.quillon.player"}});
};

struct Figures {
  double process = seconds(CLOCK_PROCESS_CPUTIME_ID);
  double writer = 0;
  double bytes = bytesWritten();
};

void report(benchmark::State& state, const Figures& before, const Figures& after, double messages) {
  state.counters["us_writer"] = (after.writer - before.writer) / messages * 1e6;
  state.counters["us_process"] = (after.process - before.process) / messages * 1e6;
  state.counters["bytes"] = (after.bytes - before.bytes) / messages;
}

// As fast as the store takes them; the argument is the file's limit in MiB, which is reached before
// the measuring begins where it is small.
void fullSpeed(benchmark::State& state) {
  constexpr int kMessages = 100'000;
  constexpr int kWindow = 5'000;  // messages between two flushes, so that the queue stays short
  Store store(state.range(0));
  const auto send = [&store] {
    for (int i = 0; i < kMessages; ++i) {
      store.sendMessage();
      if (i % kWindow == kWindow - 1) store.flush();
    }
  };
  send();
  const Figures before{.writer = store.writerSeconds()};
  for (auto _ : state) send();
  const Figures after{.writer = store.writerSeconds()};
  report(state, before, after, static_cast<double>(state.iterations()) * kMessages);
}
BENCHMARK(fullSpeed)->Arg(4096)->Arg(32)->Iterations(5)->Unit(benchmark::kMillisecond);

// A thousand messages a second for as many seconds as the argument says.
void trickle(benchmark::State& state) {
  constexpr int kMessagesPerSecond = 1'000;
  constexpr int kBurst = 10;
  const auto messages = static_cast<int>(state.range(0)) * kMessagesPerSecond;
  Store store(256);
  const Figures before{.writer = store.writerSeconds()};
  for (auto _ : state) {
    auto next = std::chrono::steady_clock::now();
    for (int i = 0; i < messages; i += kBurst) {
      for (int j = 0; j < kBurst; ++j) store.sendMessage();
      next += std::chrono::microseconds(1'000'000 / kMessagesPerSecond * kBurst);
      std::this_thread::sleep_until(next);
    }
  }
  const Figures after{.writer = store.writerSeconds()};
  report(state, before, after, static_cast<double>(state.iterations()) * messages);
}
BENCHMARK(trickle)->Arg(30)->Iterations(1)->Unit(benchmark::kMillisecond);

void text(benchmark::State& state) {
  const QVDictionary payload = messagePayload();
  QVJSONText json;
  for (auto _ : state) benchmark::DoNotOptimize(json.write(payload));
}
BENCHMARK(text);

}  // namespace
