#include "platform/linux/bus/QVBusCall.h"

#include "platform/QVText.h"

bool QVBusExpectSignature(const QVBusCall& call, std::string_view expected) {
  if (call.message.signature() == expected) return true;
  call.reply.giveError(kBusErrorInvalidArgs, QVText(call.message.member(), " takes \"", expected,
                                                    "\", not \"", call.message.signature(), "\""));
  return false;
}
