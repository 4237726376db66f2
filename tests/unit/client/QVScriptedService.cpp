#include "tests/unit/client/QVScriptedService.h"

#include "platform/linux/bus/QVBusMessage.h"

#include <array>
#include <stdexcept>

#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

namespace {

// Milliseconds. Passes only where a test has failed.
constexpr int kPatience = 20'000;

bool waitUntilReadable(int descriptor, int milliseconds) {
  pollfd entry{.fd = descriptor, .events = POLLIN, .revents = 0};
  return poll(&entry, 1, milliseconds) > 0;
}

}  // namespace

uint32_t QVScriptedService::ownUserID() {
  return geteuid();
}

QVScriptedService::QVScriptedService(int socketType) {
  std::array<int, 2> sockets{};
  if (socketpair(AF_UNIX, socketType | SOCK_CLOEXEC, 0, sockets.data()) != 0) {
    throw std::runtime_error("no pair of sockets");
  }
  clientSocket_ = sockets[0];
  socket_ = sockets[1];
}

std::unique_ptr<QVScriptedService> QVScriptedService::accepted(int socket) {
  return std::unique_ptr<QVScriptedService>(new QVScriptedService(-1, socket));
}

QVScriptedService::~QVScriptedService() {
  hangUp();
  if (clientSocket_ >= 0) close(clientSocket_);
}

std::unique_ptr<QVClient> QVScriptedService::connectClient(QVClientOptions options) {
  auto connected = QVClient::connectedTo(std::exchange(clientSocket_, -1), std::move(options));
  EXPECT_TRUE(connected) << connected.error().text();
  return std::move(connected.value());
}

std::unique_ptr<QVClient> QVScriptedService::connectLoopClient(QVClientOptions options) {
  options.callbacks = QVClientOptions::Callbacks::pollLoop;
  auto client = connectClient(std::move(options));
  letIn();
  dispatchWhenReadable(*client);
  return client;
}

void QVScriptedService::letIn() {
  while (authentication_.state() != QVBusAuthServer::State::done) {
    const std::string bytes = read();
    if (bytes.empty()) return;
    std::string answer;
    const std::size_t taken = authentication_.feed(bytes, answer);
    send(answer);
    take(std::string_view(bytes).substr(taken));
  }
}

bool QVScriptedService::receive(bool wait, std::string& bytes) {
  if (wait && !waitUntilReadable(socket_, kPatience)) {
    ADD_FAILURE() << "the client sent nothing";
    return false;
  }
  const ssize_t count = recv(socket_, buffer_.data(), buffer_.size(), MSG_DONTWAIT);
  bytes.assign(buffer_.data(), count > 0 ? static_cast<std::size_t>(count) : 0);
  return count > 0;
}

std::string QVScriptedService::read() {
  std::string bytes;
  receive(true, bytes);
  return bytes;
}

void QVScriptedService::take(std::string_view bytes) {
  frames_.feed(bytes);
  std::string_view frame;
  QVBusFrameDecoder::Result result = QVBusFrameDecoder::Result::message;
  while ((result = frames_.next(frame)) == QVBusFrameDecoder::Result::message) {
    QVBusMessage message;
    const char* reason = message.parse(frame);
    if (reason == nullptr) reason = message.checkBody();
    ASSERT_EQ(reason, nullptr) << reason;
    EXPECT_EQ(message.type(), QVBusMessageType::methodCall);
    calls_.push_back({std::string(message.path()), std::string(message.interface()),
                      std::string(message.member()), std::string(message.signature()),
                      std::string(message.body()), message.serial(), !message.noReplyExpected()});
  }
  EXPECT_EQ(result, QVBusFrameDecoder::Result::needsMore) << frames_.failure();
}

QVScriptedService::Call QVScriptedService::nextCall() {
  while (calls_.empty()) {
    const std::string bytes = read();
    if (bytes.empty()) return {};
    take(bytes);
  }
  Call call = std::move(calls_.front());
  calls_.pop_front();
  return call;
}

std::vector<QVScriptedService::Call> QVScriptedService::callsSoFar() {
  for (std::string bytes; receive(false, bytes);) take(bytes);
  std::vector<Call> calls(calls_.begin(), calls_.end());
  calls_.clear();
  return calls;
}

void QVScriptedService::answer(const Call& call) {
  answer(call, "", [](QVBusWriter&) {});
}

void QVScriptedService::answer(const Call& call, std::string_view signature,
                               const std::function<void(QVBusWriter&)>& write) {
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.beginMessage({.type = QVBusMessageType::methodReturn,
                       .serial = ++lastSerial_,
                       .replySerial = call.serial,
                       .signature = signature});
  write(writer);
  writer.endMessage();
  send(bytes);
}

void QVScriptedService::answerBoolean(const Call& call, bool value) {
  answer(call, "b", [value](QVBusWriter& writer) { writer.writeBoolean(value); });
}

void QVScriptedService::refuse(const Call& call, std::string_view name, std::string_view text) {
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.beginMessage({.type = QVBusMessageType::error,
                       .serial = ++lastSerial_,
                       .replySerial = call.serial,
                       .errorName = name,
                       .signature = "s"});
  writer.writeString(text);
  writer.endMessage();
  send(bytes);
}

void QVScriptedService::send(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    ASSERT_GT(count, 0) << "the client does not read";
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
}

void QVScriptedService::hangUp() {
  if (socket_ >= 0) close(std::exchange(socket_, -1));
}

std::string nameOfCallbackThread(
    const testing::TestParamInfo<QVClientOptions::Callbacks>& parameter) {
  return parameter.param == QVClientOptions::Callbacks::ownThread ? "OwnThread" : "PollLoop";
}

void dispatchWhenReadable(QVClient& client) {
  ASSERT_TRUE(waitUntilReadable(client.fileDescriptor(), kPatience)) << "nothing to dispatch";
  client.dispatch();
}

bool isReadable(const QVClient& client) {
  return waitUntilReadable(client.fileDescriptor(), 0);
}
