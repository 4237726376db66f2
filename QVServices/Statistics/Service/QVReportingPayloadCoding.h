#pragma once

#include "QVServices/Statistics/Service/QVReportingKnownTexts.h"
#include "platform/QVValue.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// The compact form of values in a session's payload store. Private to this process and never
// stored outside of it, so it has no version and no byte order of its own.
//
// A value is a tag and what the tag asks for: small integers are their own tag, others are
// variable-length numbers with the sign in the lowest bit; a double that is exact in single
// precision takes four bytes; a text that is known already is the address of its one copy.
// Functions of their arguments alone; any thread.

void QVReportingEncodeNumber(std::string& out, uint64_t number);
void QVReportingEncodeText(std::string& out, std::string_view text);
// What was encoded with `known` can be decoded as long as that exists.
void QVReportingEncodeValue(std::string& out, const QVValue& value, QVReportingKnownTexts& known);

// Reads what the functions above wrote, in the same order. The bytes must stay until the values
// that it answered are gone: strings borrow them.
class QVReportingPayloadDecoder {
 public:
  explicit QVReportingPayloadDecoder(const uint8_t* bytes) : next_(bytes) {}

  uint64_t number();
  std::string_view text();
  QVValue value();
  // What comes next, for a decoder that goes on from there.
  const uint8_t* position() const { return next_; }

 private:
  template <class Fixed>
  Fixed fixed();

  const uint8_t* next_;
};
