#pragma once

#include "client/QVClientOptions.h"
#include "client/QVClientResult.h"
#include "platform/linux/QVDescriptor.h"

#include <cstddef>
#include <string>

// What the client does with its socket. No function here raises SIGPIPE or waits, but for
// connecting. Any thread.

// Where to connect: what the options say, else the environment variable, else the default path.
std::string QVClientSocketPath(const QVClientOptions& options);

// A socket that is connected to the service. Waits up to the options' limit where the service has a
// queue of clients; starts the service where it is started on demand.
QVClientResult<QVDescriptor> QVClientConnectSocket(const QVClientOptions& options);

// Makes a socket that somebody else connected fit for this library; false where it is none.
bool QVClientPrepareSocket(int socket);

// How far one attempt at the socket came.
struct QVClientTransfer {
  enum class State { done, wouldBlock, failed };
  State state;
  std::size_t bytes;  // also where it would block or failed after some
};

// Sends all it can.
QVClientTransfer QVClientSend(int socket, const char* bytes, std::size_t count);
// Reads once. Done with no bytes: the service closed the connection.
QVClientTransfer QVClientReceive(int socket, char* bytes, std::size_t count);

// The text of an error number.
std::string QVClientSystemErrorText(int number);
