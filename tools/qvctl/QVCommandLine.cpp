#include "tools/qvctl/QVCommandLine.h"

#include "tools/qvctl/QVCommandLineState.h"
#include "tools/qvctl/QVToolOutput.h"

#include <sstream>

QVCommandLine::QVCommandLine() : state_(std::make_unique<State>()) {
  CLI::App& app = state_->app;
  app.name("qvctl");
  app.footer(State::kFooter);
  app.set_version_flag("--version", "qvctl " QV_VERSION, "Print the version and exit");
  app.set_help_flag("--help,-h", "Print this text and exit");
  app.require_subcommand(1);
  state_->addPlaces(app);
  state_->addJSON(app);
  addInspection();
  addSessions();
  addSettings();
}

QVCommandLine::~QVCommandLine() = default;

bool QVCommandLine::parse(int argc, const char* const* argv, QVToolStatus& status) {
  try {
    state_->app.parse(argc, argv);
    return true;
  } catch (const CLI::ParseError& error) {
    const bool isAnswer = error.get_exit_code() == 0;
    status = isAnswer ? QVToolStatus::done : QVToolStatus::wrongUsage;
    if (isAnswer) {
      // The help, or the version: output like any other.
      std::ostringstream text;
      state_->app.exit(error, text, text);
      QVToolOutput output(false);
      output.raw(text.str());
      output.flush();
    } else {
      QVToolOutput::note(State::complaint(state_->app, error) + " (--help says what there is)");
    }
    return false;
  }
}

bool QVCommandLine::wantsJSON() const {
  return state_->json;
}

QVToolPlaces QVCommandLine::places() const {
  return QVToolPlaces::find(state_->socket, state_->root);
}

QVToolStatus QVCommandLine::run(const QVToolContext& context) const {
  return state_->action(context);
}
