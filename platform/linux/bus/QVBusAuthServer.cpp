#include "platform/linux/bus/QVBusAuthServer.h"

#include "platform/linux/bus/QVBusHexadecimal.h"

namespace {

// Bytes of a line. Ours are far shorter; initial responses of other mechanisms may be longer.
constexpr std::size_t kLongestLine = 4096;

// Refusals to one peer. An honest one needs a few: its other mechanisms, an extension.
constexpr unsigned kMostRefusals = 16;

constexpr std::string_view kRejected = "REJECTED EXTERNAL";

// Splits the first word off `line`; what remains are its arguments.
std::string_view takeWord(std::string_view& line) {
  const std::size_t blank = line.find(' ');
  const auto word = line.substr(0, blank);
  line.remove_prefix(blank == std::string_view::npos ? line.size() : blank + 1);
  return word;
}

}  // namespace

QVBusAuthServer::QVBusAuthServer(uint32_t userID, std::string_view serverID)
    : userIDText_(std::to_string(userID)), serverID_(serverID) {}

std::size_t QVBusAuthServer::feed(std::string_view bytes, std::string& out) {
  std::size_t taken = 0;
  if (state_ == State::start && !bytes.empty()) {
    if (bytes.front() != 0) {
      fail("authentication does not begin with NUL");
    } else {
      state_ = State::waitingForAuth;
    }
    taken = 1;
  }
  while (taken < bytes.size() && state_ != State::done && state_ != State::failed) {
    const std::size_t lineEnd = bytes.find('\n', taken);
    const std::size_t end = lineEnd == std::string_view::npos ? bytes.size() : lineEnd + 1;
    if (line_.size() + (end - taken) > kLongestLine) {
      fail("line of authentication too long");
      break;
    }
    line_.append(bytes.substr(taken, end - taken));
    taken = end;
    if (lineEnd == std::string_view::npos) break;
    if (!line_.ends_with("\r\n")) {
      fail("line of authentication not ended by CR LF");
      break;
    }
    takeLine(std::string_view(line_).substr(0, line_.size() - 2), out);
    line_.clear();
  }
  return state_ == State::done ? taken : bytes.size();
}

void QVBusAuthServer::takeLine(std::string_view line, std::string& out) {
  auto arguments = line;
  const auto command = takeWord(arguments);
  if (command == "AUTH" && state_ == State::waitingForAuth) {
    takeAuth(arguments, out);
  } else if (command == "DATA" && state_ == State::waitingForData) {
    takeIdentity(arguments, out);
  } else if (command == "BEGIN") {
    if (state_ == State::waitingForBegin) {
      state_ = State::done;
    } else {
      fail("BEGIN before authentication");
    }
  } else if (command == "ERROR" || (command == "CANCEL" && state_ != State::waitingForAuth)) {
    reject(out);
  } else if (command == "NEGOTIATE_UNIX_FD" && state_ == State::waitingForBegin) {
    refuse("ERROR file descriptors are not taken", out);
  } else {
    refuse("ERROR", out);
  }
}

void QVBusAuthServer::takeAuth(std::string_view arguments, std::string& out) {
  const bool withResponse = arguments.find(' ') != std::string_view::npos;
  const auto mechanism = takeWord(arguments);
  if (mechanism != "EXTERNAL") {
    reject(out);
  } else if (withResponse) {
    takeIdentity(arguments, out);
  } else {
    state_ = State::waitingForData;
    out += "DATA\r\n";
  }
}

// An empty identity means the one that the kernel tells.
void QVBusAuthServer::takeIdentity(std::string_view hexadecimal, std::string& out) {
  std::string identity;
  if (QVBusFromHexadecimal(hexadecimal, identity) &&
      (identity.empty() || identity == userIDText_)) {
    state_ = State::waitingForBegin;
    out += "OK " + serverID_ + "\r\n";
  } else {
    reject(out);
  }
}

void QVBusAuthServer::reject(std::string& out) {
  state_ = State::waitingForAuth;
  refuse(kRejected, out);
}

void QVBusAuthServer::refuse(std::string_view answer, std::string& out) {
  out.append(answer).append("\r\n");
  if (++refusals_ > kMostRefusals) fail("too many attempts to authenticate");
}

void QVBusAuthServer::fail(const char* reason) {
  state_ = State::failed;
  failure_ = reason;
}
