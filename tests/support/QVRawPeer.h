#pragma once

#include "platform/linux/bus/QVBusFrameDecoder.h"
#include "tests/support/QVPeerCall.h"
#include "tests/support/QVPeerMessage.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

// A client of the service's socket that sends whatever bytes a test gives it, well-formed or not.
//
// Blocks until what it waits for has come; throws where that takes longer than a minute, so that a
// service that does not answer fails the test instead of hanging it.
//
// Threads: one at a time.
class QVRawPeer {
 public:
  enum class Opening { authenticated, silent };

  explicit QVRawPeer(const std::filesystem::path& socket, Opening opening = Opening::authenticated);
  ~QVRawPeer() { close(); }
  QVRawPeer(const QVRawPeer&) = delete;
  QVRawPeer& operator=(const QVRawPeer&) = delete;

  // The lines that open a connection as this process's user, the last one included.
  static std::string opening();

  // Sends all of it; false where the service has closed the connection.
  bool send(std::string_view bytes);
  // Sends what goes without waiting and answers how much that was.
  std::size_t sendWithoutWaiting(std::string_view bytes);
  // Sends all of it together with a descriptor.
  bool sendWithDescriptor(std::string_view bytes, int descriptor);
  // No more bytes will come from here; those of the service still can.
  void finishSending() const;
  void close();

  // One line of the exchange before the first message, without its end; empty where the service
  // has closed the connection.
  std::string receiveLine();
  // The next message; nothing where the service has closed the connection.
  std::optional<QVPeerMessage> receive();
  // Reads until the service closes the connection.
  void awaitClose();

  // Sends a call and answers its serial.
  uint32_t post(const QVPeerCall& call);
  // The reply with that serial. Messages that come before it are kept.
  QVPeerMessage awaitReply(uint32_t serial);
  QVPeerMessage call(const QVPeerCall& call) { return awaitReply(post(call)); }
  // A reply that came already, without waiting.
  std::optional<QVPeerMessage> takeReply(uint32_t serial);

  uint32_t nextSerial() { return ++serial_; }
  int descriptor() const { return descriptor_; }

 private:
  bool receiveBytes();

  int descriptor_;
  uint32_t serial_ = 0;
  std::string bytes_;  // received, not yet fed to the decoder
  std::string fed_;    // what the decoder's messages may refer to
  QVBusFrameDecoder decoder_;
  std::deque<QVPeerMessage> kept_;
};
