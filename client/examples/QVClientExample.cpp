#include "client/QVClient.h"

#include <cstdio>

int main() {
  auto connected = QVClient::connect();
  if (!connected) return std::fprintf(stderr, "%s\n", connected.error().text().c_str()), 1;
  QVClient& client = *connected.value();
  client.createReportingSessionAndWait(7);
  client.startReportingSessionForIDAndWait(7, nullptr);
  QVClientPayload message;
  message.set("frames", 480).set("route", "speaker");
  const QVClientError error = client.sendMessageAndWait(
      message, {QVClientComponent::session, QVClientKind::playback}, QVClientMessageType::start, 7);
  client.stopReportingSessionForIDAndWait(7);
  return error ? std::fprintf(stderr, "%s\n", error.text().c_str()), 1 : 0;
}
