#include <quietvox/QVReporter.h>

int main() {
  const auto reporter = QVReporter::open();
  if (!reporter) return 1;  // reporter.error().text() says why
  const auto session =
      reporter.value()->openSession({.serviceType = QVClientServiceType::longformaudio});
  if (!session) return 1;
  session.value()->start();
  QVClientPayload message;
  message.set("frames", 480).set("route", "speaker");
  session.value()->sendMessage(message, {QVClientComponent::session, QVClientKind::playback},
                               QVClientMessageType::start);
  session.value()->stop();
  return reporter.value()->flush(std::chrono::seconds(5)) == QVClientError::Code::none ? 0 : 1;
}
