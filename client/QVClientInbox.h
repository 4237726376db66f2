#pragma once

#include "platform/linux/bus/QVBusAuthClient.h"
#include "platform/linux/bus/QVBusFrameDecoder.h"

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

// What the service sends: its answer to the authentication, then messages.
//
//   while ((reading = inbox.receive(socket)) ...) while (inbox.next(message)) ...
//
// Threads: one at a time; QVClientConnection sees to it that one thread reads.
// Limits: those of the wire; what is not a whole message yet is kept, up to 8 MiB.
class QVClientInbox {
 public:
  enum class Reading {
    full,     // there may be more to be had at once
    drained,  // that was all there was
    ended     // nothing more will come
  };

  QVClientInbox();

  // Reads once. What it brought is handed out by next(), also when this was the end.
  Reading receive(int socket);
  // The next whole message, valid until the next call of either; false where there is none.
  bool next(std::string_view& message);
  // Why nothing more will come; empty while that is not so.
  const std::string& failure() const noexcept { return failure_; }
  // The service broke the rules of the wire.
  void reject(std::string_view reason);

 private:
  std::unique_ptr<char[]> buffer_;
  QVBusAuthClient authentication_;
  QVBusFrameDecoder frames_;
  std::string failure_;
};
