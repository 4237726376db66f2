#include "tools/qvctl/QVSessionKeeper.h"

#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVSignals.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <exception>
#include <string_view>

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

// Requests that may wait for the keeper.
constexpr int kBacklog = 16;
// Bytes of an answer: a status and a text for people.
constexpr std::size_t kAnswerBytes = 4096;
// How long either side waits for the other: the service's answer, and a little.
constexpr timeval kPatience{
    .tv_sec = std::chrono::ceil<std::chrono::seconds>(QVServiceConnection::kTimeLimit).count() + 5,
    .tv_usec = 0};

struct Answer {
  QVToolStatus status = QVToolStatus::done;
  std::string text;

  std::string bytes() const {
    return std::string(1, static_cast<char>('0' + static_cast<int>(status))) + text;
  }
  static Answer fromBytes(std::string_view bytes) {
    if (bytes.empty()) return {QVToolStatus::failed, "the session's keeper has ended"};
    return {static_cast<QVToolStatus>(bytes[0] - '0'), std::string(bytes.substr(1))};
  }
};

Answer receive(int descriptor) {
  std::array<char, kAnswerBytes> bytes;
  ssize_t count = 0;
  do {
    count = ::read(descriptor, bytes.data(), bytes.size());
  } while (count < 0 && errno == EINTR);
  return Answer::fromBytes({bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0))});
}

void send(int descriptor, const Answer& answer) {
  const std::string bytes = answer.bytes().substr(0, kAnswerBytes);
  // Whoever asked may have gone.
  static_cast<void>(::write(descriptor, bytes.data(), bytes.size()));
}

// Whose process is at the other end, as the kernel has it.
uid_t userOf(int connection) {
  ucred peer{};
  socklen_t length = sizeof peer;
  const bool isKnown = ::getsockopt(connection, SOL_SOCKET, SO_PEERCRED, &peer, &length) == 0;
  return isKnown ? peer.uid : static_cast<uid_t>(-1);
}

// Whether a keeper listens to it.
bool isTrusted(int connection) {
  const uid_t user = userOf(connection);
  return user == ::geteuid() || user == 0;
}

QVDescriptor makeSocket() {
  QVDescriptor made(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
  if (!made.isOpen()) throw QVToolFailure::ofSystem("a socket", errno);
  ::setsockopt(made.get(), SOL_SOCKET, SO_RCVTIMEO, &kPatience, sizeof kPatience);
  return made;
}

const sockaddr* generic(const sockaddr_un& address) {
  return reinterpret_cast<const sockaddr*>(&address);
}

// The caller's locks and pipes would otherwise last as long as the keeper.
void closeInherited(int kept) {
  const auto next = static_cast<unsigned>(kept) + 1;
  if (kept > STDERR_FILENO + 1) {
    ::close_range(STDERR_FILENO + 1, next - 2, 0);
  }
  ::close_range(std::max<unsigned>(next, STDERR_FILENO + 1), ~0U, 0);
}

// Nothing of the caller's is held: neither its terminal, nor its directory, nor its pipes.
void detach() {
  ::setsid();
  const QVDescriptor nothing(::open("/dev/null", O_RDWR | O_CLOEXEC));
  for (const int descriptor : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    ::dup2(nothing.get(), descriptor);
  }
  static_cast<void>(::chdir("/"));
}

Answer carryOut(QVServiceConnection& service, int64_t reporterID,
                QVSessionKeeper::Request request) {
  try {
    service.ask(request == QVSessionKeeper::Request::stop
                    ? &QVClient::stopReportingSessionForIDAndWait
                    : &QVClient::destroyReportingSessionAndWait,
                reporterID);
    return {};
  } catch (const QVToolFailure& failure) {
    return {failure.status(), failure.what()};
  }
}

}  // namespace

sockaddr_un QVSessionKeeper::address(int64_t reporterID) const {
  const std::string problem = places_.socketProblem();
  if (!problem.empty()) {
    throw QVToolFailure(QVToolStatus::notRunning, "the service cannot be reached: " + problem);
  }
  struct stat file {};
  if (::stat(places_.socket.c_str(), &file) != 0) {
    throw QVToolFailure::ofSystem(places_.socket.string(), errno, QVToolStatus::notRunning);
  }
  // All of the address counts, its zeros too.
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string name = QVText("quietvox-session/", uint64_t{file.st_dev}, "/",
                                  uint64_t{file.st_ino}, "/", reporterID);
  std::ranges::copy(name, address.sun_path + 1);
  return address;
}

