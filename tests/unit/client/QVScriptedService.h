#pragma once

#include "client/QVClient.h"
#include "platform/linux/bus/QVBusAuthServer.h"
#include "platform/linux/bus/QVBusFrameDecoder.h"
#include "platform/linux/bus/QVBusReader.h"
#include "platform/linux/bus/QVBusWriter.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/socket.h>

// The other end of a client's connection, which says what the test tells it to.
//
// Threads: the test's. Waits for the client with a generous limit, which only fails the test.
class QVScriptedService {
 public:
  // A call as it came in.
  struct Call {
    std::string path, interface, member, signature, body;
    uint32_t serial = 0;
    bool answerWanted = true;

    QVBusReader reader() const { return {body, false}; }
  };

  // With SOCK_SEQPACKET the client's writes stay apart: each is one read here.
  explicit QVScriptedService(int socketType = SOCK_STREAM);
  // Serves a client that connected to a listening socket.
  static std::unique_ptr<QVScriptedService> accepted(int socket);
  ~QVScriptedService();
  QVScriptedService(const QVScriptedService&) = delete;
  QVScriptedService& operator=(const QVScriptedService&) = delete;

  // A client at the other end.
  std::unique_ptr<QVClient> connectClient(QVClientOptions options = {});
  // The same with a poll loop, let in already.
  std::unique_ptr<QVClient> connectLoopClient(QVClientOptions options = {});

  // Reads the client's opening and answers it.
  void letIn();
  // What the client wrote at once; waits for it.
  std::string read();
  // The next call; waits for it. Without a member where the client hung up.
  Call nextCall();
  // The calls that have come in; does not wait.
  std::vector<Call> callsSoFar();

  void answer(const Call& call);
  void answer(const Call& call, std::string_view signature,
              const std::function<void(QVBusWriter&)>& write);
  void answerBoolean(const Call& call, bool value = true);
  void refuse(const Call& call, std::string_view name, std::string_view text);
  void send(std::string_view bytes);
  void hangUp();

 private:
  explicit QVScriptedService(int clientSocket, int ownSocket)
      : clientSocket_(clientSocket), socket_(ownSocket) {}
  bool receive(bool wait, std::string& bytes);
  void take(std::string_view bytes);

  int clientSocket_ = -1;
  int socket_ = -1;
  QVBusAuthServer authentication_{static_cast<uint32_t>(ownUserID()), std::string(32, '0')};
  QVBusFrameDecoder frames_;
  std::deque<Call> calls_;
  uint32_t lastSerial_ = 0;
  // Larger than any one write that a test looks at.
  std::vector<char> buffer_ = std::vector<char>(std::size_t{256} << 10);

  static uint32_t ownUserID();
};

// For suites that hold for both kinds of callback threads.
inline const auto kBothCallbackThreads =
    testing::Values(QVClientOptions::Callbacks::ownThread, QVClientOptions::Callbacks::pollLoop);
std::string nameOfCallbackThread(
    const testing::TestParamInfo<QVClientOptions::Callbacks>& parameter);

// Waits until the client's descriptor is readable, and dispatches once.
void dispatchWhenReadable(QVClient& client);
// Is there something for the client to do right now?
bool isReadable(const QVClient& client);
