// A program that reports, as one is built against the installed library.

#include <cstdio>

#include <quietvox/QVClient.h>

int main() {
  auto connected = QVClient::connect();
  if (!connected) return std::fprintf(stderr, "%s\n", connected.error().text().c_str()), 1;
  QVClient& client = *connected.value();
  client.createReportingSessionAndWait(4711);
  client.setServiceTypeAndWait(QVClientServiceType::nonlongformaudio, 4711);
  client.startReportingSessionForIDAndWait(4711, nullptr);
  QVClientPayload message;
  message.set("frames", 480).set("language", "C++");
  const QVClientError error =
      client.sendMessageAndWait(message, {QVClientComponent::session, QVClientKind::playback},
                                QVClientMessageType::start, 4711);
  client.stopReportingSessionForIDAndWait(4711);
  return error ? std::fprintf(stderr, "%s\n", error.text().c_str()), 1 : 0;
}