QVSessionKeeper::Kept QVSessionKeeper::start(const QVSessionSetup& setup, bool startSession) const {
  std::array<int, 2> ends{-1, -1};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) throw QVToolFailure::ofSystem("a pipe", errno);
  const QVDescriptor report(ends[0]);
  QVDescriptor keepersEnd(ends[1]);
  const pid_t keeper = ::fork();
  if (keeper < 0) throw QVToolFailure::ofSystem("a process", errno);
  if (keeper == 0) keep(setup, startSession, keepersEnd.get());
  keepersEnd = QVDescriptor();
  const Answer answer = receive(report.get());
  if (answer.status != QVToolStatus::done) {
    ::waitpid(keeper, nullptr, 0);
    throw QVToolFailure(answer.status, answer.text);
  }
  return {std::stoll(answer.text), keeper};
}

void QVSessionKeeper::keep(const QVSessionSetup& setup, bool startSession, int report) const {
  closeInherited(report);
  try {
    const QVDescriptor lost(::eventfd(0, EFD_CLOEXEC));
    QVServiceConnection service(places_, [&lost] { ::eventfd_write(lost.get(), 1); });
    const int64_t session = setup.create(service);
    const sockaddr_un place = address(session);
    const QVDescriptor listener = makeSocket();
    if (::bind(listener.get(), generic(place), sizeof place) != 0 ||
        ::listen(listener.get(), kBacklog) != 0) {
      throw QVToolFailure::ofSystem("the keeper's socket", errno);
    }
    if (startSession) {
      service.ask(&QVClient::startReportingSessionForIDAndWait, session, nullptr);
    }
    send(report, {QVToolStatus::done, std::to_string(session)});
    ::close(report);
    detach();
    serve(service, session, listener.get(), lost.get());
  } catch (const QVToolFailure& failure) {
    send(report, {failure.status(), failure.what()});
    ::_exit(static_cast<int>(failure.status()));
  } catch (const std::exception& failure) {
    send(report, {QVToolStatus::failed, failure.what()});
    ::_exit(static_cast<int>(QVToolStatus::failed));
  }
  ::_exit(static_cast<int>(QVToolStatus::done));
}

void QVSessionKeeper::serve(QVServiceConnection& service, int64_t reporterID, int listener,
                            int lost) const {
  const QVSignals signals{SIGINT, SIGTERM};
  while (true) {
    std::array<pollfd, 3> entries{
        {{listener, POLLIN, 0}, {signals.descriptor(), POLLIN, 0}, {lost, POLLIN, 0}}};
    if (::poll(entries.data(), entries.size(), -1) < 0) continue;
    if (entries[2].revents != 0) return;
    if (entries[1].revents != 0) {
      carryOut(service, reporterID, Request::destroy);
      return;
    }
    const QVDescriptor connection(::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC));
    // Others are not even waited for.
    if (!connection.isOpen() || !isTrusted(connection.get())) continue;
    char request = 0;
    ::setsockopt(connection.get(), SOL_SOCKET, SO_RCVTIMEO, &kPatience, sizeof kPatience);
    if (::read(connection.get(), &request, 1) != 1) continue;
    const bool isEnd = request == static_cast<char>(Request::destroy);
    if (!isEnd && request != static_cast<char>(Request::stop)) continue;
    const Answer answer = carryOut(service, reporterID, static_cast<Request>(request));
    send(connection.get(), answer);
    if (isEnd) return;
  }
}

void QVSessionKeeper::ask(int64_t reporterID, Request request) const {
  const QVDescriptor connection = makeSocket();
  const sockaddr_un place = address(reporterID);
  if (::connect(connection.get(), generic(place), sizeof place) != 0) {
    throw QVToolFailure(QVToolStatus::failed,
                        QVText("session ", reporterID,
                               " was not created with qvctl session create; "
                               "its own program alone can stop and destroy it"));
  }
  // That keeper would not listen; or it is none, and would say anything.
  if (::geteuid() != 0 && userOf(connection.get()) != ::geteuid()) {
    throw QVToolFailure(QVToolStatus::notPermitted,
                        QVText("session ", reporterID, " is another user's"));
  }
  const char byte = static_cast<char>(request);
  if (::send(connection.get(), &byte, 1, MSG_NOSIGNAL) != 1) {
    throw QVToolFailure::ofSystem("the session's keeper", errno);
  }
  const Answer answer = receive(connection.get());
  if (answer.status != QVToolStatus::done) throw QVToolFailure(answer.status, answer.text);
}
