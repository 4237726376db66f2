// The commands that look: status, sessions, events, watch, channels, summary.

#include "tools/qvctl/QVChannelsCommand.h"
#include "tools/qvctl/QVCommandLineState.h"
#include "tools/qvctl/QVEventsCommand.h"
#include "tools/qvctl/QVSessionsCommand.h"
#include "tools/qvctl/QVStatusCommand.h"
#include "tools/qvctl/QVSummaryCommand.h"
#include "tools/qvctl/QVWatchCommand.h"

namespace {

constexpr const char* kStart = "Start a service that starts on demand";
constexpr const char* kFull = "Do not cut lines at the terminal's width";
constexpr const char* kFile = "Its number in the list (1, the latest), its name, or its path";

void addFilter(CLI::App& command, QVEventFilter::Words& words) {
  const auto addList = QVCommandLine::State::addList<std::vector<std::string>>;
  addList(command, "--kind", words.kinds, "start, message, analytics, energy, stop, loss",
          "KIND,...");
  addList(command, "--session", words.sessions, "Of these sessions", "ID,...");
  addList(command, "--service", words.services, "Of sessions of these service types", "NAME,...");
  addList(command, "--category", words.categories, "Playback, Session or Session.Playback",
          "NAME,...");
  addList(command, "--type", words.types, "Of these message types", "NAME,...");
  command.add_option("--name", words.names, "Of these names, * and ? match anything")
      ->option_text("PATTERN")
      ->allow_extra_args(false);
  command
      .add_option_function<std::string>(
          "--since", [&words](const std::string& word) { words.since = word; },
          "From then on: a time, or how long ago")
      ->option_text("TIME");
}

}  // namespace

void QVCommandLine::addInspection() {
  State& state = *state_;
  {
    const auto [command, options] = state.add<QVStatusCommand>(
        state.app, "status", "Whether the service runs, and how it fares");
    state.addJSON(*command);
    command->add_flag("--start", options->start, kStart);
  }
  {
    const auto [command, options] =
        state.add<QVSessionsCommand>(state.app, "sessions", "All sessions that there are");
    state.addJSON(*command);
    command->add_flag("--start", options->start, kStart);
  }
  {
    const auto [command, options] =
        state.add<QVEventsCommand>(state.app, "events", "What the store has kept");
    state.addJSON(*command);
    addFilter(*command, options->filter);
    const auto take = [to = options](const std::string& word) { to->filter.until = word; };
    command->add_option_function<std::string>("--until", take, "Up to then")->option_text("TIME");
    State::addNumber<std::size_t>(*command, "--last,-n", options->last, "The last N of them")
        ->option_text("N");
    command->add_flag("--full", options->full, kFull);
  }
  {
    const auto [command, options] =
        state.add<QVWatchCommand>(state.app, "watch", "What reaches the store, as it does");
    state.addJSON(*command);
    addFilter(*command, options->filter);
    State::addNumber<std::size_t>(*command, "--count", options->count, "End after N of them", 1)
        ->option_text("N");
    command->add_option("--for", options->duration, "End after so long")->option_text("DURATION");
    command->add_flag("--full", options->full, kFull);
  }
  {
    const auto [command, options] =
        state.add<QVChannelsCommand>(state.app, "channels", "What drivers publish now");
    state.addJSON(*command);
    command->add_option("--group", options->group, "Of this group alone")->option_text("NAME");
    command->add_option("--interval", options->interval, "Again and again, and what has grown")
        ->option_text("DURATION");
    State::addNumber<std::size_t>(*command, "--count", options->count, "End after N readings", 1)
        ->option_text("N");
  }
  addSummary();
}

void QVCommandLine::addSummary() {
  State& state = *state_;
  CLI::App& summary = state.addFamily("summary", "The files that sessions leave");
  using Operation = QVSummaryCommand::Operation;
  const auto add = [&](Operation operation, const char* name, const char* description) {
    const auto added = state.addMember<QVSummaryCommand>(summary, operation, name, description);
    if (operation != Operation::list) {
      added.first->add_option("file", added.second->file, kFile)->option_text("FILE");
    }
    if (operation != Operation::open) state.addJSON(*added.first);
    return added;
  };
  add(Operation::list, "list", "Which there are, the latest first");
  add(Operation::show, "show", "Print one");
  add(Operation::open, "open", "Open one in another program");
  const auto [plot, options] = add(Operation::plot, "plot", "Draw its numbers over its messages");
  State::addList(*plot, "--key", options->plot.keys, "These keys alone, * and ? match anything",
                 "PATTERN,...");
  State::addNumber<std::size_t>(*plot, "--width", options->plot.width, "Columns of the whole",
                                QVSummaryPlot::kSmallestColumns, QVSummaryPlot::kLargestColumns)
      ->option_text("N");
  State::addNumber<std::size_t>(*plot, "--height", options->plot.height, "Rows of each picture", 1,
                                QVSummaryPlot::kLargestRows)
      ->option_text("N");
  plot->add_flag("--ascii", options->plot.ascii, "Draw with ASCII alone");
}
