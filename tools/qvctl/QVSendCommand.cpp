#include "tools/qvctl/QVSendCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVEnvironment.h"
#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVServiceConnection.h"
#include "tools/qvctl/QVTypedValue.h"

#include <charconv>

namespace {

void addSessionOfEnvironment(std::vector<int64_t>& sessions) {
  const std::string text = QVEnvironment(QVSendCommand::kSessionVariable);
  int64_t session = 0;
  const auto [end, problem] = std::from_chars(text.data(), text.data() + text.size(), session);
  if (text.empty()) return;
  if (problem != std::errc() || end != text.data() + text.size()) {
    throw QVToolFailure(QVToolStatus::wrongUsage, QVText(QVSendCommand::kSessionVariable, ": \"",
                                                         text, "\" is no session's ID"));
  }
  sessions.push_back(session);
}

}  // namespace

QVToolStatus QVSendCommand::run(const QVToolContext& context, Options options) {
  const auto wrong = [](const std::string& text) {
    return QVToolFailure(QVToolStatus::wrongUsage, text);
  };
  if (options.sessions.empty() && !options.toAll) addSessionOfEnvironment(options.sessions);
  if (options.sessions.empty() != options.toAll) {
    throw wrong(options.toAll ? "either sessions or every session"
                              : "to which session? --session ID, or --all");
  }
  const auto category = QVParseCategory(options.category);
  if (!category) throw wrong(QVText("no category is called \"", options.category, "\""));
  const auto type = QVParseMessageType(options.type);
  if (!type) throw wrong(QVText("no message type is called \"", options.type, "\""));
  const QVClientPayload payload =
      QVMakePayload(QVPayloadOf::message, options.json, options.entries);

  QVServiceConnection service(context.places);
  // The service itself says nothing of a message to a session that there is not.
  for (const int64_t session : options.sessions) {
    if (!service.serviceType(session)) {
      throw QVToolFailure(QVToolStatus::failed, QVText("there is no session ", session));
    }
  }
  const QVClientTargets targets = options.toAll
                                      ? QVClientTargets::everySession()
                                      : QVClientTargets(std::span<const int64_t>(options.sessions));
  service.ask(&QVClient::sendMessageAndWait, payload, QVClientCategory(*category),
              static_cast<QVClientMessageType>(*type), targets);
  return QVToolStatus::done;
}
