// Measures the real service from outside: processor time a message, throughput into the store,
// memory, idle cost and delays, beside baselines that run at the same time.

#include "bench/service/QVLoad.h"
#include "bench/service/QVSdBusBaseline.h"
#include "bench/service/QVTwoThreadHop.h"
#include "tests/support/QVDaemonProcess.h"
#include "tests/support/QVTemporaryRoot.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

namespace {

using Clock = std::chrono::steady_clock;
using Microseconds = std::chrono::duration<double, std::micro>;
using Seconds = std::chrono::duration<double>;

constexpr int64_t kWindow = 64;

void report(const char* what, double value, const char* unit) {
  std::printf("  %-66s %10.2f %s\n", what, value, unit);
  std::fflush(stdout);
}

double perMessage(std::chrono::nanoseconds time, int64_t messages) {
  return Microseconds(time).count() / static_cast<double>(messages);
}

void pause(std::chrono::milliseconds time) {
  ::poll(nullptr, 0, static_cast<int>(time.count()));
}

// A child process that serves one end of a socket pair; killed when the object goes.
class Peer {
 public:
  explicit Peer(void (*serve)(int descriptor)) {
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
      throw std::runtime_error("socketpair");
    }
    pid_ = ::fork();
    if (pid_ == 0) {
      ::close(ends[0]);
      serve(ends[1]);
      ::_exit(0);
    }
    ::close(ends[1]);
    descriptor_ = ends[0];
  }
  ~Peer() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  Peer(const Peer&) = delete;
  Peer& operator=(const Peer&) = delete;

  // To be closed by whoever takes it.
  int descriptor() const { return descriptor_; }
  std::chrono::nanoseconds processorTime() const {
    clockid_t clock;
    timespec time;
    ::clock_getcpuclockid(pid_, &clock);
    ::clock_gettime(clock, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
  }

 private:
  pid_t pid_;
  int descriptor_;
};

// Processor time that `process` spends on each of the messages that `send` sends.
template <class Process, class Send>
double costOf(const Process& process, int64_t messages, Send&& send) {
  const auto before = process.processorTime();
  send();
  return perMessage(process.processorTime() - before, messages);
}

void intake() {
  constexpr int64_t kWarmUp = 50'000;
  constexpr int64_t kMessages = 500'000;
  {
    const QVTemporaryRoot root;
    const QVDaemonProcess daemon(root);
    QVLoad load(root.socket().string());
    load.send(kWarmUp, kWindow);
    report("service, client library, window 64",
           costOf(daemon, kMessages, [&] { load.send(kMessages, kWindow); }), "us/message");
    report("service, sd-bus client, window 64",
           costOf(daemon, kMessages,
                  [&] { QVSdBusBaseline::send(root.socket().string(), kMessages, kWindow); }),
           "us/message");
  }
  {
    const Peer server(QVSdBusBaseline::serve);
    QVLoad load(server.descriptor());
    load.send(kWarmUp, kWindow);
    report("minimal sd-bus server, client library, window 64",
           costOf(server, kMessages, [&] { load.send(kMessages, kWindow); }), "us/message");
  }
  {
    const Peer server(QVSdBusBaseline::serve);
    report("minimal sd-bus server, sd-bus client, window 64",
           costOf(server, kMessages,
                  [&] { QVSdBusBaseline::send(server.descriptor(), kMessages, kWindow); }),
           "us/message");
  }
}

// What the children that have ended so far have used.
std::chrono::nanoseconds childrensProcessorTime() {
  rusage usage;
  ::getrusage(RUSAGE_CHILDREN, &usage);
  const auto of = [](const timeval& time) {
    return std::chrono::seconds(time.tv_sec) + std::chrono::microseconds(time.tv_usec);
  };
  return of(usage.ru_utime) + of(usage.ru_stime);
}

int64_t query(const QVTemporaryRoot& root, const std::string& sql) {
  return std::stoll(QVSubprocess::run({"sqlite3", root.store().string(), sql}).text);
}

void throughput(std::size_t clients, std::size_t sessionsEach, int64_t messages) {
  const QVTemporaryRoot root;
  const auto before = childrensProcessorTime();
  QVDaemonProcess daemon(root);
  std::vector<std::unique_ptr<QVLoad>> loads;
  int64_t reporterID = 0;
  for (std::size_t client = 0; client < clients; ++client) {
    loads.push_back(std::make_unique<QVLoad>(root.socket().string()));
    std::vector<int64_t> reporterIDs;
    for (std::size_t i = 0; i < sessionsEach; ++i) reporterIDs.push_back(++reporterID);
    loads.back()->startSessions(reporterIDs);
  }
  const auto began = Clock::now();
  const int64_t each = messages / static_cast<int64_t>(clients);
  QVLoad::send(loads, each, std::max<int64_t>(8, 512 / static_cast<int64_t>(clients)));
  const Seconds answered = Clock::now() - began;
  if (daemon.terminate() != 0) throw std::runtime_error("the service did not end well");
  const Seconds stored = Clock::now() - began;
  const auto sent = static_cast<double>(each * static_cast<int64_t>(clients));
  report("answered", sent / answered.count(), "messages/s");
  report("stored, with the orderly end", sent / stored.count(), "messages/s");
  report("time until stored", stored.count(), "s");
  report("service, whole life", Microseconds(childrensProcessorTime() - before).count() / sent,
         "us/message");
  const int64_t rows = query(root, "select count(*) from beacon_message");
  const int64_t events = query(root, "select count(*) from countwise_event");
  const int64_t removed =
      query(root, "select coalesce(sum(count), 0) from loss where cause = 'store_limit'");
  const int64_t lost =
      query(root, "select coalesce(sum(count), 0) from loss where cause != 'store_limit'");
  report("beacon_message rows", static_cast<double>(rows), "");
  report("countwise_event rows", static_cast<double>(events), "");
  report("oldest rows removed to keep the store's size", static_cast<double>(removed), "");
  report("lost otherwise", static_cast<double>(lost), "");
  report("store", static_cast<double>(std::filesystem::file_size(root.store())) / 1048576, "MiB");
}

void trickle() {
  constexpr int64_t kSeconds = 20;
  constexpr int64_t kRate = 1000;
  const QVTemporaryRoot root;
  const QVDaemonProcess daemon(root);
  QVLoad load(root.socket().string());
  load.startSessions({1});
  load.send(kRate, kWindow);
  pause(std::chrono::seconds(1));
  const auto processor = daemon.processorTime();
  const long written = daemon.statusNumber("io", "write_bytes");
  const auto began = Clock::now();
  // Ten at a time, as a player's buffer callbacks would be collected.
  for (int64_t i = 1; i <= kSeconds * kRate / 10; ++i) {
    load.send(10, kWindow);
    const auto next = began + i * std::chrono::milliseconds(10);
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(next - Clock::now());
    if (left.count() > 0) pause(left);
  }
  const Seconds elapsed = Clock::now() - began;
  report("processor", 100 * Seconds(daemon.processorTime() - processor).count() / elapsed.count(),
         "% of a core");
  report("written",
         static_cast<double>(daemon.statusNumber("io", "write_bytes") - written) / 1e6 /
             elapsed.count(),
         "MB/s");
}

double residentMegabytes(const QVDaemonProcess& daemon) {
  return static_cast<double>(daemon.statusNumber("status", "VmRSS")) / 1024;
}

int64_t contextSwitches(const QVDaemonProcess& daemon) {
  int64_t switches = 0;
  const std::string tasks = "/proc/" + std::to_string(daemon.pid()) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    std::ifstream status(task.path() / "status");
    for (std::string line; std::getline(status, line);) {
      constexpr std::string_view kKey = "voluntary_ctxt_switches:";
      if (line.starts_with(kKey)) switches += std::stoll(line.substr(kKey.size()));
    }
  }
  return switches;
}

