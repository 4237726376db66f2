#include "client/QVClientThread.h"

#include <csignal>
#include <string>
#include <system_error>
#include <utility>

QVClientError QVClientStartThread(std::thread& thread, std::function<void()> body) {
  sigset_t every;
  sigset_t before;
  sigfillset(&every);
  pthread_sigmask(SIG_SETMASK, &every, &before);
  QVClientError error;
  try {
    thread = std::thread(std::move(body));
  } catch (const std::system_error& problem) {
    error = {QVClientError::Code::cannotConnect,
             std::string("no thread for the library: ") + problem.what()};
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  return error;
}
