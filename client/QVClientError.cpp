#include "client/QVClientError.h"

QVClientError QVClientError::refusal(std::string name, std::string text) {
  QVClientError error(Code::refused, std::move(text));
  error.domain_ = std::move(name);
  return error;
}

QVClientError QVClientError::ofService(std::string domain, int64_t serviceCode, std::string text) {
  QVClientError error(Code::serviceError, std::move(text));
  error.domain_ = std::move(domain);
  error.serviceCode_ = serviceCode;
  return error;
}

const char* QVClientError::textOf(Code code) noexcept {
  switch (code) {
    case Code::none:
      return "no error";
    case Code::cannotConnect:
      return "the service cannot be reached";
    case Code::connectionLost:
      return "the connection to the service is lost";
    case Code::closed:
      return "closed already";
    case Code::queueFull:
      return "too much waits for the service";
    case Code::timedOut:
      return "the time limit has passed";
    case Code::wouldDeadlock:
      return "a callback cannot wait for what runs on its own thread";
    case Code::messageTooLarge:
      return "the message is too large";
    case Code::invalidPayload:
      return "the payload is not in order";
    case Code::outOfMemory:
      return "no memory";
    case Code::refused:
      return "the service refused the call";
    case Code::serviceError:
      return "the service answered with an error";
    case Code::invalidReply:
      return "the service's answer is not what the operation answers";
    case Code::disabled:
      return "reporting is switched off";
    case Code::reporterIDTaken:
      return "another session of this reporter has that ID";
    case Code::tooManySessions:
      return "the reporter has too many sessions";
    case Code::invalidArgument:
      return "an argument is out of its limits";
  }
  return "unknown error";
}
