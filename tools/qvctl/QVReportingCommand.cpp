#include "tools/qvctl/QVReportingCommand.h"

#include "tools/qvctl/QVServiceConnection.h"
#include "tools/qvctl/QVServiceState.h"
#include "tools/qvctl/QVSwitchControl.h"

#include <optional>
#include <string>

namespace {

std::string textOf(const std::optional<bool>& isOn, const char* otherwise) {
  if (!isOn) return otherwise;
  return *isOn ? "on" : "off";
}

}  // namespace

QVToolStatus QVReportingCommand::run(const QVToolContext& context, const Options& options) {
  if (options.operation == Operation::show) {
    show(context);
    return QVToolStatus::done;
  }
  const bool isOn = options.operation == Operation::on;
  const bool isPosted = QVSwitchControl(context.places).set(isOn);
  if (context.output.isJSON()) {
    context.output.json(QVDictionary{{"reportingPreference", isOn}, {"posted", isPosted}});
  } else if (!isPosted) {
    QVToolOutput::note("written; the service does not run, it has to be told when it does: " +
                       context.places.reportingNotification().string());
  }
  return QVToolStatus::done;
}

void QVReportingCommand::show(const QVToolContext& context) {
  const auto isWanted = QVSwitchControl(context.places).isOn();
  std::optional<bool> isReporting;
  if (QVServiceState::find(context.places).isRunning()) {
    isReporting = QVServiceConnection(context.places).isReporting();
  }
  if (context.output.isJSON()) {
    const auto value = [](const std::optional<bool>& isOn) {
      return isOn ? QVValue(*isOn) : QVValue();
    };
    context.output.json(
        QVDictionary{{"reporting", value(isReporting)}, {"reportingPreference", value(isWanted)}});
    return;
  }
  context.output.line("service     " + textOf(isReporting, "not running"));
  context.output.line("preference  " + textOf(isWanted, "cannot be read"));
}
