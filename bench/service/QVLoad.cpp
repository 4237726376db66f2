#include "bench/service/QVLoad.h"

#include "client/QVClientBatch.h"

#include <algorithm>
#include <span>
#include <stdexcept>

#include <poll.h>

namespace {

QVClientOptions optionsFor(const std::string& socketPath) {
  return {.socketPath = socketPath, .callbacks = QVClientOptions::Callbacks::pollLoop};
}

void require(const QVClientError& error) {
  if (error) throw std::runtime_error(error.text());
}

template <class Value>
void require(const QVClientResult<Value>& result) {
  require(result.error());
}

void waitForAny(const std::vector<pollfd>& descriptors) {
  std::vector<pollfd> events(descriptors);
  ::poll(events.data(), events.size(), -1);
}

}  // namespace

QVClientPayload QVLoad::makeMessage() {
  QVClientPayload message;
  message.set("buffer_fill", 0.8125)
      .set("codec", "pcm_s16le_interleaved_48k_stereo")
      .set("frames", 48000)
      .set("position_ms", 123000)
      .set("processing_time_us", 412.5)
      .set("qvreporting_timestamp", 1763671234.25)
      .set("route", "net.quillon.output.speaker.builtin")
      .set("sample_rate", 48000)
      .set("volume", 0.75)
      .set("xruns", 0);
  return message;
}

QVLoad::QVLoad(QVClientResult<std::unique_ptr<QVClient>> client) {
  require(client);
  client_ = std::move(client.value());
}

QVLoad::QVLoad(const std::string& socketPath) : QVLoad(QVClient::connect(optionsFor(socketPath))) {}

QVLoad::QVLoad(int descriptor) : QVLoad(QVClient::connectedTo(descriptor, optionsFor({}))) {}

void QVLoad::startSessions(const std::vector<int64_t>& reporterIDs) {
  for (const int64_t reporterID : reporterIDs) {
    require(client_->createReportingSessionAndWait(reporterID));
    require(client_->setServiceTypeAndWait(QVClientServiceType::nonlongformaudio, reporterID));
    require(client_->startReportingSessionForIDAndWait(reporterID, {}));
  }
  reporterIDs_ = reporterIDs;
}

void QVLoad::stopSessions() {
  for (const int64_t reporterID : reporterIDs_) {
    require(client_->stopReportingSessionForIDAndWait(reporterID));
  }
}

void QVLoad::sendOne() {
  const auto targets =
      reporterIDs_.empty()
          ? QVClientTargets(std::span<const int64_t>())
          : QVClientTargets(reporterIDs_[static_cast<std::size_t>(sent_) % reporterIDs_.size()]);
  require(client_->sendMessage(
      message_, QVClientCategory(QVClientComponent::session, QVClientKind::playback),
      QVClientMessageType::generic, targets, [this](const QVClientError& error) {
        ++answered_;
        if (error) ++errors_;
      }));
  ++sent_;
}

bool QVLoad::pump(int64_t count, int64_t window) {
  if (errors_ != 0) throw std::runtime_error("the service refused messages");
  {
    const QVClientBatch batch(*client_);
    while (sent_ < count && sent_ - answered_ < window) sendOne();
  }
  return answered_ < count;
}

void QVLoad::send(int64_t count, int64_t window) {
  const int64_t end = sent_ + count;
  while (pump(end, window)) {
    waitForAny({{client_->fileDescriptor(), POLLIN, 0}});
    client_->dispatch();
  }
}

void QVLoad::send(const std::vector<std::unique_ptr<QVLoad>>& loads, int64_t count,
                  int64_t window) {
  std::vector<pollfd> descriptors;
  for (const auto& load : loads) {
    descriptors.push_back({load->client_->fileDescriptor(), POLLIN, 0});
  }
  const auto pumpAll = [&] {
    return std::ranges::count_if(loads,
                                 [&](const auto& load) { return load->pump(count, window); });
  };
  while (pumpAll() > 0) {
    waitForAny(descriptors);
    for (const auto& load : loads) load->client_->dispatch();
  }
}
