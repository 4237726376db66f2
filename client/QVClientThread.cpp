#include "client/QVClientThread.h"

#include <csignal>
#include <cstddef>
#include <memory>
#include <new>
#include <span>
#include <string>
#include <system_error>
#include <utility>

#include <link.h>
#include <sched.h>

namespace {

// Bytes. The library itself needs a tenth; callbacks of the program's run here as well.
constexpr std::size_t kStackBytes = std::size_t{512} << 10;

// Bytes that every thread of the program has for its own at the end of its stack: thread-local
// variables of all that is loaded.
std::size_t threadLocalBytes() {
  std::size_t bytes = 0;
  const auto add = [](dl_phdr_info* object, std::size_t, void* sum) {
    for (const ElfW(Phdr) & part : std::span(object->dlpi_phdr, object->dlpi_phnum)) {
      if (part.p_type == PT_TLS) *static_cast<std::size_t*>(sum) += part.p_memsz + part.p_align;
    }
    return 0;
  };
  static_cast<void>(dl_iterate_phdr(add, &bytes));
  return bytes;
}

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

int create(pthread_t& thread, Body& body) {
  pthread_attr_t attributes;
  int error = pthread_attr_init(&attributes);
  if (error != 0) return error;
  static_cast<void>(pthread_attr_setstacksize(&attributes, kStackBytes + threadLocalBytes()));
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
    if (const int error = create(thread_, *given); error != 0) {
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
