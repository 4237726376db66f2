#include "platform/linux/bus/QVBusFrameDecoder.h"

#include "platform/linux/bus/QVBusBytes.h"
#include "platform/linux/bus/QVBusProtocol.h"

#include <algorithm>

QVBusFrameDecoder::Result QVBusFrameDecoder::next(std::string_view& message) {
  if (failure_ != nullptr) return Result::malformed;
  if (handedOutKept_) {
    handedOutKept_ = false;
    std::string().swap(kept_);
  }
  if (kept_.empty() && input_.size() >= kBusFixedHeaderBytes) {
    const std::size_t length = messageLength(input_.data());
    if (length == 0) return Result::malformed;
    if (length <= input_.size()) {
      message = input_.substr(0, length);
      input_.remove_prefix(length);
      return Result::message;
    }
  }
  if (!keepUpTo(kBusFixedHeaderBytes)) return Result::needsMore;
  const std::size_t length = messageLength(kept_.data());
  if (length == 0) return Result::malformed;
  if (!keepUpTo(length)) return Result::needsMore;
  message = kept_;
  handedOutKept_ = true;
  return Result::message;
}

// The length of header and body that the fixed part of a header announces; 0 where it is wrong.
std::size_t QVBusFrameDecoder::messageLength(const char* header) noexcept {
  if (header[0] != 'l' && header[0] != 'B') {
    failure_ = "neither byte order is named";
    return 0;
  }
  if (static_cast<uint8_t>(header[3]) != kBusProtocolVersion) {
    failure_ = "unknown version of the protocol";
    return 0;
  }
  const bool bigEndian = header[0] == 'B';
  const std::size_t body = QVBusLoad<uint32_t>(header + 4, bigEndian);
  const std::size_t fields = QVBusLoad<uint32_t>(header + 12, bigEndian);
  const std::size_t length = QVBusAlign(kBusFixedHeaderBytes + fields, 8) + body;
  if (length > kBusMaximumMessageBytes) {
    failure_ = "message larger than 8 MiB";
    return 0;
  }
  return length;
}

// Moves input behind what is kept until that has `length` bytes; false where there is too little.
bool QVBusFrameDecoder::keepUpTo(std::size_t length) {
  if (kept_.size() >= length) return true;
  const std::size_t taken = std::min(length - kept_.size(), input_.size());
  const std::size_t needed = kept_.size() + taken;
  if (needed > kept_.capacity()) kept_.reserve(std::min(length, 2 * needed));
  kept_.append(input_.substr(0, taken));
  input_.remove_prefix(taken);
  return kept_.size() == length;
}
