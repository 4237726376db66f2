#pragma once

#include "tests/support/QVSubprocess.h"

#include <chrono>
#include <optional>
#include <string>
#include <vector>

// A driver process that publishes counters, one to begin with, and counts when it is asked to: the
// example driver of the client library, told what to do through a socket.
//
// Threads: one at a time. Ended with the object; its file stays then.
class QVDriverProcess {
 public:
  // Publishes the file and waits until it is there. `options` are the program's own. Throws where
  // that fails.
  explicit QVDriverProcess(const std::string& file, const std::vector<std::string>& options = {});
  ~QVDriverProcess();
  QVDriverProcess(const QVDriverProcess&) = delete;
  QVDriverProcess& operator=(const QVDriverProcess&) = delete;

  // Lets every counter grow by a step.
  void count();
  // Ends in good order, without the file; the exit status.
  std::optional<QVSubprocess::Status> end();
  void signal(int number) const { process_->signal(number); }
  std::optional<QVSubprocess::Status> wait() { return process_->wait(std::chrono::seconds(60)); }

 private:
  // The next line that the process writes.
  std::string nextLine() const;

  int socket_ = -1;
  std::optional<QVSubprocess> process_;
};
