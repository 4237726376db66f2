#include "tools/qvctl/QVCommandLine.h"

#include "tools/qvctl/QVCommandLineState.h"
#include "tools/qvctl/QVToolOutput.h"

#include <algorithm>
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
    State::refuseEmptyWords(state_->app);
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

std::string QVCommandLine::State::complaint(const CLI::App& app, const CLI::ParseError& error) {
  const std::vector<std::string> left = app.remaining(true);
  const bool isMissing = error.get_exit_code() == static_cast<int>(CLI::ExitCodes::RequiredError);
  if (!isMissing || left.empty()) return error.what();
  const char* const what = left.front().starts_with('-') ? "option" : "command";
  return std::string("no ").append(what).append(" is called \"").append(left.front()).append("\"");
}

void QVCommandLine::State::addPlaces(CLI::App& command) {
  command.add_option("--socket", socket, "The service's socket")->option_text("PATH");
  command.add_option("--root", root, "Root directory of the system that is looked at")
      ->option_text("DIR");
}

void QVCommandLine::State::addJSON(CLI::App& command) {
  command.add_flag("--json", json, "Print JSON, one value a line");
}

void QVCommandLine::State::refuseEmptyWords(const CLI::App& command) {
  for (const CLI::Option* const option : command.get_options()) {
    // A command's arguments and entries are judged where they are taken.
    const bool isRest = option->get_positional() && option->get_items_expected_max() > 1;
    const auto& words = option->results();
    if (isRest || std::ranges::find(words, "") == words.end()) continue;
    throw CLI::ValidationError(option->get_name(), "\"\" is no value");
  }
  for (const CLI::App* const below : command.get_subcommands()) refuseEmptyWords(*below);
}

CLI::App& QVCommandLine::State::addFamily(const char* name, const char* description) {
  CLI::App& family = *app.add_subcommand(name, description);
  family.require_subcommand(1);
  return family;
}
