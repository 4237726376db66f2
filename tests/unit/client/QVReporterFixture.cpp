#include "tests/unit/client/QVReporterFixture.h"

#include <chrono>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <thread>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

// The number of a message {"n": number}.
int64_t numberOf(QVBusReader& reader) {
  int64_t number = -1;
  const std::size_t end = reader.enterArray(8);
  while (reader.position() < end) {
    reader.enterStruct();
    const std::string_view key = reader.readString();
    const std::string_view type = reader.enterVariantText();
    if (key == "n" && type == "x") {
      number = reader.readNumber<int64_t>();
    } else if (QVBusSignature signature; reader.parseVariantSignature(type, signature)) {
      reader.skipValue(signature, 0);
    }
    reader.leaveVariant();
    reader.leaveStruct();
  }
  reader.leaveArray(end);
  return number;
}

std::string describeMessage(QVBusReader reader) {
  const int64_t number = numberOf(reader);
  reader.readNumber<uint32_t>();
  reader.readNumber<uint16_t>();
  std::string target = reader.readBoolean() ? "*" : "";
  const std::size_t end = reader.enterArray(8);
  while (reader.position() < end) target += std::to_string(reader.readNumber<int64_t>());
  reader.leaveArray(end);
  EXPECT_TRUE(reader.ok()) << reader.failure();
  return "send " + target + " " + std::to_string(number);
}

}  // namespace

QVReporterFixture::QVReporterFixture() {
  std::filesystem::create_directory(root_.runtime() / "notify");
  listen();
}

QVReporterFixture::~QVReporterFixture() {
  reporter_.reset();
  stopListening();
}

void QVReporterFixture::listen() {
  listener_ = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  root_.socket().string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(listener_, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(listener_, 16) != 0) {
    throw std::runtime_error("cannot listen");
  }
}

void QVReporterFixture::stopListening() {
  if (listener_ >= 0) ::close(std::exchange(listener_, -1));
  std::filesystem::remove(root_.socket());
}

QVReporterOptions QVReporterFixture::options() {
  QVReporterOptions options;
  options.socketPath = root_.socket();
  options.configurationDirectory = root_.configuration();
  options.runtimeDirectory = root_.runtime();
  options.shortestReconnectDelay = std::chrono::milliseconds(1);
  options.longestReconnectDelay = std::chrono::milliseconds(8);
  options.endTimeLimit = std::chrono::milliseconds(0);
  options.realtimePeriod = std::chrono::milliseconds(1);
  options.dropReportInterval = std::chrono::milliseconds(0);
  options.dropped = [this](const QVDropCounts& sinceLast) {
    const std::lock_guard lock(mutex_);
    drops_ += sinceLast;
    changed_.notify_all();
  };
  return options;
}

void QVReporterFixture::open(QVReporterOptions options) {
  auto opened = QVReporter::open(std::move(options));
  ASSERT_TRUE(opened) << opened.error().text();
  reporter_ = std::move(opened.value());
}

std::unique_ptr<QVReporterSession> QVReporterFixture::openSession(int64_t reporterID) {
  auto opened = reporter_->openSession(
      {.reporterID = reporterID, .serviceType = QVClientServiceType::telephony});
  EXPECT_TRUE(opened) << opened.error().text();
  return std::move(opened.value());
}

QVClientError::Code QVReporterFixture::send(QVReporterSession& session, int64_t number) {
  QVClientPayload payload;
  payload.set("n", number);
  return session.sendMessage(payload, kPlayback, QVClientMessageType::generic);
}

std::unique_ptr<QVScriptedService> QVReporterFixture::accept() {
  pollfd entry{.fd = listener_, .events = POLLIN, .revents = 0};
  if (::poll(&entry, 1, static_cast<int>(kPatience.count())) <= 0) {
    throw std::runtime_error("nobody connects");
  }
  auto service = QVScriptedService::accepted(::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC));
  service->letIn();
  return service;
}

std::string QVReporterFixture::describe(const Call& call) {
  QVBusReader reader = call.reader();
  const auto withID = [&reader](const char* what) {
    return std::string(what).append(" ").append(std::to_string(reader.readNumber<int64_t>()));
  };
  if (call.member == "CreateReportingSession") return withID("create");
  if (call.member == "StartReportingSessionForID") return withID("start");
  if (call.member == "StopReportingSessionForID") return withID("stop");
  if (call.member == "DestroyReportingSession") return withID("destroy");
  if (call.member == "ReporterIDValid") return withID("valid");
  if (call.member == "SetServiceType") {
    const auto type = reader.readNumber<uint16_t>();
    return withID("type").append(" ").append(std::to_string(type));
  }
  if (call.member == "SetConfiguration") {
    const int64_t number = numberOf(reader);
    return withID("configure").append(" ").append(std::to_string(number));
  }
  if (call.member == "SendMessage") return describeMessage(reader);
  return call.member.empty() ? "hung up" : call.member;
}

void QVReporterFixture::answer(QVScriptedService& service, const Call& call) {
  if (!call.answerWanted || call.member.empty()) return;
  if (call.member == "SendMessage") {
    service.answer(call);
  } else if (call.member == "ReporterIDValid") {
    service.answer(call, "a{sv}",
                   [](QVBusWriter& writer) { writer.endArray(writer.beginArray(8)); });
  } else {
    service.answerBoolean(call);
  }
}

std::string QVReporterFixture::serve(QVScriptedService& service) {
  const Call call = service.nextCall();
  answer(service, call);
  return describe(call);
}

QVReporterFixture::Strings QVReporterFixture::serve(QVScriptedService& service, std::size_t count) {
  Strings calls;
  while (calls.size() < count && !HasFailure()) calls.push_back(serve(service));
  return calls;
}

void QVReporterFixture::awaitConnectionError() const {
  const auto limit = std::chrono::steady_clock::now() + kPatience;
  while (!reporter_->connectionError()) {
    ASSERT_LT(std::chrono::steady_clock::now(), limit);
    std::this_thread::yield();
  }
}

QVDropCounts QVReporterFixture::awaitDrops(uint64_t count) {
  std::unique_lock lock(mutex_);
  EXPECT_TRUE(changed_.wait_for(lock, kPatience, [&] { return drops_.inAll() >= count; }));
  return drops_;
}

uint64_t QVReporterFixture::awaitDrops(QVDropReason reason, uint64_t count) {
  std::unique_lock lock(mutex_);
  EXPECT_TRUE(changed_.wait_for(lock, kPatience, [&] { return drops_.of(reason) >= count; }));
  return drops_.of(reason);
}

void QVReporterFixture::configure(bool on) {
  root_.configure("preferences/net.quillon.quietvox.json",
                  on ? "{}" : R"({"disable_reporting": true})");
}

void QVReporterFixture::switchReporting(bool on) {
  configure(on);
  post();
}

void QVReporterFixture::post() {
  std::ofstream(root_.runtime() / "notify" / "net.quillon.quietvox.reporting") << "posted";
}
