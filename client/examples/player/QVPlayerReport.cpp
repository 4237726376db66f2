#include "client/examples/player/QVPlayerReport.h"

#include "client/QVClientBatch.h"
#include "client/examples/player/QVPlayerOptions.h"

#include <chrono>
#include <cstdio>

namespace {

// How long the end of a session may take. A player that ends does not wait for its statistics.
constexpr std::chrono::milliseconds kPatience{5000};

constexpr QVClientCategory kPlayback{QVClientComponent::session, QVClientKind::playback};
constexpr QVClientCategory kPerformance{QVClientComponent::session, QVClientKind::performance};
constexpr QVClientCategory kVolume{QVClientComponent::session, QVClientKind::volume};
constexpr QVClientCategory kRouteChange{QVClientComponent::routing, QVClientKind::routeChange};
constexpr QVClientCategory kHaptics{QVClientComponent::toolbox, QVClientKind::generic};

// Seconds since 1970, as the other reporters of a device give them.
double currentTimestamp() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

}  // namespace

std::unique_ptr<QVPlayerReport> QVPlayerReport::connect(const QVPlayerOptions& options,
                                                        std::string& problem) {
  std::unique_ptr<QVPlayerReport> report(new QVPlayerReport(options));
  QVClientOptions clientOptions;
  clientOptions.socketPath = options.socket;
  clientOptions.connectionLost = [self = report.get()](const QVClientError& error) {
    self->sayOnce(error.text());
  };
  auto connected = QVClient::connect(std::move(clientOptions));
  if (!connected) {
    problem = connected.error().text();
    return nullptr;
  }
  report->client_ = std::move(connected.value());
  return report;
}

void QVPlayerReport::begin(const QVPlayerStream& stream) {
  accepted_ = 0;
  lost_ = 0;
  payload_.clear();
  payload_.set("HostApplicationDisplayID", options_.application);
  payload_.set("sample_rate", stream.rate).set("channels", stream.channels);
  payload_.set("buffer_frames", stream.bufferFrames).set("period_frames", stream.periodFrames);
  payload_.set("device", stream.device).set("format", stream.format);

  const auto check = [this](const QVClientResult<bool>& handled) {
    if (!handled) sayOnce(handled.error().text());
  };
  // The start is answered when the session stops; nobody here waits for it.
  const int64_t reporterID = options_.reporterID;
  const QVClientBatch batch(*client_);
  note(client_->createReportingSession(reporterID, check));
  note(client_->setServiceType(options_.serviceType, reporterID, check));
  note(client_->setConfiguration(payload_, reporterID, check));
  note(client_->startReportingSessionForID(reporterID, nullptr));
}

void QVPlayerReport::playbackStarted() {
  message().set("device", options_.device);
  send(kPlayback, QVClientMessageType::start);
}

void QVPlayerReport::progressed(const QVPlayerProgress& progress) {
  message().set("frames", progress.frames).set("position", progress.position);
  payload_.set("buffer_fill", progress.bufferedFrames).set("xruns", progress.underruns);
  payload_.set("processing_time_us", progress.processingMicroseconds);
  send(kPerformance, QVClientMessageType::generic);
  if (progress.engineSeconds <= 0) return;
  message().set("EngineOnTime", progress.engineSeconds);
  send(kHaptics, QVClientMessageType::generic);
}

void QVPlayerReport::volumeChanged(int percent) {
  message().set("volume", percent / 100.0);
  send(kVolume, QVClientMessageType::generic);
}

void QVPlayerReport::routeChanged(const std::string& route) {
  message().set("route", route);
  send(kRouteChange, QVClientMessageType::generic);
}

void QVPlayerReport::playbackStopped(const QVPlayerProgress& progress, bool completely) {
  message().set("frames", progress.frames).set("position", progress.position);
  payload_.set("xruns", progress.underruns).set("completed", completely);
  send(kPlayback, QVClientMessageType::stop);
}

void QVPlayerReport::end() {
  const auto stopped = client_->stopReportingSessionForIDAndWait(options_.reporterID, kPatience);
  if (!stopped) sayOnce(stopped.error().text());
  const auto destroyed = client_->destroyReportingSessionAndWait(options_.reporterID, kPatience);
  if (!destroyed) sayOnce(destroyed.error().text());
}

QVClientPayload& QVPlayerReport::message() {
  payload_.clear();
  return payload_.set("qvreporting_timestamp", currentTimestamp());
}

void QVPlayerReport::send(QVClientCategory category, QVClientMessageType type) {
  const auto count = [this](const QVClientError& error) {
    ++(error ? lost_ : accepted_);
    note(error);
  };
  const QVClientError error =
      client_->sendMessage(payload_, category, type, options_.reporterID, count);
  if (error) ++lost_;
  note(error);
}

void QVPlayerReport::note(const QVClientError& error) {
  if (error) sayOnce(error.text());
}

void QVPlayerReport::sayOnce(const std::string& text) {
  if (said_.exchange(true)) return;
  std::fprintf(stderr, "qv-player: not everything is reported: %s; playing on\n", text.c_str());
}
