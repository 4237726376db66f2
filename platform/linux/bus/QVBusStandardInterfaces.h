#pragma once

#include "platform/linux/bus/QVBusCall.h"

#include <string>

// Answers what every peer on a bus is asked: introspection, ping, properties (there are none), and,
// at /org/freedesktop/DBus, those methods of a bus that tools insist on although there is no bus
// here. Whatever names nothing that exists gets its standard error.
//
// Threads: the IPC thread only; answers at once, without the core.
class QVBusStandardInterfaces {
 public:
  // Null, or the rule of the protocol that the call's body breaks.
  [[nodiscard]] const char* handle(const QVBusCall& call);

 private:
  void answer(const QVBusCall& call, std::string_view interface);
  void answerProperties(const QVBusCall& call);
  void answerBus(const QVBusCall& call);
  void answerBusName(const QVBusCall& call, std::string_view name);
  void giveMachineID(const QVBusReply& reply);

  std::string machineID_;  // once it has been read
};
