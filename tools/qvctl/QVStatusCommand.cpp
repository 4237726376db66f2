#include "tools/qvctl/QVStatusCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVReadOnlyStore.h"
#include "tools/qvctl/QVServiceConnection.h"
#include "tools/qvctl/QVSwitchControl.h"
#include "tools/qvctl/QVTimeText.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <map>
#include <system_error>

namespace {

using Style = QVToolOutput::Style;

constexpr std::size_t kTitleColumns = 11;

std::string sizeText(int64_t bytes) {
  constexpr double kMebibyte = 1024.0 * 1024.0;
  char text[48];
  std::snprintf(text, sizeof text, "%.1f MiB", static_cast<double>(bytes) / kMebibyte);
  return text;
}

QVValue optionalOf(const auto& value) {
  return value ? QVValue(*value) : QVValue();
}

std::string switchText(bool isOn) {
  return isOn ? "on" : "off";
}

}  // namespace

QVToolStatus QVStatusCommand::run(const QVToolContext& context, const Options& options) {
  const QVStatusCommand command(context);
  const Findings findings = command.find(options);
  if (context.output.isJSON()) {
    context.output.json(command.json(findings));
  } else {
    command.show(findings);
  }
  return findings.state.isRunning() ? QVToolStatus::done : QVToolStatus::notRunning;
}

QVStatusCommand::Findings QVStatusCommand::find(const Options& options) const {
  Findings findings;
  if (options.start) {
    // Once it answers, it runs.
    QVServiceConnection(context_.places).reporters();
  }
  findings.state = QVServiceState::find(context_.places);
  if (findings.state.isRunning()) {
    QVServiceConnection service(context_.places);
    findings.sessions = service.reporters().size();
    findings.isReporting = service.isReporting();
  }
  findings.isWanted = QVSwitchControl(context_.places).isOn();
  findings.store = findStore();
  return findings;
}

QVStatusCommand::Store QVStatusCommand::findStore() const {
  Store found;
  const std::filesystem::path path = context_.places.directories.store();
  try {
    const auto store = QVReadOnlyStore::open(path);
    if (store == nullptr) return found;
    found.isThere = true;
    for (const char* suffix : {"", "-wal"}) {
      std::error_code missing;
      const auto bytes = std::filesystem::file_size(path.string() + suffix, missing);
      if (!missing) found.bytes += static_cast<int64_t>(bytes);
    }
    // Rows are added at one end and removed at the other. Each end is one look; counting them all,
    // or asking for both at once, would read the whole table. In a damaged store the numbers may be
    // any.
    const auto count = [&store](const char* table) {
      const int64_t last = store->number(QVText("SELECT max(id) FROM ", table));
      if (last <= 0) return int64_t{0};
      return last - std::max<int64_t>(store->number(QVText("SELECT min(id) FROM ", table)), 1) + 1;
    };
    found.sessions = count("beacon_session");
    found.messages = count("beacon_message");
    found.analytics = count("countwise_event");
    found.energy = count("joulewell_event");
    QVStoreQuery losses(*store, "SELECT cause, total(count) FROM loss GROUP BY cause");
    while (losses.next()) {
      found.losses.emplace_back(std::string(losses.text(0)), losses.integer(1));
    }
  } catch (const QVToolFailure& failure) {
    found.problem = failure.what();
  }
  return found;
}

