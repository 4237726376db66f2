#pragma once

#include "platform/linux/files/QVJSONReceiver.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

// The numbers of a session's messages, as they stand in its summary: each with its key and the
// number of its message, from 1. The summary event, whose values are texts, is no message here.
//
// Threads: as its base.
class QVSummaryNumbers final : public QVJSONReceiver {
 public:
  using Receiver = std::function<void(const std::string& key, int64_t message, double number)>;

  explicit QVSummaryNumbers(Receiver receiver) : receiver_(std::move(receiver)) {}

  // Of those that have been read.
  int64_t messages() const { return messages_; }

  void begin(Container container) override;
  void end(Container container) override;
  void key(std::string_view text) override;
  void string(std::string_view /*text*/) override { countMember(); }
  void number(std::string_view digits) override;
  void boolean(bool value) override;
  void null() override { countMember(); }

 private:
  // How deep what a message holds lies: in the array, the identifier's dictionary, the message.
  static constexpr std::size_t kMessageDepth = 3;

  void countMember();
  void take(double number);

  const Receiver receiver_;
  std::size_t depth_ = 0;
  std::size_t members_ = 0;    // of the array, so far; the first one is the session's configuration
  bool isDictionary_ = false;  // is the last of them one?
  bool isMessage_ = false;
  bool isSummaryEvent_ = false;
  std::string key_;
  int64_t messages_ = 0;
};
