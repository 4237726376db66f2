// The commands that change the service: reporting and kill.

#include "tools/qvctl/QVCommandLineState.h"
#include "tools/qvctl/QVKillCommand.h"
#include "tools/qvctl/QVReportingCommand.h"

void QVCommandLine::addSettings() {
  State& state = *state_;
  CLI::App& reporting = state.addFamily("reporting", "The reporting switch");
  using Operation = QVReportingCommand::Operation;
  const auto add = [&](Operation operation, const char* name, const char* description) {
    state.addJSON(
        *state.addMember<QVReportingCommand>(reporting, operation, name, description).first);
  };
  add(Operation::on, "on", "Switch reporting on");
  add(Operation::off, "off", "Switch reporting off: messages are refused, nothing is stored");
  add(Operation::show, "show", "What the service does, and what the preference says");
  state.add<QVKillCommand>(state.app, "kill",
                           "End the service at once; what is not stored is lost");
}