QVValue QVStatusCommand::json(const Findings& findings) const {
  const QVServiceState& state = findings.state;
  std::vector<QVValue> clients;
  for (const auto& client : state.clients) {
    clients.emplace_back(
        QVDictionary{{"pid", client.pid == 0 ? QVValue() : QVValue(client.pid)},
                     {"name", client.pid == 0 ? QVValue() : QVValue(client.name)}});
  }
  std::vector<QVDictionaryEntry> losses;
  for (const auto& [cause, count] : findings.store.losses) losses.push_back({cause, count});
  const Store& store = findings.store;
  QVDictionary stored{{"path", context_.places.directories.store().string()},
                      {"present", store.isThere}};
  if (store.isThere) {
    stored = stored.merging({{"bytes", store.bytes},
                             {"sessions", store.sessions},
                             {"messages", store.messages},
                             {"analytics", store.analytics},
                             {"energy", store.energy},
                             {"losses", QVDictionary::assemble(losses)}});
  }
  if (!store.problem.empty()) stored = stored.merging({{"problem", store.problem}});
  const QVDictionary status{
      {"running",
       state.kind == QVServiceState::Kind::unknown ? QVValue() : QVValue(state.isRunning())},
      {"state", state.word()},
      {"socket", context_.places.socket.string()},
      {"pid", state.pid == 0 ? QVValue() : QVValue(state.pid)},
      {"since", state.since ? QVValue(QVUniversalTimeText(*state.since)) : QVValue()},
      {"clients", QVArray::assemble(clients)},
      {"sessions", optionalOf(findings.sessions)},
      {"reporting", optionalOf(findings.isReporting)},
      {"reportingPreference", optionalOf(findings.isWanted)},
      {"store", stored}};
  const std::string problem = context_.places.socketProblem();
  return problem.empty() ? status : status.merging({{"problem", problem}});
}

void QVStatusCommand::showLine(const char* title, const std::string& text, Style style) const {
  std::string line(title);
  line.resize(kTitleColumns, ' ');
  // On a terminal as much as there is room for.
  const std::size_t columns = context_.output.columns();
  const std::string shown =
      columns > kTitleColumns ? QVClippedText(text, columns - kTitleColumns) : text;
  context_.output.line(context_.output.painted(Style::title, line) +
                       context_.output.painted(style, shown));
}

void QVStatusCommand::show(const Findings& findings) const {
  const QVServiceState& state = findings.state;
  std::string service = state.word();
  if (state.pid != 0) service.append(QVText(", process ", state.pid));
  showLine("service", service, state.isRunning() ? Style::good : Style::bad);
  const std::string problem = context_.places.socketProblem();
  showLine("socket", QVDisplayText(problem.empty() ? context_.places.socket.string() : problem));
  if (state.since) {
    const std::chrono::microseconds elapsed(QVTimeNow() - *state.since);
    showLine("since",
             QVText(QVLocalTimeText(*state.since, false), " (", QVElapsedText(elapsed), ")"));
  }
  if (state.isRunning()) {
    std::map<std::string, int> names;
    for (const auto& client : state.clients) ++names[client.pid == 0 ? "?" : client.name];
    std::string text = std::to_string(state.clients.size());
    for (const auto& [name, count] : names) {
      text.append(name == names.begin()->first ? ": " : ", ").append(QVDisplayText(name));
      if (count > 1) text.append(QVText(" (", count, ")"));
    }
    showLine("clients", text);
  }
  if (findings.sessions) showLine("sessions", std::to_string(*findings.sessions));
  std::string reporting = findings.isReporting ? switchText(*findings.isReporting) : std::string();
  if (!findings.isWanted) {
    reporting.append(reporting.empty() ? "?" : "").append(" (the preference cannot be read)");
  } else if (!findings.isReporting) {
    reporting = "preference: " + switchText(*findings.isWanted);
  } else if (findings.isWanted != findings.isReporting) {
    reporting.append(QVText(" (preference: ", switchText(*findings.isWanted), ", not posted)"));
  }
  showLine("reporting", reporting);
  const Store& store = findings.store;
  const std::string path = QVDisplayText(context_.places.directories.store().string());
  if (!store.problem.empty()) {
    showLine("store", QVDisplayText(store.problem), Style::bad);
  } else if (!store.isThere) {
    showLine("store", path + ", not there");
  } else {
    showLine("store", QVText(path, ", ", sizeText(store.bytes)));
    showLine("", QVText(store.sessions, " sessions, ", store.messages, " messages, ",
                        store.analytics, " analytics events, ", store.energy, " energy events"));
    if (store.losses.empty()) showLine("losses", "none");
    for (const auto& [cause, count] : store.losses) {
      showLine("losses", QVText(count, " ", QVDisplayText(cause)), Style::bad);
    }
  }
}
