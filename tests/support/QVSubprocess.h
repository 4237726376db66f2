#pragma once

#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

// A child process. Killed and collected when the object goes, so that nothing is left behind.
//
// Threads: one at a time.
class QVSubprocess {
 public:
  struct Options {
    std::vector<std::string> arguments;  // the first one is the program, looked up in PATH
    std::map<std::string, std::string> environment = {};  // over the caller's own
    std::string standardOutputFile = {};                  // empty: the caller's own
    std::string standardErrorFile = {};                   // empty: the caller's own
    int inheritedDescriptor = -1;  // becomes the child's descriptor 3, with LISTEN_FDS=1
  };

  // How a process ended: its exit status, or -N for signal N.
  using Status = int;

  explicit QVSubprocess(const Options& options);
  ~QVSubprocess();
  QVSubprocess(const QVSubprocess&) = delete;
  QVSubprocess& operator=(const QVSubprocess&) = delete;

  pid_t pid() const { return pid_; }
  // Becomes readable when the process ends.
  int endDescriptor() const { return pidDescriptor_; }
  void signal(int number) const;
  // Waits for the end; nothing if it has not come within `limit`.
  std::optional<Status> wait(std::chrono::milliseconds limit);

  struct Output {
    Status status;
    std::string text;  // standard output and standard error
  };
  // Runs a program to its end and answers what it wrote; a program that takes longer than `limit`
  // is killed.
  static Output run(const std::vector<std::string>& arguments,
                    std::chrono::milliseconds limit = std::chrono::seconds(60));

  // For whoever forks in another way: turns the child into the program, with those variables over
  // the caller's own; and reads what waitpid() says of it.
  [[noreturn]] static void execute(const std::vector<std::string>& arguments,
                                   const std::map<std::string, std::string>& environment);
  static Status statusOf(int raw);

 private:
  pid_t pid_ = -1;
  int pidDescriptor_ = -1;
  std::optional<Status> status_;
};
