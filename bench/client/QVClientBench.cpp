// What a message costs its sender: on a real-time thread, on any other, and while reporting is off.
//
// No service is needed: nobody empties the queues while they are measured, so each is made large
// enough for all iterations, and its memory is as cold as it gets. "Warm" goes round a queue of the
// usual size, emptied between.

#include "client/QVRealtimeRing.h"
#include "client/QVReporter.h"

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include <benchmark/benchmark.h>

namespace {

constexpr QVClientCategory kCategory{QVClientComponent::session, QVClientKind::performance};

// Ten entries, about 250 bytes of content.
void fill(QVClientPayload& message, int64_t frames) {
  message.set("frames", frames).set("position", 1.5).set("buffer_fill", 960);
  message.set("xruns", 0).set("processing_time_us", 125.25).set("volume", 0.8);
  message.set("route", "Built-in Speaker, left and right").set("format", "S16_LE 48000 Hz stereo");
  message.set("device", "hw:CARD=Generic,DEV=0 (playback)").set("is_running", true);
}

// A directory of its own, for a reporter that finds no service in it.
class Place {
 public:
  explicit Place(bool isReportingOff) {
    std::string name = (std::filesystem::temp_directory_path() / "quietvox-XXXXXX").string();
    if (::mkdtemp(name.data()) == nullptr) std::abort();
    path_ = name;
    std::filesystem::create_directories(path_ / "preferences");
    if (isReportingOff) {
      std::ofstream(path_ / "preferences" / "net.quillon.quietvox.json")
          << R"({"disable_reporting": true})";
    }
    QVReporterOptions options;
    options.socketPath = path_ / "reporting.socket";
    options.configurationDirectory = path_;
    options.runtimeDirectory = path_;
    options.maximumQueuedBytes = std::size_t{1} << 30;
    options.maximumQueuedMessages = std::size_t{1} << 20;
    options.shortestReconnectDelay = std::chrono::hours(1);
    options.longestReconnectDelay = std::chrono::hours(1);
    options.endTimeLimit = std::chrono::milliseconds(0);
    reporter_ = std::move(QVReporter::open(std::move(options)).value());
    session_ = std::move(reporter_->openSession({.reporterID = 7}).value());
  }
  ~Place() {
    session_.reset();
    reporter_.reset();
    std::filesystem::remove_all(path_);
  }
  Place(const Place&) = delete;
  Place& operator=(const Place&) = delete;

  QVReporterSession& session() { return *session_; }
  uint64_t dropped() const { return reporter_->counters().dropped.inAll(); }

 private:
  std::filesystem::path path_;
  std::unique_ptr<QVReporter> reporter_;
  std::unique_ptr<QVReporterSession> session_;
};

void realtimeCold(benchmark::State& state) {
  Place place(false);
  const auto queue = std::move(
      place.session().makeRealtimeQueue({.messages = 65'536, .bytesPerMessage = 512}).value());
  int64_t frames = 0;
  for ([[maybe_unused]] const auto iteration : state) {
    QVClientPayload* message = queue->begin();
    if (message == nullptr) return state.SkipWithError("the queue is full");
    fill(*message, frames += 480);
    if (!queue->commit(kCategory, QVClientMessageType::generic)) {
      return state.SkipWithError("not committed");
    }
  }
}
BENCHMARK(realtimeCold)->Iterations(65'000)->Repetitions(9)->ReportAggregatesOnly();

void realtimeWarm(benchmark::State& state) {
  QVRealtimeRing ring(256, 1'024, nullptr);
  QVClientPayload payload{std::span<char>()};
  QVRealtimeRing::Message message;
  int64_t frames = 0;
  for ([[maybe_unused]] const auto iteration : state) {
    payload.use(ring.nextSlot());
    fill(payload, frames += 480);
    ring.push(payload.entries().size(), kCategory.word, 0);
    benchmark::DoNotOptimize(ring.front(message));
    ring.pop();
  }
}
BENCHMARK(realtimeWarm)->Repetitions(5)->ReportAggregatesOnly();

void realtimeOff(benchmark::State& state) {
  Place place(true);
  const auto queue = std::move(place.session().makeRealtimeQueue().value());
  for ([[maybe_unused]] const auto iteration : state) {
    if (queue->begin() != nullptr) return state.SkipWithError("reporting is on");
  }
}
BENCHMARK(realtimeOff);

void payloadAlone(benchmark::State& state) {
  QVClientPayload payload;
  int64_t frames = 0;
  for ([[maybe_unused]] const auto iteration : state) {
    payload.clear();
    fill(payload, frames += 480);
    benchmark::DoNotOptimize(payload.entries().data());
  }
}
BENCHMARK(payloadAlone)->Repetitions(5)->ReportAggregatesOnly();

void sendAnywhere(benchmark::State& state) {
  Place place(false);
  QVClientPayload payload;
  int64_t frames = 0;
  for ([[maybe_unused]] const auto iteration : state) {
    payload.clear();
    fill(payload, frames += 480);
    place.session().sendMessage(payload, kCategory, QVClientMessageType::generic);
  }
  if (place.dropped() != 0) state.SkipWithError("something was dropped");
}
BENCHMARK(sendAnywhere)->Iterations(200'000)->Repetitions(5)->ReportAggregatesOnly();

void sendWhileOff(benchmark::State& state) {
  Place place(true);
  const QVClientPayload payload;
  uint64_t attempts = 0;
  for ([[maybe_unused]] const auto iteration : state) {
    place.session().sendMessage(payload, kCategory, QVClientMessageType::generic);
    ++attempts;
  }
  if (place.dropped() != attempts) state.SkipWithError("not everything was dropped");
}
BENCHMARK(sendWhileOff);

}  // namespace
