#pragma once

#include "client/QVClientExport.h"

#include <cstdint>
#include <string>
#include <utility>

// What went wrong with a call, a payload or a connection: a value, never thrown.
//
// `if (error)` is true where there is an error. Threads: as any value.
class QV_CLIENT_API QVClientError {
 public:
  enum class Code : uint8_t {
    none,
    cannotConnect,    // no service at that path, or it may not be reached
    connectionLost,   // the service ended or broke off; this connection is of no use any more
    closed,           // the client, or the reporter, was closed or destroyed first
    queueFull,        // the service does not read, or too many calls are unanswered; try later
    timedOut,         // a waiting call's time limit passed; the call may still be carried out
    wouldDeadlock,    // a waiting call on the thread that would have to deliver its answer
    messageTooLarge,  // a call over 8 MiB, a payload larger than the memory given for it, a message
                      // larger than a reporter's queue, a configuration over 64 KiB
    invalidPayload,   // a text that is no UTF-8, containers nested too deeply or not closed
    outOfMemory,
    refused,          // the service did not take the call: domain() is the standard error's name
    serviceError,     // an error object of the service: domain() and serviceCode()
    invalidReply,     // an answer that is not what the operation answers
    disabled,         // reporting is switched off: nothing was sent
    reporterIDTaken,  // another session of this reporter has that ID
    tooManySessions,  // of one reporter
    invalidArgument   // a number beyond its limits; in C also a null pointer
  };

  // No error.
  QVClientError() noexcept = default;
  QVClientError(Code code, std::string text) : code_(code), text_(std::move(text)) {}

  static QVClientError refusal(std::string name, std::string text);
  static QVClientError ofService(std::string domain, int64_t serviceCode, std::string text);

  // What a code means, in a few words; "no error" for none.
  static const char* textOf(Code code) noexcept;

  explicit operator bool() const noexcept { return code_ != Code::none; }
  Code code() const noexcept { return code_; }
  // For people; empty where there is no error.
  const std::string& text() const noexcept { return text_; }
  // "net.quillon.audio.reporting"; empty for errors that are not the service's.
  const std::string& domain() const noexcept { return domain_; }
  int64_t serviceCode() const noexcept { return serviceCode_; }

 private:
  Code code_ = Code::none;
  int64_t serviceCode_ = 0;
  std::string domain_;
  std::string text_;
};

// The service's error for a message while reporting is switched off.
inline constexpr const char* kQVClientReportingDomain = "net.quillon.audio.reporting";
inline constexpr int64_t kQVClientReportingSwitchedOff = 1;
