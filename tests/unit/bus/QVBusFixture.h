#pragma once

#include "platform/fake/QVFakePlatform.h"
#include "platform/linux/bus/QVBusConnection.h"
#include "platform/linux/bus/QVBusLoop.h"
#include "platform/linux/bus/QVBusServer.h"
#include "tests/support/QVTestMessage.h"
#include "tests/unit/bus/QVRecordingService.h"

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

// One answer of the service, as a peer reads it.
struct QVBusAnswer {
  uint32_t replySerial;
  std::string error;  // its name; "" for a method return
  std::string signature;
  std::string body;

  std::string text() const;  // the body, a string
  bool boolean() const;      // the body, a boolean
  bool operator==(const QVBusAnswer&) const = default;
};

// A peer on the other end of a connection's socket, that sends whatever it is told to. Never
// blocks.
class QVBusPeer {
 public:
  explicit QVBusPeer(int descriptor) : descriptor_(descriptor) {}
  ~QVBusPeer() { hangUp(); }
  QVBusPeer(const QVBusPeer&) = delete;
  QVBusPeer& operator=(const QVBusPeer&) = delete;

  void send(std::string_view bytes);
  // As much as goes; answers how much that was.
  std::size_t sendSome(std::string_view bytes);
  // Everything that has come and not been received before.
  std::string receive();
  // The same, cut into answers.
  std::vector<QVBusAnswer> receiveAnswers();
  // Has the service closed its end, and nothing is left to be read?
  bool isClosed();
  void hangUp();

  // What lets a peer in.
  static std::string authentication();

 private:
  int descriptor_;
};

// A server on a loop that runs when it is told to, with peers over socket pairs. What happens to
// connections and their exported objects goes to `journal`.
class QVBusFixture : public testing::Test {
 protected:
  static constexpr std::size_t kSmallBound = 10000;

  // A connected peer with its connection; `n` counts from 1. `authenticated` peers are ready for
  // messages.
  QVBusPeer& connect(bool authenticated = true);
  // The connection alone, with nothing set, of one more peer.
  std::shared_ptr<QVBusConnection> accept();
  QVBusPeer& peer(std::size_t n = 1) { return *peers_.at(n - 1); }
  QVRecordingService& service(std::size_t n = 1) { return *services_.at(n - 1); }
  // Runs the loop until nothing is left to be done.
  void run();
  // Sends, runs, receives.
  std::vector<QVBusAnswer> exchange(std::string_view bytes, std::size_t n = 1);
  QVBusAnswer call(const QVTestMessage& message, std::size_t n = 1);
  void makeServer(std::size_t intakeBound);
  // The texts of the log's lines.
  std::vector<std::string> logged();

  QVFakePlatform platform_;
  std::vector<std::string> journal_;
  QVBusLoop loop_;
  std::unique_ptr<QVBusServer> server_ = std::make_unique<QVBusServer>(loop_);
  std::vector<std::shared_ptr<QVRecordingService>> services_;
  std::vector<std::unique_ptr<QVBusPeer>> peers_;
};
