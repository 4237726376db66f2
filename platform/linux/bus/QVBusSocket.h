#pragma once

#include "platform/QVFunction.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string_view>

class QVBusLoop;

// A unix stream socket of the IPC thread, connected or listening, that never blocks. Owns its
// descriptor.
//
// Threads: the loop's thread.
class QVBusSocket {
 public:
  enum class Status { done, wouldBlock, ended, failed };
  struct Result {
    Status status;
    std::size_t bytes;
  };

  // Takes the descriptor over.
  QVBusSocket(QVBusLoop& loop, int descriptor);
  ~QVBusSocket();
  QVBusSocket(const QVBusSocket&) = delete;
  QVBusSocket& operator=(const QVBusSocket&) = delete;

  // One read of what is there. Descriptors that a peer sends along are closed by the kernel.
  Result receive(std::span<char> buffer);
  // One write of what goes out. Raises no signal.
  Result send(std::string_view bytes);
  // A new connection of a listening socket: its descriptor, or minus the error's number; EMFILE
  // where a client waits and only the reserved descriptors are left.
  int accept();
  // Descriptors that clients cannot use up: without one, preferences could not be read, nor the
  // store opened, nor a session's file written. An eighth of a limit that is small.
  static constexpr unsigned kReservedDescriptors = 32;

  // Calls the handler once, on the loop, when there is something to read (to write), an error
  // included; never after close(). One wait of each kind at a time.
  void waitReadable(QVFunction<void()> handler);
  void waitWritable(QVFunction<void()> handler);
  // The same when the peer has gone; what it sent before may still be there.
  void waitHangUp(QVFunction<void()> handler);
  // Has the peer gone, whatever is still there to be read?
  bool hasHungUp() const;

  // Closes the descriptor; the waits' handlers go unrun. May be called again.
  void close();

  // The peer as the kernel knows it; 0 where it does not, and no user ID at all then.
  struct Peer {
    int32_t processIdentifier = 0;
    uint32_t userID = UINT32_MAX;
  };
  Peer peer() const;

 private:
  struct Descriptor;
  int descriptor() const noexcept;
  template <class Kind>
  void wait(Kind kind, QVFunction<void()> handler);

  const std::unique_ptr<Descriptor> descriptor_;
};
