#include "bench/service/QVTwoThreadHop.h"

#include <condition_variable>
#include <mutex>
#include <thread>

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

void QVTwoThreadHop::serve(int descriptor) {
  const int answers = ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  std::mutex mutex;
  std::condition_variable arrived;
  bool pending = false;
  bool ended = false;
  std::thread worker([&] {
    std::unique_lock lock(mutex);
    for (;;) {
      arrived.wait(lock, [&] { return pending || ended; });
      if (ended) return;
      pending = false;
      ::eventfd_write(answers, 1);
    }
  });
  pollfd events[] = {{descriptor, POLLIN, 0}, {answers, POLLIN, 0}};
  // Requests and answers are of the size of a small call and its reply.
  char request[256];
  const char answer[64] = {};
  while (::poll(events, 2, -1) > 0) {
    if (events[1].revents != 0) {
      eventfd_t count = 0;
      ::eventfd_read(answers, &count);
      if (::send(descriptor, answer, sizeof answer, MSG_NOSIGNAL) < 0) break;
    }
    if (events[0].revents != 0) {
      if (::recv(descriptor, request, sizeof request, 0) <= 0) break;
      const std::lock_guard lock(mutex);
      pending = true;
      arrived.notify_one();
    }
  }
  {
    const std::lock_guard lock(mutex);
    ended = true;
    arrived.notify_one();
  }
  worker.join();
  ::close(answers);
}
