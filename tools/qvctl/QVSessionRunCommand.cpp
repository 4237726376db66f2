#include "tools/qvctl/QVSessionRunCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVSendCommand.h"
#include "tools/qvctl/QVSessionEnd.h"
#include "tools/qvctl/QVSignals.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <system_error>

#include <poll.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>

namespace {

using Clock = std::chrono::steady_clock;

// As shells have it.
constexpr int kNotFound = 127;
constexpr int kCannotRun = 126;
constexpr int kSignalled = 128;

double secondsOf(const timeval& time) {
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
}

// How the command ended, and what it took.
struct Outcome {
  int status = 0;  // as wait() has it
  rusage used{};
  Clock::duration wall{};

  int exitStatus() const {
    return WIFSIGNALED(status) ? kSignalled + WTERMSIG(status) : WEXITSTATUS(status);
  }
};

// The session that a command's life is reported in.
class Session {
 public:
  Session(const QVToolContext& context, const QVSessionRunCommand::Options& options)
      : service_(context.places),
        category_(QVParseCategory(options.category).value_or(0)),
        program_(std::filesystem::path(options.command[0]).filename().string()),
        reporterID_(options.setup.create(service_)) {
    service_.ask(&QVClient::startReportingSessionForIDAndWait, reporterID_, nullptr);
    QVClientPayload message;
    message.set("command", program_);
    send(message, QVClientMessageType::start);
  }

  int64_t reporterID() const { return reporterID_; }

  // `ownPeak`: of this process's memory when the command began. A signal ends the wait for the
  // service: the command, which they were meant for, is no more.
  void end(const Outcome& outcome, int64_t ownPeak, const QVSignals& signals) {
    QVClientPayload message = endMessage(outcome.exitStatus());
    message.set("wall_seconds", std::chrono::duration<double>(outcome.wall).count())
        .set("user_seconds", secondsOf(outcome.used.ru_utime))
        .set("system_seconds", secondsOf(outcome.used.ru_stime));
    // The kernel counts what this process had before the command took its place: a smaller peak is
    // not to be told from it.
    if (outcome.used.ru_maxrss > ownPeak) message.set("max_resident_kib", outcome.used.ru_maxrss);
    if (WIFSIGNALED(outcome.status)) message.set("signal", WTERMSIG(outcome.status));
    finish(message, signals);
  }

  // The command never began.
  void endWithoutCommand(int status, const QVSignals& signals) {
    finish(endMessage(status), signals);
  }

 private:
  QVClientPayload endMessage(int exitStatus) const {
    QVClientPayload message;
    message.set("command", program_).set("exit_status", exitStatus);
    return message;
  }

  void finish(const QVClientPayload& message, const QVSignals& signals) {
    const QVSessionEnd end(service_, reporterID_, message, QVClientCategory(category_));
    const std::string problem = end.await(signals.descriptor());
    if (!problem.empty()) QVToolOutput::note(problem);
  }

  // Reporting that is switched off is no reason not to run the command.
  void send(const QVClientPayload& message, QVClientMessageType type) {
    const QVClientError error = service_.wait(&QVClient::sendMessageAndWait, message,
                                              QVClientCategory(category_), type, reporterID_);
    if (error) QVToolOutput::note("not reported: " + error.text());
  }

