#include "tools/qvctl/QVToolOutput.h"

#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVEnvironment.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>
#include <cstdio>

#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

// Bytes that are collected before they are written.
constexpr std::size_t kBufferBytes = std::size_t{64} * 1024;

bool wantsColours() {
  return QVEnvironment("NO_COLOR").empty() && QVEnvironment("TERM") != "dumb";
}

const char* codeOf(QVToolOutput::Style style) {
  switch (style) {
    case QVToolOutput::Style::title:
      return "\033[1m";
    case QVToolOutput::Style::dim:
      return "\033[2m";
    case QVToolOutput::Style::good:
      return "\033[32m";
    case QVToolOutput::Style::bad:
      return "\033[31m";
    default:
      return "";
  }
}

}  // namespace

QVToolOutput::QVToolOutput(bool json, int descriptor)
    : isJSON_(json),
      descriptor_(descriptor),
      isTerminal_(::isatty(descriptor) == 1),
      isColoured_(isTerminal_ && !json && wantsColours()) {}

QVToolOutput::~QVToolOutput() {
  try {
    flush();
  } catch (...) {
    // Whoever cares has called flush().
  }
}

std::size_t QVToolOutput::columns() const {
  winsize size{};
  if (!isTerminal_ || ::ioctl(descriptor_, TIOCGWINSZ, &size) != 0) return 0;
  return size.ws_col;
}

std::string QVToolOutput::painted(Style style, std::string_view text) const {
  if (!isColoured_ || style == Style::plain || text.empty()) return std::string(text);
  std::string painted = codeOf(style);
  return painted.append(text).append("\033[0m");
}

void QVToolOutput::line(std::string_view text) {
  waiting_.append(text).push_back('\n');
  if (waiting_.size() >= kBufferBytes) flush();
}

void QVToolOutput::json(const QVValue& value) {
  line(QVDisplayJSON(jsonText_.write(value)));
}

void QVToolOutput::raw(std::string_view bytes) {
  waiting_.append(bytes);
  if (waiting_.size() >= kBufferBytes) flush();
}

void QVToolOutput::flush() {
  std::string bytes;
  bytes.swap(waiting_);
  std::string_view rest = bytes;
  while (!rest.empty()) {
    const ssize_t count = ::write(descriptor_, rest.data(), rest.size());
    if (count >= 0) {
      rest.remove_prefix(static_cast<std::size_t>(count));
    } else if (errno == EPIPE) {
      throw QVReaderGone();
    } else if (errno == EAGAIN) {
      // Whoever shares the descriptor has made it non-blocking; that is theirs to change.
      pollfd entry{descriptor_, POLLOUT, 0};
      ::poll(&entry, 1, -1);
    } else if (errno != EINTR) {
      throw QVToolFailure::ofSystem("standard output", errno);
    }
  }
}

void QVToolOutput::note(std::string_view text) {
  std::string line = "qvctl: ";
  line.append(QVDisplayText(text)).push_back('\n');
  std::fwrite(line.data(), 1, line.size(), stderr);
}
