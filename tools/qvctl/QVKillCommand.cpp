#include "tools/qvctl/QVKillCommand.h"

#include "tools/qvctl/QVServiceConnection.h"
#include "tools/qvctl/QVServiceState.h"

QVToolStatus QVKillCommand::run(const QVToolContext& context, const Options& /*options*/) {
  const QVServiceState state = QVServiceState::find(context.places);
  if (!state.isRunning()) {
    throw QVToolFailure(QVToolStatus::notRunning, state.complaint(context.places));
  }
  QVServiceConnection(context.places).ask(&QVClient::killServiceAndWait);
  return QVToolStatus::done;
}
