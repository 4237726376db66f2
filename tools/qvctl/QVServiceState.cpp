#include "tools/qvctl/QVServiceState.h"

#include "tools/qvctl/QVProcessTable.h"
#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVUnixSockets.h"

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <set>

#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr const char* kServiceName = "quietvoxd";

bool isService(pid_t pid) {
  return QVProcessTable::name(pid) == kServiceName;
}

// The service among those that hold the listening socket, whose file is `owner`'s; its manager may
// hold it as well.
void findService(const std::vector<pid_t>& listeners, const std::vector<pid_t>& hidden, uid_t owner,
                 QVServiceState& state) {
  using Kind = QVServiceState::Kind;
  const auto seen = std::ranges::find_if(listeners, isService);
  if (seen != listeners.end()) {
    state.pid = *seen;
  } else {
    // One that may not be looked into is the one, if it is its owner's and there is no other. Of
    // what a manager has made and given to nobody, any of them may be.
    std::vector<pid_t> called;
    std::ranges::copy_if(hidden, std::back_inserter(called), isService);
    std::vector<pid_t> candidates;
    std::ranges::copy_if(called, std::back_inserter(candidates),
                         [owner](pid_t pid) { return QVProcessTable::user(pid) == owner; });
    const bool isAnybodys = owner == 0 && candidates.empty() && !called.empty();
    if (candidates.size() == 1) state.pid = candidates[0];
    if ((candidates.size() > 1 || isAnybodys) && !state.isRunning()) state.kind = Kind::unknown;
  }
  if (state.pid == 0) return;
  state.kind = Kind::running;
  state.since = QVProcessTable::startTime(state.pid);
}

}  // namespace

const char* QVServiceState::word() const {
  switch (kind) {
    case Kind::stopped:
      return "not running";
    case Kind::onDemand:
      return "not running, starts on demand";
    case Kind::running:
      return "running";
    case Kind::unreachable:
      return "cannot be reached";
    default:
      return "unknown";
  }
}

std::string QVServiceState::complaint(const QVToolPlaces& places) const {
  if (kind == Kind::unreachable) {
    return "the service cannot be reached: " + places.socketProblem();
  }
  std::string text = "the service is not running";
  if (kind == Kind::unknown) text = "whether the service runs is not to be seen";
  return text.append(" (").append(places.socket.string()).append(")");
}

QVServiceState QVServiceState::find(const QVToolPlaces& places) {
  QVServiceState state;
  if (!places.socketProblem().empty()) {
    state.kind = Kind::unreachable;
    return state;
  }
  struct stat file {};
  if (::stat(places.socket.c_str(), &file) != 0) {
    if (errno == EACCES) throw QVToolFailure::ofFile(places.socket, W_OK, errno);
    state.kind = Kind::stopped;
    return state;
  }
  const auto sockets = QVListUnixSockets();
  if (!sockets) return state;
  std::set<uint32_t> wanted;
  std::vector<QVUnixSocket> connections;
  uint32_t listener = 0;
  for (const QVUnixSocket& socket : *sockets) {
    // The kernel tells the lower half of an inode's number.
    const bool isHere =
        socket.fileDevice == file.st_dev && socket.fileInode == static_cast<uint32_t>(file.st_ino);
    if (!isHere) continue;
    if (socket.isListening) {
      listener = socket.inode;
      wanted.insert(listener);
    } else if (socket.inode != 0) {
      connections.push_back(socket);
      wanted.insert(socket.peer);
    }
  }
  state.kind = listener == 0 ? Kind::stopped : Kind::onDemand;
  if (state.kind == Kind::stopped) return state;
  if (!connections.empty()) state.kind = Kind::running;
  std::vector<pid_t> hidden;
  const auto holders = QVProcessTable::holders(wanted, hidden);
  const auto listening = holders.find(listener);
  findService(listening == holders.end() ? std::vector<pid_t>() : listening->second, hidden,
              file.st_uid, state);
  if (state.kind == Kind::unknown && ::access(places.socket.c_str(), W_OK) != 0) {
    throw QVToolFailure::ofFile(places.socket, W_OK, errno);
  }
  for (const QVUnixSocket& connection : connections) {
    const auto holder = holders.find(connection.peer);
    // A client that has gone since, or whose end is closed.
    if (connection.peer == 0 || (holder == holders.end() && hidden.empty())) continue;
    const pid_t pid = holder == holders.end() ? 0 : holder->second.front();
    state.clients.push_back({pid, pid == 0 ? std::string() : QVProcessTable::name(pid)});
  }
  return state;
}