  QVServiceConnection service_;
  const uint32_t category_;
  const std::string program_;
  const int64_t reporterID_;
};

// The environment of the command: this process's, and the session.
std::vector<std::string> environmentWith(const std::optional<int64_t>& session) {
  const std::string prefix = QVText(QVSendCommand::kSessionVariable, "=");
  std::vector<std::string> environment;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string text = *entry;
    if (!text.starts_with(prefix)) environment.push_back(text);
  }
  if (session) environment.push_back(QVText(prefix, *session));
  return environment;
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

// Begins the command; answers an error number.
int spawn(std::vector<std::string> command, const std::optional<int64_t>& session,
          const QVSignals& signals, bool ignoresPipes, pid_t& pid) {
  std::vector<std::string> environment = environmentWith(session);
  posix_spawnattr_t attributes;
  ::posix_spawnattr_init(&attributes);
  sigset_t defaults;
  ::sigemptyset(&defaults);
  // Which qvctl ignores for itself.
  if (!ignoresPipes) ::sigaddset(&defaults, SIGPIPE);
  ::posix_spawnattr_setsigmask(&attributes, &signals.previous());
  ::posix_spawnattr_setsigdefault(&attributes, &defaults);
  ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  const int error = ::posix_spawnp(&pid, command[0].c_str(), nullptr, &attributes,
                                   pointersTo(command).data(), pointersTo(environment).data());
  ::posix_spawnattr_destroy(&attributes);
  return error;
}

// Those that the terminal sends go to all of its processes, to the command as well. Of a process
// that signals the whole group nothing tells it from one that means qvctl alone, as a script's
// `kill $!` does; that one is not to be lost, so the command gets the former's twice.
bool isFromTerminal(const signalfd_siginfo& signal) {
  return signal.ssi_code == SI_KERNEL;
}

// Waits for the command's end, and passes signals on until then.
Outcome await(pid_t pid, const QVSignals& signals, Clock::time_point began) {
  const QVDescriptor process(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  if (!process.isOpen()) throw QVToolFailure::ofSystem("the command", errno);
  while (true) {
    std::array<pollfd, 2> entries{{{process.get(), POLLIN, 0}, {signals.descriptor(), POLLIN, 0}}};
    if (::poll(entries.data(), entries.size(), -1) < 0) continue;
    while (const auto signal = signals.next()) {
      if (!isFromTerminal(*signal)) ::kill(pid, static_cast<int>(signal->ssi_signo));
    }
    if (entries[0].revents != 0) break;
  }
  Outcome outcome;
  while (::wait4(pid, &outcome.status, 0, &outcome.used) < 0 && errno == EINTR) {
  }
  outcome.wall = Clock::now() - began;
  return outcome;
}

// Of this process, whose memory the command began with.
int64_t ownPeakKiB() {
  rusage used{};
  ::getrusage(RUSAGE_SELF, &used);
  return used.ru_maxrss;
}

// Reports the end: how the command ended is what counts, not whether the service hears of it.
void report(const std::function<void()>& end) {
  try {
    end();
  } catch (const QVToolFailure& failure) {
    QVToolOutput::note(QVText("not reported: ", failure.what()));
  }
}

}  // namespace

QVToolStatus QVSessionRunCommand::run(const QVToolContext& context, const Options& options) {
  if (options.command.empty()) {
    throw QVToolFailure(QVToolStatus::wrongUsage, "which command? session run -- COMMAND");
  }
  options.setup.check();
  if (!QVParseCategory(options.category)) {
    throw QVToolFailure(QVToolStatus::wrongUsage,
                        QVText("no category is called \"", options.category, "\""));
  }
  std::optional<Session> session;
  try {
    session.emplace(context, options);
  } catch (const QVToolFailure& failure) {
    if (!options.anyway || failure.status() == QVToolStatus::wrongUsage) throw;
    QVToolOutput::note(failure.what());
  }
  // Not before: whoever waits for a silent service shall be able to end it. The client library's
  // thread takes no signals.
  const QVSignals signals{SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGUSR1, SIGUSR2};
  const auto began = Clock::now();
  pid_t pid = -1;
  const auto reporterID = session ? std::optional(session->reporterID()) : std::nullopt;
  if (const int error = spawn(options.command, reporterID, signals, context.ignoresPipes, pid)) {
    QVToolOutput::note(options.command[0] + ": " + std::generic_category().message(error));
    const int status = error == ENOENT ? kNotFound : kCannotRun;
    report([&] {
      if (session) session->endWithoutCommand(status, signals);
    });
    return static_cast<QVToolStatus>(status);
  }
  const int64_t ownPeak = ownPeakKiB();
  const Outcome outcome = await(pid, signals, began);
  report([&] {
    if (session) session->end(outcome, ownPeak, signals);
  });
  return static_cast<QVToolStatus>(outcome.exitStatus());
}
