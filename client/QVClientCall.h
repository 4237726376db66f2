#pragma once

#include "client/QVClientReplies.h"

#include <variant>

class QVBusMessage;

// What is to happen when a call's answer comes. Kept in QVClientCallTable until then.
struct QVClientCall {
  // The program's reply by the type of its value; none where nobody waits for the answer any more.
  using Reply = std::variant<std::monostate, QVClientBooleanReply, QVClientServiceTypeReply,
                             QVClientMessageReply, QVClientReporterReply, QVClientReportersReply>;

  Reply reply;
  // Set where a thread waits inside of a call: becomes true, under the connection's lock, after the
  // reply ran. Such a reply runs on whatever thread reads it.
  bool* done = nullptr;
  // The loss of the connection is what this call is meant to bring about: its success.
  bool endsService = false;
};

// Runs a call's reply with what the service answered, or with an error.
void QVClientFinish(const QVClientCall& call, const QVBusMessage& answer);
void QVClientFail(const QVClientCall& call, const QVClientError& error);
