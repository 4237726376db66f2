#include "tools/qvctl/QVSessionCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVServiceState.h"
#include "tools/qvctl/QVSessionKeeper.h"

QVToolStatus QVSessionCommand::run(const QVToolContext& context, const Options& options) {
  const QVSessionKeeper keeper(context.places);
  switch (options.operation) {
    case Operation::create:
      create(context, options);
      break;
    case Operation::start:
      start(context, options.reporterID);
      break;
    case Operation::stop:
      keeper.ask(options.reporterID, QVSessionKeeper::Request::stop);
      break;
    case Operation::destroy:
      keeper.ask(options.reporterID, QVSessionKeeper::Request::destroy);
      break;
  }
  return QVToolStatus::done;
}

void QVSessionCommand::create(const QVToolContext& context, const Options& options) {
  options.setup.check();
  const QVSessionKeeper keeper(context.places);
  const auto tell = [&output = context.output](const QVSessionKeeper::Kept& kept) {
    if (output.isJSON()) {
      output.json(QVDictionary{{"session", kept.reporterID}, {"keeper", kept.keeper}});
    } else {
      output.line(std::to_string(kept.reporterID));
    }
    output.flush();
  };
  try {
    keeper.start(options.setup, options.start, tell);
  } catch (const QVReaderGone&) {
    throw QVToolFailure(QVToolStatus::failed, "nobody reads which session was created");
  }
}

void QVSessionCommand::start(const QVToolContext& context, int64_t reporterID) {
  // A service that does not run has no session to be started.
  const QVServiceState state = QVServiceState::find(context.places);
  if (state.kind == QVServiceState::Kind::stopped) {
    throw QVToolFailure(QVToolStatus::notRunning, state.complaint(context.places));
  }
  QVServiceConnection service(context.places);
  if (!service.serviceType(reporterID)) {
    throw QVToolFailure(QVToolStatus::failed, QVText("there is no session ", reporterID));
  }
  service.ask(&QVClient::startReportingSessionForIDAndWait, reporterID, nullptr);
}
