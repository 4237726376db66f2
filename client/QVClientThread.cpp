#include "client/QVClientThread.h"

#include <csignal>
#include <new>
#include <string>
#include <system_error>
#include <utility>

namespace {

// Blocks all signals of the calling thread while it lives, whatever is thrown meanwhile.
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

}  // namespace

QVClientError QVClientStartThread(std::thread& thread, std::function<void()> body) {
  using Code = QVClientError::Code;
  const SignalsBlocked signalsBlocked;
  try {
    thread = std::thread(std::move(body));
  } catch (const std::system_error& problem) {
    return {Code::cannotConnect, std::string("no thread for the library: ") + problem.what()};
  } catch (const std::bad_alloc&) {
    return {Code::outOfMemory, QVClientError::textOf(Code::outOfMemory)};
  }
  return {};
}
