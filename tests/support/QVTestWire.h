#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// Marshals bytes for tests, in either byte order, right or wrong: it checks nothing, so that it can
// say what no honest peer says. Made apart from the code under test, so that the one proves the
// other. Used by the tests of the bus, of the service and by the fuzzer's seeds.
//
// Threads: one at a time.
class QVTestWire {
 public:
  explicit QVTestWire(char order = 'l') : order_(order) {}

  template <class Number>
  QVTestWire& number(Number value) {
    align(sizeof(Number));
    for (std::size_t i = 0; i < sizeof(Number); ++i) {
      const std::size_t byte = order_ == 'B' ? sizeof(Number) - 1 - i : i;
      bytes.push_back(static_cast<char>(static_cast<uint64_t>(value) >> (8 * byte)));
    }
    return *this;
  }
  QVTestWire& u8(uint8_t value) { return number(value); }
  QVTestWire& u16(uint16_t value) { return number(value); }
  QVTestWire& u32(uint32_t value) { return number(value); }
  QVTestWire& u64(uint64_t value) { return number(value); }
  QVTestWire& i64(int64_t value) { return number(value); }
  QVTestWire& real(double value) { return number(std::bit_cast<uint64_t>(value)); }
  QVTestWire& string(std::string_view text) {
    return u32(static_cast<uint32_t>(text.size())).raw(text).raw(std::string(1, '\0'));
  }
  QVTestWire& signature(std::string_view text) {
    return u8(static_cast<uint8_t>(text.size())).raw(text).raw(std::string(1, '\0'));
  }
  QVTestWire& raw(std::string_view text) {
    bytes.append(text);
    return *this;
  }
  QVTestWire& align(std::size_t alignment) {
    while (bytes.size() % alignment != 0) bytes.push_back('\0');
    return *this;
  }
  // An array whose elements `fill` writes.
  template <class Fill>
  QVTestWire& array(std::size_t alignment, Fill&& fill) {
    u32(0);
    const std::size_t lengthAt = bytes.size() - 4;
    align(alignment);
    const std::size_t begin = bytes.size();
    fill(*this);
    setNumber(lengthAt, static_cast<uint32_t>(bytes.size() - begin));
    return *this;
  }
  // An entry of a dictionary of variants, up to the variant's value.
  QVTestWire& entry(std::string_view key, std::string_view valueSignature) {
    return align(8).string(key).signature(valueSignature);
  }
  // A field of a header: its code and, in a variant, its value.
  QVTestWire& field(uint8_t code, std::string_view type, std::string_view text) {
    align(8).u8(code).signature(type);
    return type == "g" ? signature(text) : string(text);
  }
  QVTestWire& field(uint8_t code, uint32_t value) {
    return align(8).u8(code).signature("u").u32(value);
  }
  // Overwrites four bytes.
  void setNumber(std::size_t at, uint32_t value) {
    QVTestWire other(order_);
    other.u32(value);
    bytes.replace(at, 4, other.bytes);
  }
  char order() const { return order_; }

  std::string bytes;

 private:
  char order_;
};
