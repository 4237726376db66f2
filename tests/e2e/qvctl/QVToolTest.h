#pragma once

#include "platform/QVValue.h"
#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVTerminal.h"

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <sys/un.h>

// qvctl in a temporary root of its own, with the real service there when a test asks for it.
//
// Threads: the test's.
class QVToolTest : public QVEndToEndTest {
 protected:
  struct Output {
    QVSubprocess::Status status = -1;
    std::string out;
    std::string error;
  };
  using Arguments = std::vector<std::string>;

  // Runs qvctl to its end; `wrapper` is a program that turns itself into it.
  Output qvctl(const Arguments& arguments, const Arguments& wrapper = {}) const;
  // The same, which has to succeed; what it printed.
  std::string run(const Arguments& arguments) const;
  // The same with --json: the value of its one line, or of each line.
  QVValue json(Arguments arguments) const;
  std::vector<QVValue> jsonLines(Arguments arguments) const;
  // The values of JSON text's lines; a line that is none fails the test.
  static std::vector<QVValue> parseLines(const std::string& text);

  // qvctl on a terminal.
  std::unique_ptr<QVTerminal> terminal(
      const Arguments& arguments, const std::map<std::string, std::string>& environment = {}) const;
  // The same, to its end, which has to be a success; what it showed.
  std::string show(const Arguments& arguments,
                   const std::map<std::string, std::string>& environment = {}) const;

  static Arguments command(const Arguments& arguments);
  // Where everything is, as the service is told it.
  std::map<std::string, std::string> environment() const;
  // A value within dictionaries; absent where there is none.
  static QVValue at(const QVValue& value, const std::vector<std::string>& keys);
  // A program that turns itself into another one without root's right to pass over file modes.
  static Arguments withoutPrivilege();

  // A socket in the place of the service's, with nobody behind it who would answer: what connects
  // waits. The caller closes it.
  int listenInstead() const;
  // A connection to it that has been accepted, as if somebody served there.
  struct Connection {
    int client = -1;
    int accepted = -1;
  };
  Connection connectTo(int listener) const;
  sockaddr_un socketAddress() const;

  // This program's own connection to the service.
  QVPeerClient& client();
  // A session of it, of that service type, started.
  void startSession(int64_t reporterID, uint16_t serviceType,
                    const QVDictionary& configuration = {});

  std::optional<QVPeerClient> client_;
};
