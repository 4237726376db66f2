#pragma once

#include "tests/support/QVSubprocess.h"

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

// A program on a terminal of its own, as somebody sits before it: a pseudo-terminal, whose other
// end the test reads and types on.
//
// Threads: one at a time. The program is killed and collected with the object.
class QVTerminal {
 public:
  struct Options {
    std::vector<std::string> arguments;  // the first one is the program, looked up in PATH
    std::map<std::string, std::string> environment = {};  // over the caller's own
    unsigned short columns = 100;
    unsigned short rows = 40;
  };

  explicit QVTerminal(const Options& options);
  ~QVTerminal();
  QVTerminal(const QVTerminal&) = delete;
  QVTerminal& operator=(const QVTerminal&) = delete;

  pid_t pid() const { return pid_; }
  void signal(int number) const;
  // What is typed; "\x03" interrupts.
  void type(std::string_view text) const;
  // Waits until the program has shown the text; false where it has not within a minute.
  [[nodiscard]] bool await(std::string_view text);
  // Waits for the program's end, reading what it shows; nothing where it does not end in a minute.
  std::optional<QVSubprocess::Status> wait();
  // Everything that it has shown so far; lines end in "\r\n".
  const std::string& shown() const { return shown_; }

 private:
  // Reads what is there, or waits for it; false at the end, and after a minute.
  bool read();

  pid_t pid_ = -1;
  int terminal_ = -1;
  std::optional<QVSubprocess::Status> status_;
  std::string shown_;
};
