// The commands that change the service: reporting and kill.

#include "tools/qvctl/QVCommandLineState.h"
#include "tools/qvctl/QVKillCommand.h"
#include "tools/qvctl/QVReportingCommand.h"

void QVCommandLine::addSettings() {
  State& state = *state_;
  CLI::App& reporting = *state.app.add_subcommand("reporting", "The reporting switch");
  reporting.require_subcommand(1);
  using Operation = QVReportingCommand::Operation;
  const auto add = [&](Operation operation, const char* name, const char* description) {
    const auto [command, options] = state.add<QVReportingCommand>(reporting, name, description);
    options->operation = operation;
    state.addJSON(*command);
  };
  add(Operation::on, "on", "Switch reporting on");
  add(Operation::off, "off", "Switch reporting off: messages are refused, nothing is stored");
  add(Operation::show, "show", "What the service does, and what the preference says");
  state.add<QVKillCommand>(state.app, "kill",
                           "End the service at once; what is not stored is lost");
}
