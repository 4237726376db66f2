#include <quietvox/QVReporter.h>

int main() {
  const auto reporter = QVReporter::open();
  if (!reporter) return 1;  // reporter.error().text() says why
  const auto session =
      reporter.value()->openSession({.serviceType = QVClientServiceType::longformaudio});
  if (!session) return 1;
  session.value()->start();
  QVClientPayload message;
  message.set("frames", 48000).set("xruns", 0).set("route", "Speaker");
  session.value()->sendMessage(message, {QVClientComponent::session, QVClientKind::playback},
                               QVClientMessageType::start);
  session.value()->stop();
}
