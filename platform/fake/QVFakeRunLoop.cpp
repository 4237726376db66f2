#include "platform/fake/QVFakeRunLoop.h"

#include "platform/fake/QVFakeAbort.h"
#include "platform/fake/QVFakeRunLoopThread.h"

#include <algorithm>
#include <exception>
#include <string>
#include <utility>

namespace {

void require(bool fulfilled, const char* rule) {
  if (!fulfilled) QVFakeAbort(std::string("QVFakeRunLoop: wrong use: ").append(rule));
}

}  // namespace

void QVFakeRunLoop::attach(std::shared_ptr<QVRunLoopTimer> timer) {
  require(QVFakeRunLoopThread::current() == &thread_, "attach() on another thread");
  auto fake = std::dynamic_pointer_cast<QVFakeRunLoopTimer>(std::move(timer));
  require(fake != nullptr, "attach() of what is no fake timer");
  fake->attachTo(thread_.weak_from_this());
  attached_.push_back(std::move(fake));
}

void QVFakeRunLoop::run() {
  require(QVFakeRunLoopThread::current() == &thread_, "run() on another thread");
  require(!std::exchange(isRunning_, true), "run() from the action of a timer");
  while (!thread_.isEnding()) {
    const auto next = earliest();
    if (next == attached_.end()) break;
    const auto fireDate = (*next)->fireDate();
    if (fireDate && *fireDate > clock_.steadyTime()) {
      thread_.waitUntil(*fireDate);
    } else {
      const auto timer = std::move(*next);
      attached_.erase(next);
      fire(*timer);
    }
  }
  if (thread_.isEnding()) spendAll();
  isRunning_ = false;
}

std::vector<std::shared_ptr<QVFakeRunLoopTimer>>::iterator QVFakeRunLoop::earliest() {
  std::erase_if(attached_, [](const auto& timer) { return !timer->fireDate(); });
  return std::ranges::min_element(attached_, {}, [](const auto& timer) {
    // What another thread spends at this moment comes first and does nothing.
    return timer->fireDate().value_or(QVDuration::min());
  });
}

void QVFakeRunLoop::fire(QVFakeRunLoopTimer& timer) {
  auto action = timer.spend();
  if (!action) return;
  try {
    action();
  } catch (const std::exception& exception) {
    log_.error(nullptr, __func__, "exception in run loop ", thread_.name(), ": ", exception.what());
  } catch (...) {
    log_.error(nullptr, __func__, "exception in run loop ", thread_.name(), ": of unknown type");
  }
}

void QVFakeRunLoop::spendAll() {
  for (const auto& timer : std::exchange(attached_, {})) timer->spend();
}
