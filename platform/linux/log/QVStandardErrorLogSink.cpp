#include "platform/linux/log/QVStandardErrorLogSink.h"

#include "platform/QVText.h"

#include <algorithm>
#include <cerrno>
#include <string>

#include <limits.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Text that is collected for one write; more would only cost memory.
constexpr std::size_t kBatchBytes = std::size_t{64} * 1024;

// What a pipe that polls as writable takes without blocking, and a pipe's unit of atomicity.
constexpr std::size_t kPieceBytes = PIPE_BUF;

// How often a stuck destination is left to look whether the service is ending. Only while there is
// something to write that nobody takes.
constexpr int kLookUpMilliseconds = 250;

mode_t typeOf(int descriptor) {
  struct stat status {};
  return fstat(descriptor, &status) == 0 ? status.st_mode & S_IFMT : 0;
}

// The next bytes to write at once: whole lines as far as they fit.
std::string_view nextPiece(std::string_view text) {
  if (text.size() <= kPieceBytes) return text;
  const std::size_t end = text.rfind('\n', kPieceBytes - 1);
  return text.substr(0, end == std::string_view::npos ? kPieceBytes : end + 1);
}

}  // namespace

QVStandardErrorLogSink::QVStandardErrorLogSink(int descriptor)
    : descriptor_(descriptor),
      isSocket_(typeOf(descriptor) == S_IFSOCK),
      isFile_(typeOf(descriptor) == S_IFREG) {}

void QVAppendLogLine(std::string& out, const QVLogLine& line) {
  out += QVText('<', static_cast<int>(line.level), ">[", line.scopeName(), "] ", line.file, ':',
                line.line, ':', line.function, ": ");
  QVAppendLogText(out, line.text);
  out.push_back('\n');
}

void QVStandardErrorLogSink::write(std::span<const QVLogLine> lines,
                                   const std::atomic<bool>& giveUp) {
  std::string text;
  for (const QVLogLine& line : lines) {
    QVAppendLogLine(text, line);
    if (text.size() < kBatchBytes) continue;
    writeText(text, giveUp);
    text.clear();
  }
  writeText(text, giveUp);
}

void QVStandardErrorLogSink::writeText(std::string_view text,
                                       const std::atomic<bool>& giveUp) const {
  while (!text.empty() && waitUntilWritable(giveUp)) {
    const std::string_view piece = isFile_ ? text : nextPiece(text);
    const ssize_t written =
        isSocket_ ? send(descriptor_, piece.data(), piece.size(), MSG_DONTWAIT | MSG_NOSIGNAL)
                  : ::write(descriptor_, piece.data(), piece.size());
    if (written >= 0) {
      text.remove_prefix(static_cast<std::size_t>(written));
    } else if (errno != EINTR && errno != EAGAIN) {
      return;
    }
  }
}

// False where there is nothing to wait for any more.
bool QVStandardErrorLogSink::waitUntilWritable(const std::atomic<bool>& giveUp) const {
  while (!giveUp) {
    pollfd request{descriptor_, POLLOUT, 0};
    const int count = poll(&request, 1, kLookUpMilliseconds);
    // An error is for the write to find.
    if (count != 0 && !(count < 0 && errno == EINTR)) return true;
  }
  return false;
}