void idle() {
  const QVTemporaryRoot root;
  const QVDaemonProcess daemon(root);
  report("resident after start", residentMegabytes(daemon), "MiB");
  QVLoad load(root.socket().string());
  load.startSessions({1});
  load.send(1000, kWindow);
  load.stopSessions();
  // Idle workers retire and the store commits; then nothing is left to do.
  pause(std::chrono::seconds(15));
  report("resident after a session of 1,000 messages", residentMegabytes(daemon), "MiB");
  const int64_t before = contextSwitches(daemon);
  pause(std::chrono::seconds(10));
  report("wake-ups in 10 s", static_cast<double>(contextSwitches(daemon) - before), "");
}

int listeningSocket(const QVTemporaryRoot& root) {
  const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  root.socket().string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(socket, 16) != 0) {
    throw std::runtime_error("cannot listen");
  }
  return socket;
}

void reportSpread(const char* what, std::vector<double> values, const char* unit) {
  std::ranges::sort(values);
  report((std::string(what) + ", median").c_str(), values[values.size() / 2], unit);
  report((std::string(what) + ", 99th percentile").c_str(), values[values.size() * 99 / 100], unit);
}

void coldStart() {
  constexpr int kRounds = 30;
  std::vector<double> milliseconds;
  for (int round = 0; round < kRounds; ++round) {
    const QVTemporaryRoot root;
    const int socket = listeningSocket(root);
    const auto began = Clock::now();
    // What a service manager does on the first connection, and the client's call right after.
    const QVSubprocess daemon({.arguments = {QVDaemonProcess::program().string()},
                               .environment = QVDaemonProcess::environment(root),
                               .standardErrorFile = (root.path() / "log").string(),
                               .inheritedDescriptor = socket});
    QVLoad load(root.socket().string());
    if (!load.client().createReportingSessionAndWait(1)) throw std::runtime_error("no answer");
    milliseconds.push_back(std::chrono::duration<double, std::milli>(Clock::now() - began).count());
    ::close(socket);
  }
  reportSpread("first call on a cold socket", milliseconds, "ms");
}

