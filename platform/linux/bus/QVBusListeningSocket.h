#pragma once

#include <memory>
#include <string>

// The unix socket on which the service is called: the service manager's, or one of our own.
//
// An own one has mode 0660. A path at which somebody listens is left to them; a socket that a dead
// service left behind is replaced. Two services that start at once are kept apart by a lock on the
// socket's directory.
//
// Threads: one at a time.
class QVBusListeningSocket {
 public:
  // The inherited socket where there is one, else a new one at `path`. Null where neither is to be
  // had; `error` then says why.
  static std::unique_ptr<QVBusListeningSocket> open(const std::string& path, std::string& error);
  ~QVBusListeningSocket();
  QVBusListeningSocket(const QVBusListeningSocket&) = delete;
  QVBusListeningSocket& operator=(const QVBusListeningSocket&) = delete;

  // Hands the descriptor over; it is closed by whoever takes it, else with the object.
  int takeDescriptor() noexcept;
  // Takes an own socket out of the file system, unless another lies there by now. An inherited one
  // stays.
  void unlink() noexcept;

 private:
  explicit QVBusListeningSocket(int descriptor) noexcept : descriptor_(descriptor) {}
  static std::unique_ptr<QVBusListeningSocket> inherit(int count, std::string& error);
  static std::unique_ptr<QVBusListeningSocket> bind(const std::string& path, std::string& error);

  int descriptor_;
  // Of an own socket: where it lies and what lies there.
  std::string path_;
  unsigned long device_ = 0;
  unsigned long inode_ = 0;
};
