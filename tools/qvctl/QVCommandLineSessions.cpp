// The commands that take part: send and session.

#include "tools/qvctl/QVCommandLineState.h"
#include "tools/qvctl/QVSendCommand.h"
#include "tools/qvctl/QVSessionCommand.h"
#include "tools/qvctl/QVSessionRunCommand.h"

namespace {

void addMessage(CLI::App& command, QVSendCommand::Options& options) {
  command.add_option("--category", options.category, "What it is about (Session.Generic)")
      ->option_text("NAME");
  command.add_option("--type", options.type, "Its message type (Generic)")->option_text("NAME");
  command.add_option("--payload", options.json, "A JSON object, @FILE, or - for standard input")
      ->option_text("JSON");
  command.add_option("entries", options.entries, "What it says")
      ->option_text("KEY[:KIND]=VALUE...");
}

void addSetup(CLI::App& command, QVSessionSetup& setup) {
  command.add_option("--service", setup.service, "Its service type (generic)")->option_text("NAME");
  command.add_option("--set", setup.entries, "An entry of its configuration")
      ->option_text("KEY[:KIND]=VALUE")
      ->allow_extra_args(false);
  command.add_option("--configuration", setup.configuration, "A JSON object, @FILE, or -")
      ->option_text("JSON");
}

}  // namespace

void QVCommandLine::addSessions() {
  State& state = *state_;
  const std::string footer = std::string(State::kEntries).append("\n\n").append(State::kFooter);
  const auto [send, sendOptions] =
      state.add<QVSendCommand>(state.app, "send", "Send one message to sessions");
  const auto takeSessions = [to = sendOptions](const CLI::results_t& words) {
    for (const std::string& word : words) {
      to->sessions.push_back(State::number<int64_t>("--session", word));
    }
    return true;
  };
  send->add_option("--session", CLI::callback_t(takeSessions), "To these sessions")
      ->option_text("ID,...")
      ->delimiter(',')
      ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  send->add_flag("--all", sendOptions->toAll, "To every session that is started");
  addMessage(*send, *sendOptions);
  send->footer(footer);

  CLI::App& session = state.addFamily("session", "A session of one's own, for scripts");
  using Operation = QVSessionCommand::Operation;
  const auto add = [&](Operation operation, const char* name, const char* description) {
    const auto added = state.addMember<QVSessionCommand>(session, operation, name, description);
    if (operation != Operation::create) {
      State::addNumber<int64_t>(*added.first, "id", added.second->reporterID, "The session")
          ->option_text("ID")
          ->required();
    }
    return added;
  };
  const auto [create, createOptions] = add(Operation::create, "create", "Create one, and keep it");
  state.addJSON(*create);
  State::addNumber<int64_t>(*create, "id", createOptions->setup.reporterID,
                            "Its ID; else one is chosen")
      ->option_text("ID");
  addSetup(*create, createOptions->setup);
  create->add_flag("--start", createOptions->start, "Start it, too");
  create->footer(footer);
  add(Operation::start, "start", "Start one");
  {
    const auto [command, options] =
        state.add<QVSendCommand>(session, "send", "Send it one message");
    const auto take = [to = options](const CLI::results_t& words) {
      to->sessions = {State::number<int64_t>("id", words.front())};
      return true;
    };
    command->add_option("id", CLI::callback_t(take), "The session")->option_text("ID")->required();
    addMessage(*command, *options);
    command->footer(footer);
  }
  add(Operation::stop, "stop", "Stop one that was created here");
  add(Operation::destroy, "destroy", "Destroy one that was created here");

  const auto [run, runOptions] =
      state.add<QVSessionRunCommand>(session, "run", "Run a command, and report its life");
  State::addNumber<int64_t>(*run, "--id", runOptions->setup.reporterID, "The session's ID")
      ->option_text("ID");
  addSetup(*run, runOptions->setup);
  run->add_option("--category", runOptions->category, "Of its messages (Session.Generic)")
      ->option_text("NAME");
  run->add_flag("--anyway", runOptions->anyway, "Run it without the service, too");
  run->footer(footer);
  run->add_option("command", runOptions->command, "What is run; behind --")
      ->option_text("COMMAND [ARGUMENT...]")
      ->required();
}
