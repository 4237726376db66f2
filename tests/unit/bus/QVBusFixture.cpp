#include "tests/unit/bus/QVBusFixture.h"

#include "platform/linux/bus/QVBusAuthClient.h"

#include <array>

#include <sys/socket.h>
#include <unistd.h>

namespace {

QVBusReader bodyOf(const QVBusAnswer& answer) {
  return {answer.body, false};
}

}  // namespace

std::string QVBusAnswer::text() const {
  EXPECT_EQ(signature, "s");
  return std::string(bodyOf(*this).readString());
}

bool QVBusAnswer::boolean() const {
  EXPECT_EQ(signature, "b");
  return bodyOf(*this).readBoolean();
}

// ---- The peer

void QVBusPeer::send(std::string_view bytes) {
  EXPECT_EQ(sendSome(bytes), bytes.size());
}

std::size_t QVBusPeer::sendSome(std::string_view bytes) {
  std::size_t sent = 0;
  while (sent < bytes.size()) {
    const ssize_t written =
        ::send(descriptor_, bytes.data() + sent, bytes.size() - sent, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (written <= 0) break;
    sent += static_cast<std::size_t>(written);
  }
  return sent;
}

std::string QVBusPeer::receive() {
  std::string bytes;
  std::array<char, 65536> buffer;
  for (;;) {
    const ssize_t received = ::recv(descriptor_, buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (received <= 0) return bytes;
    bytes.append(buffer.data(), static_cast<std::size_t>(received));
  }
}

std::vector<QVBusAnswer> QVBusPeer::receiveAnswers() {
  const auto bytes = receive();
  QVBusFrameDecoder decoder;
  decoder.feed(bytes);
  std::vector<QVBusAnswer> answers;
  std::string_view frame;
  while (decoder.next(frame) == QVBusFrameDecoder::Result::message) {
    QVBusMessage message;
    EXPECT_EQ(message.parse(frame), nullptr);
    EXPECT_EQ(message.checkBody(), nullptr);
    EXPECT_TRUE(message.type() == QVBusMessageType::methodReturn ||
                message.type() == QVBusMessageType::error);
    answers.push_back({message.replySerial(), std::string(message.errorName()),
                       std::string(message.signature()), std::string(message.body())});
  }
  EXPECT_EQ(decoder.failure(), nullptr);
  return answers;
}

bool QVBusPeer::isClosed() {
  char byte;
  return ::recv(descriptor_, &byte, 1, MSG_DONTWAIT | MSG_PEEK) == 0;
}

void QVBusPeer::hangUp() {
  if (descriptor_ >= 0) ::close(descriptor_);
  descriptor_ = -1;
}

std::string QVBusPeer::authentication() {
  return QVBusAuthClient::opening(::getuid());
}

// ---- The fixture

void QVBusFixture::makeServer(std::size_t intakeBound) {
  server_ = std::make_unique<QVBusServer>(loop_, intakeBound);
}

std::shared_ptr<QVBusConnection> QVBusFixture::accept() {
  std::array<int, 2> ends{};
  EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, ends.data()), 0);
  peers_.push_back(std::make_unique<QVBusPeer>(ends[1]));
  return server_->adopt(ends[0]);
}

QVBusPeer& QVBusFixture::connect(bool authenticated) {
  const auto connection = accept();
  auto& peer = *peers_.back();

  const std::string name = std::to_string(peers_.size()) + " ";
  auto& service = *services_.emplace_back(std::make_shared<QVRecordingService>());
  service.onCall = [this, name](const std::string& call) { journal_.push_back(name + call); };
  connection->setExportedInterface(QVIPCInterface::reportingService);
  connection->setExportedObject(services_.back());
  connection->setInterruptionHandler([this, name] { journal_.push_back(name + "interruption"); });
  connection->setInvalidationHandler([this, name] { journal_.push_back(name + "invalidation"); });
  connection->resume();
  if (authenticated) {
    peer.send(QVBusPeer::authentication());
    run();
    EXPECT_EQ(peer.receive(), "OK " + server_->identifier() + "\r\n");
  }
  return peer;
}

void QVBusFixture::run() {
  while (loop_.runOne(QVDuration::zero())) {
  }
}

std::vector<QVBusAnswer> QVBusFixture::exchange(std::string_view bytes, std::size_t n) {
  // What is larger than the socket's buffer goes in as it is read.
  for (std::size_t sent = 0; sent < bytes.size();) {
    const std::size_t more = peer(n).sendSome(bytes.substr(sent));
    if (more == 0) break;
    sent += more;
    run();
  }
  return peer(n).receiveAnswers();
}

QVBusAnswer QVBusFixture::call(const QVTestMessage& message, std::size_t n) {
  const auto answers = exchange(message.bytes(), n);
  EXPECT_EQ(answers.size(), 1U);
  if (answers.empty()) return {};
  EXPECT_EQ(answers[0].replySerial, message.serial);
  return answers[0];
}

std::vector<std::string> QVBusFixture::logged() {
  std::vector<std::string> texts;
  for (const auto& line : platform_.log().lines()) texts.push_back(line.text);
  return texts;
}
