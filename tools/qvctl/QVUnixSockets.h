#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include <sys/types.h>

// One unix stream socket as the kernel's socket diagnosis describes it.
struct QVUnixSocket {
  uint32_t inode = 0;  // of the socket itself; 0 for a connection that is not accepted yet
  uint32_t peer = 0;   // the inode of the other end; 0 where there is none
  bool isListening = false;
  // The file that it is bound to, where it is; a connection has that of its listener.
  dev_t fileDevice = 0;
  uint32_t fileInode = 0;
};

// All listening and connected unix stream sockets of the machine (of the network namespace), also
// those of other users. Nobody notices: it is not a connection, so nothing is started. Nothing
// where the kernel does not tell. Threads: any.
std::optional<std::vector<QVUnixSocket>> QVListUnixSockets();
