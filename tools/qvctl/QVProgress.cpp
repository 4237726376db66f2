#include "tools/qvctl/QVProgress.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include <unistd.h>

namespace {

// Nobody needs to be told of what is over before it can be read.
constexpr std::chrono::milliseconds kFirst{500};
constexpr std::chrono::milliseconds kEach{100};

}  // namespace

QVProgress::QVProgress(std::string text)
    : text_(std::move(text)),
      isTerminal_(::isatty(STDERR_FILENO) == 1),
      sharesTerminal_(::isatty(STDOUT_FILENO) == 1),
      next_(Clock::now() + kFirst) {}

void QVProgress::show(double part) {
  const auto now = Clock::now();
  if (!isTerminal_ || now < next_) return;
  next_ = now + kEach;
  isShown_ = true;
  const int percent = static_cast<int>(std::clamp(part, 0.0, 1.0) * 100);
  std::fprintf(stderr, "\r%s: %d %%", text_.c_str(), percent);
}

void QVProgress::makeRoom() {
  if (sharesTerminal_) clear();
}

void QVProgress::clear() {
  if (!std::exchange(isShown_, false)) return;
  std::fputs("\r\033[K", stderr);
}
