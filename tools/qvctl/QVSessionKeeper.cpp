#include "tools/qvctl/QVSessionKeeper.h"

#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVSignals.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstddef>
#include <exception>
#include <string_view>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

// Connections that may wait for the keeper to take them, and of those it took, that may wait for
// their own request. Scripts have one or two.
constexpr int kBacklog = 16;
// For a keeper at which so many wait that there is no place for one more.
constexpr std::chrono::seconds kPlaceLimit{1};
constexpr std::size_t kMostConnections = 16;
// Bytes of an answer: a status and a text for people.
constexpr std::size_t kAnswerBytes = 4096;
// What the creator says when the session is known of.
constexpr char kHandOver = 'h';

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

// Waits, where the socket has no time limit for as long as there is somebody at the other end.
Answer receive(int socket) {
  std::array<char, kAnswerBytes> bytes;
  ssize_t count = 0;
  do {
    count = ::recv(socket, bytes.data(), bytes.size(), 0);
  } while (count < 0 && errno == EINTR);
  if (count < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
    return {QVToolStatus::notRunning, "the session's keeper does not answer"};
  }
  return Answer::fromBytes({bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0))});
}

// Whoever asked may have gone, and is not waited for.
void send(int socket, const Answer& answer) {
  const std::string bytes = answer.bytes().substr(0, kAnswerBytes);
  static_cast<void>(::send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT));
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
  QVDescriptor made(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!made.isOpen()) throw QVToolFailure::ofSystem("a socket", errno);
  return made;
}

