#include "tools/qvctl/QVReportingCommand.h"

#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVServiceConnection.h"
#include "tools/qvctl/QVServiceState.h"
#include "tools/qvctl/QVSwitchControl.h"

#include <optional>
#include <string>

namespace {

std::string textOf(const std::optional<bool>& isOn, const std::string& otherwise) {
  if (!isOn) return otherwise;
  return *isOn ? "on" : "off";
}

}  // namespace

QVToolStatus QVReportingCommand::run(const QVToolContext& context, const Options& options) {
  if (options.operation == Operation::show) return show(context);
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

QVToolStatus QVReportingCommand::show(const QVToolContext& context) {
  const auto isWanted = QVSwitchControl(context.places).isOn();
  std::optional<bool> isReporting;
  std::string problem;
  auto status = QVToolStatus::done;
  try {
    using Kind = QVServiceState::Kind;
    const QVServiceState state = QVServiceState::find(context.places);
    if (state.isRunning()) isReporting = QVServiceConnection(context.places).isReporting();
    if (state.kind == Kind::unknown || state.kind == Kind::unreachable) {
      throw QVToolFailure(QVToolStatus::notRunning, state.complaint(context.places));
    }
  } catch (const QVToolFailure& failure) {
    problem = failure.what();
    status = failure.status();
  }
  if (context.output.isJSON()) {
    const auto value = [](const std::optional<bool>& isOn) {
      return isOn ? QVValue(*isOn) : QVValue();
    };
    const QVDictionary shown{{"reporting", value(isReporting)},
                             {"reportingPreference", value(isWanted)}};
    context.output.json(problem.empty() ? shown : shown.merging({{"problem", problem}}));
    return status;
  }
  const std::string otherwise =
      problem.empty() ? "not running" : "cannot be asked: " + QVDisplayText(problem);
  context.output.line("service     " + textOf(isReporting, otherwise));
  context.output.line("preference  " + textOf(isWanted, "cannot be read"));
  return status;
}
