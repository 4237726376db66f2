// What the end of a session costs: making its summary event, and writing its file with the real
// adapters into the directory for temporary files. The argument is the number of messages, of ten
// entries and about 250 bytes of content each.

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "platform/fake/QVFakePlatform.h"
#include "platform/linux/output/QVPosixFileSystem.h"
#include "platform/linux/output/QVRapidJSONOutput.h"
#include "tests/support/QVTemporaryRoot.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include <benchmark/benchmark.h>
#include <malloc.h>

namespace {

constexpr uint32_t kCategory = 0x08000003;
constexpr uint16_t kType = 1;
constexpr int kMessagesBetweenClearings = 1000;

QVDictionary message(int number) {
  return {{"application", "net.quillon.player"},
          {"buffer_frames", 4096},
          {"channels", 2},
          {"codec", "aac-low-complexity"},
          {"duration", 12.5 + number},
          {"route", "headphones/bluetooth a2dp, left and right"},
          {"sample_rate", 44100.0},
          {"state", "running with all of the effects switched on and off"},
          {"underruns", number},
          {"volume", 0.1 + number * 1e-6}};
}

// A line such as "VmRSS:   1234 kB" of the process's own status, in MiB.
double mebibytes(const std::string& key) {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with(key + ":")) return std::stod(line.substr(key.size() + 1)) / 1024;
  }
  return 0;
}

// The peak is that of what comes from now on.
void forgetPeak() {
  std::ofstream("/proc/self/clear_refs") << "5";
}

// A started session of an internal build that has recorded so many messages.
class Session {
 public:
  explicit Session(int messages) {
    // As the service has it: large blocks go back to the kernel.
    ::mallopt(M_MMAP_THRESHOLD, 64 * 1024);  // NOLINT(concurrency-mt-unsafe): one thread so far
    QVPlatform::shared().fileSystem = std::make_unique<QVPosixFileSystem>(root_.logs().string());
    QVPlatform::shared().jsonOutput = std::make_unique<QVRapidJSONOutput>();
    fakes_.deviceInformation().setAnswer("InternalBuild", true);
    session_ = QVReportingSession::initWithID(7, {});
    session_->setConfiguration({{"HostApplicationDisplayID", "net.quillon.player"}});
    session_->start();
    for (int number = 0; number < messages; ++number) {
      session_->sendMessage(message(number), kCategory, kType, {});
      if (number % kMessagesBetweenClearings == 0) clear();
    }
    clear();
  }

  QVReportingSession& session() { return *session_; }
  double fileMebibytes() const {
    double bytes = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root_.logs())) {
      if (entry.is_regular_file()) bytes += static_cast<double>(entry.file_size());
    }
    return bytes / (1 << 20);
  }
  // What the fakes keep is not the service's.
  void clear() {
    fakes_.queues().runUntilIdle();
    fakes_.beacon().forgetEvents();
    fakes_.log().clear();
    fakes_.tracePoints().clear();
  }

 private:
  QVTemporaryRoot root_;
  QVFakePlatform fakes_;
  std::shared_ptr<QVReportingSession> session_;
};

benchmark::Counter perMessage(const benchmark::State& state) {
  return {static_cast<double>(state.range(0)),
          benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert};
}

void summaryEvent(benchmark::State& state) {
  Session session(static_cast<int>(state.range(0)));
  const double before = mebibytes("VmRSS");
  forgetPeak();
  for (auto _ : state) {
    benchmark::DoNotOptimize(session.session().createSummaryEventForSession());
  }
  state.counters["per_message"] = perMessage(state);
  state.counters["MiB_before"] = before;
  state.counters["MiB_peak"] = mebibytes("VmHWM");
}
BENCHMARK(summaryEvent)
    ->Arg(10'000)
    ->Arg(100'000)
    ->Arg(1'000'000)
    ->Iterations(3)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// As in a stop: behind the messages lies the summary event, as long as all of them.
void summaryFile(benchmark::State& state) {
  Session session(static_cast<int>(state.range(0)));
  session.session().sendMessage(session.session().createSummaryEventForSession(),
                                kQVReportingCategorySummary, kQVReportingMessageTypeSummary, true,
                                {});
  session.clear();
  const double before = mebibytes("VmRSS");
  forgetPeak();
  for (auto _ : state) session.session().writeSummaryJson();
  state.counters["per_message"] = perMessage(state);
  state.counters["MiB_before"] = before;
  state.counters["MiB_peak"] = mebibytes("VmHWM");
  state.counters["MiB_file"] = session.fileMebibytes();
}
BENCHMARK(summaryFile)
    ->Arg(10'000)
    ->Arg(100'000)
    ->Arg(1'000'000)
    ->Iterations(1)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