// At once or, where the socket blocks, within kPlaceLimit, or not at all: whoever has taken a
// keeper's name, and takes no connections, holds nobody up.
bool connectTo(int socket, const sockaddr_un& address) {
  return ::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

// From now on the socket blocks, for that long where it receives, and a moment where it connects.
void waitFor(int socket, std::chrono::milliseconds patience) {
  const auto seconds = std::chrono::floor<std::chrono::seconds>(patience);
  const std::chrono::microseconds rest = patience - seconds;
  const timeval limit{.tv_sec = seconds.count(), .tv_usec = rest.count()};
  ::setsockopt(socket, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
  const timeval place{.tv_sec = kPlaceLimit.count(), .tv_usec = 0};
  ::setsockopt(socket, SOL_SOCKET, SO_SNDTIMEO, &place, sizeof place);
  ::fcntl(socket, F_SETFL, ::fcntl(socket, F_GETFL) & ~O_NONBLOCK);
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

// Ends with the process that made this one, whose number that is.
void dependOn(pid_t creator) {
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  // It may have ended before.
  if (::getppid() != creator) ::_exit(static_cast<int>(QVToolStatus::failed));
}

// Whether the creator has told of the session; it waits for the end of this, and may end then.
bool isHandedOver(int creator) {
  char byte = 0;
  while (::recv(creator, &byte, 1, 0) < 0 && errno == EINTR) {
  }
  if (byte != kHandOver) return false;
  ::prctl(PR_SET_PDEATHSIG, 0);
  ::close(creator);
  return true;
}

// In the keeper: those who are connected and have not said yet what they want.
class Requests {
 public:
  Requests(QVServiceConnection& service, int64_t reporterID)
      : service_(service), reporterID_(reporterID) {}

  // Serves until the session's end.
  void serve(int listener, int lost, const QVSignals& signals) {
    while (true) {
      std::vector<pollfd> entries{
          {listener, POLLIN, 0}, {signals.descriptor(), POLLIN, 0}, {lost, POLLIN, 0}};
      for (const QVDescriptor& connection : waiting_)
        entries.push_back({connection.get(), POLLIN, 0});
      if (::poll(entries.data(), entries.size(), -1) < 0) continue;
      if (entries[2].revents != 0) return;
      if (entries[1].revents != 0) {
        carryOut(service_, reporterID_, QVSessionKeeper::Request::destroy);
        return;
      }
      // Last to first, as those that are answered go.
      for (std::size_t i = entries.size(); i-- > kOthers;) {
        if (entries[i].revents != 0 && isLast(i - kOthers)) return;
      }
      if (entries[0].revents != 0) accept(listener);
    }
  }

 private:
  static constexpr std::size_t kOthers = 3;

  void accept(int listener) {
    QVDescriptor connection(::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    // Others are not even waited for.
    if (!connection.isOpen() || !isTrusted(connection.get())) return;
    // Whoever has been silent for the longest time has the least to say.
    if (waiting_.size() == kMostConnections) waiting_.erase(waiting_.begin());
    waiting_.push_back(std::move(connection));
  }

  // Does what that one wants; whether that was the session's end.
  bool isLast(std::size_t index) {
    using Request = QVSessionKeeper::Request;
    const QVDescriptor connection = std::move(waiting_[index]);
    waiting_.erase(waiting_.begin() + static_cast<std::ptrdiff_t>(index));
    char request = 0;
    if (::recv(connection.get(), &request, 1, 0) != 1) return false;
    const bool isEnd = request == static_cast<char>(Request::destroy);
    if (!isEnd && request != static_cast<char>(Request::stop)) return false;
    send(connection.get(), carryOut(service_, reporterID_, static_cast<Request>(request)));
    return isEnd;
  }

  QVServiceConnection& service_;
  const int64_t reporterID_;
  std::vector<QVDescriptor> waiting_;  // in the order they came
};

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

void QVSessionKeeper::start(const QVSessionSetup& setup, bool startSession,
                            const std::function<void(const Kept& kept)>& tell) const {
  std::array<int, 2> ends{-1, -1};
  if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
    throw QVToolFailure::ofSystem("a socket", errno);
  }
  QVDescriptor own(ends[0]);
  QVDescriptor keepers(ends[1]);
  const pid_t creator = ::getpid();
  const pid_t keeper = ::fork();
  if (keeper < 0) throw QVToolFailure::ofSystem("a process", errno);
  if (keeper == 0) {
    dependOn(creator);
    keep(setup, startSession, keepers.get());
  }
  keepers = QVDescriptor();
  try {
    const Answer answer = receive(own.get());
    if (answer.status != QVToolStatus::done) throw QVToolFailure(answer.status, answer.text);
    tell({std::stoll(answer.text), keeper});
  } catch (...) {
    own = QVDescriptor();
    ::waitpid(keeper, nullptr, 0);
    throw;
  }
  ::send(own.get(), &kHandOver, 1, MSG_NOSIGNAL);
  // Until then it would end with this process.
  receive(own.get());
}

void QVSessionKeeper::keep(const QVSessionSetup& setup, bool startSession, int creator) const {
  closeInherited(creator);
  try {
    const QVDescriptor lost(::eventfd(0, EFD_CLOEXEC));
    QVServiceConnection service(places_, [&lost] { ::eventfd_write(lost.get(), 1); });
    const int64_t session = setup.create(service);
    const QVDescriptor listener = listenFor(session);
    if (startSession) {
      service.ask(&QVClient::startReportingSessionForIDAndWait, session, nullptr);
    }
    // Once others know of the keeper, a signal ends the session with it.
    const QVSignals signals{SIGINT, SIGTERM};
    send(creator, {QVToolStatus::done, std::to_string(session)});
    if (isHandedOver(creator)) {
      detach();
      Requests(service, session).serve(listener.get(), lost.get(), signals);
    } else {
      carryOut(service, session, Request::destroy);
    }
  } catch (const QVToolFailure& failure) {
    send(creator, {failure.status(), failure.what()});
    ::_exit(static_cast<int>(failure.status()));
  } catch (const std::exception& failure) {
    send(creator, {QVToolStatus::failed, failure.what()});
    ::_exit(static_cast<int>(QVToolStatus::failed));
  }
  ::_exit(static_cast<int>(QVToolStatus::done));
}

QVDescriptor QVSessionKeeper::listenFor(int64_t reporterID) const {
  const sockaddr_un place = address(reporterID);
  QVDescriptor listener = makeSocket();
  if (::bind(listener.get(), reinterpret_cast<const sockaddr*>(&place), sizeof place) == 0 &&
      ::listen(listener.get(), kBacklog) == 0) {
    return listener;
  }
  const int number = errno;
  const QVDescriptor taken = makeSocket();
  if (number == EADDRINUSE && connectTo(taken.get(), place) && !isTrusted(taken.get())) {
    throw QVToolFailure(QVToolStatus::notPermitted,
                        QVText("the user ", userOf(taken.get()),
                               " has taken the place of the keeper of session ", reporterID));
  }
  throw QVToolFailure::ofSystem(QVText("the place of the keeper of session ", reporterID), number);
}

void QVSessionKeeper::ask(int64_t reporterID, Request request) const {
  const QVDescriptor connection = makeSocket();
  waitFor(connection.get(), patience_);
  if (!connectTo(connection.get(), address(reporterID))) {
    // Its own, or one of somebody who has taken the name.
    if (errno == EAGAIN) {
      throw QVToolFailure(QVToolStatus::notRunning,
                          QVText("the keeper of session ", reporterID,
                                 " does not answer: it does not take connections"));
    }
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
