#include "client/QVClientInbox.h"

#include "client/QVClientSocket.h"

#include <cerrno>

namespace {

// Bytes read at once: some thousand answers.
constexpr std::size_t kBufferBytes = std::size_t{64} << 10;

}  // namespace

QVClientInbox::QVClientInbox() : buffer_(new char[kBufferBytes]) {}

QVClientInbox::Reading QVClientInbox::receive(int socket) {
  const QVClientTransfer received = QVClientReceive(socket, buffer_.get(), kBufferBytes);
  switch (received.state) {
    case QVClientTransfer::State::wouldBlock:
      return Reading::drained;
    case QVClientTransfer::State::failed:
      failure_ = "the connection to the service broke: " + QVClientSystemErrorText(errno);
      return Reading::ended;
    case QVClientTransfer::State::done:
      break;
  }
  if (received.bytes == 0) {
    failure_ = authentication_.state() == QVBusAuthClient::State::done
                   ? "the service closed the connection"
                   : "the service closed the connection before it let us in";
    return Reading::ended;
  }
  std::string_view bytes(buffer_.get(), received.bytes);
  if (authentication_.state() != QVBusAuthClient::State::done) {
    bytes.remove_prefix(authentication_.feed(bytes));
    if (authentication_.state() == QVBusAuthClient::State::failed) {
      failure_ = "the service did not let us in";
      return Reading::ended;
    }
  }
  frames_.feed(bytes);
  return received.bytes == kBufferBytes ? Reading::full : Reading::drained;
}

bool QVClientInbox::next(std::string_view& message) {
  if (!failure_.empty()) return false;
  switch (frames_.next(message)) {
    case QVBusFrameDecoder::Result::message:
      return true;
    case QVBusFrameDecoder::Result::needsMore:
      return false;
    case QVBusFrameDecoder::Result::malformed:
      reject(frames_.failure());
      return false;
  }
  return false;
}

void QVClientInbox::reject(std::string_view reason) {
  failure_ = "the service sent what is no message: ";
  failure_ += reason;
}
