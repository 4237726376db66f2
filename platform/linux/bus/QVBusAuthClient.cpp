#include "platform/linux/bus/QVBusAuthClient.h"

#include "platform/linux/bus/QVBusHexadecimal.h"

namespace {

// Bytes. "OK" with a server ID takes 37.
constexpr std::size_t kLongestAnswer = 256;

}  // namespace

std::string QVBusAuthClient::opening(uint32_t userID) {
  std::string text(1, '\0');
  return text.append("AUTH EXTERNAL ")
      .append(QVBusToHexadecimal(std::to_string(userID)))
      .append("\r\nBEGIN\r\n");
}

std::size_t QVBusAuthClient::feed(std::string_view bytes) {
  if (state_ != State::waitingForAnswer) return state_ == State::done ? 0 : bytes.size();
  const std::size_t lineEnd = bytes.find('\n');
  line_.append(bytes.substr(0, lineEnd));
  if (line_.size() > kLongestAnswer) {
    state_ = State::failed;
  } else if (lineEnd != std::string_view::npos) {
    const bool accepted = line_.ends_with('\r') && (line_.starts_with("OK ") || line_ == "OK\r");
    state_ = accepted ? State::done : State::failed;
    if (accepted) return lineEnd + 1;
  }
  return bytes.size();
}