std::vector<double> timed(int rounds, const std::function<void()>& once) {
  std::vector<double> microseconds;
  for (int round = 0; round < rounds; ++round) {
    const auto began = Clock::now();
    once();
    microseconds.push_back(Microseconds(Clock::now() - began).count());
  }
  return microseconds;
}

void roundTrip() {
  constexpr int kRounds = 20'000;
  const QVTemporaryRoot root;
  const QVDaemonProcess daemon(root);
  QVLoad load(root.socket().string());
  load.send(1000, 1);
  const Peer hop(QVTwoThreadHop::serve);
  const auto hopOnce = [&] {
    const std::array<char, 200> request{};
    std::array<char, 64> answer;
    if (::send(hop.descriptor(), request.data(), request.size(), 0) < 0 ||
        ::recv(hop.descriptor(), answer.data(), answer.size(), 0) <= 0) {
      throw std::runtime_error("no hop");
    }
  };
  // Alternating, so that both meet the same machine.
  std::vector<double> service;
  std::vector<double> bare;
  for (int block = 0; block < 10; ++block) {
    std::ranges::copy(timed(kRounds / 10, [&] { load.send(1, 1); }), std::back_inserter(service));
    std::ranges::copy(timed(kRounds / 10, hopOnce), std::back_inserter(bare));
  }
  reportSpread("call through the server queue", service, "us");
  reportSpread("bare two-thread hop", bare, "us");
  std::ranges::sort(service);
  std::ranges::sort(bare);
  report("ratio of the medians", service[service.size() / 2] / bare[bare.size() / 2], "");
  ::close(hop.descriptor());
}

void memory() {
  constexpr int64_t kMessages = 500'000;
  const QVTemporaryRoot root;
  const QVDaemonProcess daemon(root);
  QVLoad load(root.socket().string());
  load.startSessions({1});
  load.send(10'000, kWindow);
  load.stopSessions();
  pause(std::chrono::seconds(2));
  const double before = residentMegabytes(daemon);
  load.startSessions({2});
  load.send(kMessages, kWindow);
  pause(std::chrono::seconds(3));
  const double collected = residentMegabytes(daemon);
  load.stopSessions();
  pause(std::chrono::seconds(5));
  const double after = residentMegabytes(daemon);
  report("collected payloads", (collected - before) * 1048576 / kMessages, "bytes/message");
  report("resident before", before, "MiB");
  report("resident with 500,000 collected messages", collected, "MiB");
  report("resident after the stop", after, "MiB");
  report("highest", static_cast<double>(daemon.statusNumber("status", "VmHWM")) / 1024, "MiB");
}

struct Scenario {
  const char* name;
  const char* title;
  std::function<void()> run;
};

const std::vector<Scenario>& scenarios() {
  static const std::vector<Scenario> all{
      {"intake", "Intake: a message decoded, routed to nothing, answered", intake},
      {"throughput", "One client, one session, 1,200,000 messages into the store",
       [] { throughput(1, 1, 1'200'000); }},
      {"hundred", "A hundred clients with ten sessions each, 1,200,000 messages",
       [] { throughput(100, 10, 1'200'000); }},
      {"trickle", "1,000 messages a second for 20 s", trickle},
      {"idle", "Idle", idle},
      {"cold", "Cold start", coldStart},
      {"roundtrip", "Round trip", roundTrip},
      {"memory", "Memory of a session with 500,000 messages", memory}};
  return all;
}

int usage() {
  std::puts("usage: qv_service_bench [SCENARIO...]\n\nScenarios (all, where none is named):");
  for (const Scenario& scenario : scenarios()) {
    std::printf("  %-11s %s\n", scenario.name, scenario.title);
  }
  return 2;
}

}  // namespace

int main(int argc, char** argv) {
  const std::vector<std::string> wanted(argv + 1, argv + argc);
  for (const std::string& name : wanted) {
    if (std::ranges::none_of(scenarios(), [&](const auto& s) { return name == s.name; })) {
      return usage();
    }
  }
  try {
    for (const Scenario& scenario : scenarios()) {
      if (!wanted.empty() && std::ranges::find(wanted, scenario.name) == wanted.end()) continue;
      std::puts(scenario.title);
      scenario.run();
    }
  } catch (const std::exception& error) {
    std::fprintf(stderr, "qv_service_bench: %s\n", error.what());
    return 1;
  }
  return 0;
}
