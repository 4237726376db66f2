#include "client/QVClientThread.h"

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <memory>
#include <new>
#include <string>
#include <system_error>
#include <utility>

#include <sched.h>

namespace {

// Bytes. The library itself needs a tenth; callbacks of the program's run here as well.
constexpr std::size_t kStackBytes = std::size_t{512} << 10;

// Blocks all signals of the calling thread while it lives.
class SignalsBlocked {
 public:
  SignalsBlocked() {
    sigset_t every;
    sigfillset(&every);
    pthread_sigmask(SIG_SETMASK, &every, &before_);
  }
  ~SignalsBlocked() { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
  SignalsBlocked(const SignalsBlocked&) = delete;
  SignalsBlocked& operator=(const SignalsBlocked&) = delete;

 private:
  sigset_t before_;
};

using Body = std::function<void()>;

void* run(void* given) {
  const std::unique_ptr<Body> body(static_cast<Body*>(given));
  pthread_setname_np(pthread_self(), "quietvox");
  // An audio thread may have made this one. That it is not to be had is no reason not to run.
  const int policy = sched_getscheduler(0) & ~SCHED_RESET_ON_FORK;
  if (policy == SCHED_FIFO || policy == SCHED_RR) {
    const sched_param ordinary{};
    static_cast<void>(pthread_setschedparam(pthread_self(), SCHED_OTHER, &ordinary));
  }
  (*body)();
  return nullptr;
}

int create(pthread_t& thread, std::size_t stackBytes, Body& body) {
  pthread_attr_t attributes;
  int error = pthread_attr_init(&attributes);
  if (error != 0) return error;
  if (stackBytes != 0) static_cast<void>(pthread_attr_setstacksize(&attributes, stackBytes));
  error = pthread_create(&thread, &attributes, run, &body);
  pthread_attr_destroy(&attributes);
  return error;
}

}  // namespace

QVClientError QVClientThread::start(Body body) {
  using Code = QVClientError::Code;
  const SignalsBlocked signalsBlocked;
  try {
    auto given = std::make_unique<Body>(std::move(body));
    int error = create(thread_, kStackBytes, *given);
    // What all threads of the program have of their own lies on the stack: it may be too small.
    if (error == EINVAL) error = create(thread_, 0, *given);
    if (error != 0) {
      return {Code::cannotConnect,
              "no thread for the library: " + std::generic_category().message(error)};
    }
    static_cast<void>(given.release());
    isJoinable_ = true;
    return {};
  } catch (const std::bad_alloc&) {
    return {Code::outOfMemory, QVClientError::textOf(Code::outOfMemory)};
  }
}

void QVClientThread::join() {
  pthread_join(thread_, nullptr);
  isJoinable_ = false;
}

void QVClientThread::detach() {
  pthread_detach(thread_);
  isJoinable_ = false;
}
