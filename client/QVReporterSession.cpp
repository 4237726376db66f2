#include "client/QVReporterSession.h"

#include "client/QVRealtimeRing.h"
#include "client/QVReporterConfiguration.h"
#include "client/QVReporterCore.h"

#include <bit>
#include <new>
#include <utility>

namespace {

using Code = QVClientError::Code;
using Kind = QVReporterRecord::Kind;

// Of a real-time queue: messages, bytes of one, bytes in all.
constexpr std::size_t kMaximumSlots = 65'536;
constexpr std::size_t kLeastSlotBytes = 64;
constexpr std::size_t kMaximumSlotBytes = 65'536;
constexpr std::size_t kMaximumRingBytes = std::size_t{64} << 20;

}  // namespace

QVReporterSession::QVReporterSession(std::shared_ptr<QVReporterCore> core,
                                     QVReporterSessionState& state) noexcept
    : core_(std::move(core)), state_(state), reporterID_(state.reporterID) {}

QVReporterSession::~QVReporterSession() {
  if (!isOpen_) return;
  // Refused only where there is no memory, or no reporter: then the session ends with it.
  if (core_->take({.kind = Kind::destroy, .session = &state_}) == Code::none) {
    core_->sessions.release(reporterID_);
  }
}

int64_t QVReporterSession::reporterID() const noexcept {
  return reporterID_;
}

QVClientError::Code QVReporterSession::setServiceType(QVClientServiceType serviceType) {
  return core_->take({.kind = Kind::setServiceType,
                      .type = static_cast<uint16_t>(serviceType),
                      .session = &state_});
}

QVClientError::Code QVReporterSession::setConfiguration(const QVClientPayload& configuration) {
  if (!configuration.ok()) return configuration.errorCode();
  if (configuration.entries().size() > kQVReporterMaximumConfigurationBytes) {
    return Code::messageTooLarge;
  }
  return core_->take(
      {.kind = Kind::setConfiguration, .session = &state_, .payload = configuration.entries()});
}

QVClientError::Code QVReporterSession::start() {
  const Code code = core_->take({.kind = Kind::start, .session = &state_});
  // What is committed from now on belongs to the session that the start makes.
  if (code == Code::none) core_->rings.admitMessages(state_);
  return code;
}

QVClientError::Code QVReporterSession::sendMessage(const QVClientPayload& message,
                                                   QVClientCategory category,
                                                   QVClientMessageType type) {
  return core_->send(&state_, message, category, type);
}

QVClientError::Code QVReporterSession::stop() {
  return core_->take({.kind = Kind::stop, .session = &state_});
}

QVClientResult<std::unique_ptr<QVRealtimeQueue>> QVReporterSession::makeRealtimeQueue(
    QVRealtimeQueueOptions options) {
  const auto fail = [](Code code) { return QVClientError(code, QVClientError::textOf(code)); };
  if (options.messages == 0 || options.messages > kMaximumSlots ||
      options.bytesPerMessage < kLeastSlotBytes || options.bytesPerMessage > kMaximumSlotBytes) {
    return fail(Code::invalidArgument);
  }
  const std::size_t slots = std::bit_ceil(options.messages);
  if (slots * options.bytesPerMessage > kMaximumRingBytes) return fail(Code::invalidArgument);
  try {
    // Asked before: one that is not admitted must not take the memory that is kept from it.
    Code code = core_->rings.admit(QVRealtimeRing::bytesOf(slots, options.bytesPerMessage));
    if (code != Code::none) return fail(code);
    auto ring = std::make_shared<QVRealtimeRing>(slots, options.bytesPerMessage, &state_);
    std::unique_ptr<QVRealtimeQueue> queue(new QVRealtimeQueue(core_, ring));
    code = core_->rings.add(std::move(ring));
    if (code != Code::none) return fail(code);
    // From now on the reporter's thread looks at it.
    core_->bell.ring();
    return queue;
  } catch (const std::bad_alloc&) {
    return fail(Code::outOfMemory);
  }
}
