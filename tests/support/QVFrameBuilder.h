#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <type_traits>

// Bytes of messages put together by hand, in either byte order, right or wrong as the test wants
// them: nothing is checked, and nothing of the service's own codec is used.
//
// Threads: one at a time.
class QVFrameBuilder {
 public:
  explicit QVFrameBuilder(bool bigEndian = false) : bigEndian_(bigEndian) {}

  QVFrameBuilder& align(std::size_t alignment, char padding = '\0');
  template <class Number>
  QVFrameBuilder& number(Number value) {
    static_assert(std::is_integral_v<Number>);
    align(sizeof value);
    for (std::size_t i = 0; i < sizeof value; ++i) {
      const std::size_t shift = 8 * (bigEndian_ ? sizeof value - 1 - i : i);
      bytes_.push_back(static_cast<char>(static_cast<uint64_t>(value) >> shift));
    }
    return *this;
  }
  QVFrameBuilder& string(std::string_view text);
  QVFrameBuilder& signature(std::string_view text);
  QVFrameBuilder& raw(std::string_view bytes);
  // A header field: its code and, in a variant, its value.
  QVFrameBuilder& field(uint8_t code, std::string_view type, std::string_view text);
  QVFrameBuilder& field(uint8_t code, uint32_t value);

  const std::string& bytes() const { return bytes_; }

 private:
  std::string bytes_;
  bool bigEndian_;
};

// A whole message: by default a call of SendMessage without a body.
struct QVFrame {
  bool bigEndian = false;
  uint8_t type = 1;
  uint8_t flags = 0;
  uint8_t version = 1;
  uint32_t serial = 1;
  std::string path = "/net/quillon/quietvox/ReportingService";
  std::string interface = "net.quillon.quietvox.ReportingService";
  std::string member = "SendMessage";
  std::string signature = {};
  std::string body = {};
  // Bytes of further header fields, which begin at a multiple of 8.
  std::string moreFields = {};

  std::string bytes() const;
};

// The body of a SendMessage for one session.
struct QVMessageBody {
  std::string entries = {};  // bytes of the dictionary's entries, which begin at a multiple of 8
  int64_t reporterID = 7;
  bool everySession = false;
  bool bigEndian = false;

  std::string bytes() const;
};
