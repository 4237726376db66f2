#include "tools/qvctl/QVSessionsCommand.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "platform/QVText.h"
#include "platform/linux/files/QVJSONFile.h"
#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVReadOnlyStore.h"
#include "tools/qvctl/QVServiceConnection.h"
#include "tools/qvctl/QVTable.h"
#include "tools/qvctl/QVTimeText.h"

#include <algorithm>
#include <set>
#include <utility>

namespace {

// Starts of sessions that are looked through, the latest ones: more than the service has had
// running at a time, and still a fraction of a second.
constexpr int64_t kMaximumStarts = 100'000;

// A process's start is known to the second only, in microseconds.
constexpr int64_t kStartTolerance = 2'000'000;

// Columns that are left of applications and owners on a narrow terminal, where there is room.
constexpr std::size_t kLeastOfNames = 11;

std::string applicationIn(std::string_view userInfo) {
  QVJSONFailure failure;
  const auto value = QVJSONFile::parse(userInfo, failure);
  if (!value || value->kind() != QVValue::Kind::dictionary) return {};
  const QVDictionary entries = value->dictionary();
  const QVValue* const application = entries.find(kQVReportingHostApplicationKey);
  return application == nullptr ? std::string() : QVText(*application);
}

}  // namespace

QVToolStatus QVSessionsCommand::run(const QVToolContext& context, const Options& options) {
  const std::vector<Session> sessions = find(context, options);
  if (context.output.isJSON()) {
    std::vector<QVValue> all;
    for (const Session& session : sessions) all.push_back(json(session));
    context.output.json(QVArray::assemble(all));
    return QVToolStatus::done;
  }
  QVTable table(context.output, {{"SESSION", QVTable::Align::right},
                                 {"SERVICE"},
                                 {"STARTED"},
                                 {.title = "APPLICATION", .least = kLeastOfNames},
                                 {.title = "OWNER", .least = kLeastOfNames}});
  for (const Session& session : sessions) {
    table.add({std::to_string(session.reporterID),
               session.serviceType ? QVServiceTypeText(*session.serviceType) : "-",
               session.since ? QVLocalTimeText(*session.since, false) : "-",
               session.application.empty() ? "-" : session.application,
               session.owner ? QVText(session.owner->name, " ", session.owner->pid) : "-"});
  }
  table.print();
  return QVToolStatus::done;
}

std::vector<QVSessionsCommand::Session> QVSessionsCommand::find(const QVToolContext& context,
                                                                const Options& options) {
  const QVServiceState state = QVServiceState::find(context.places);
  if (!state.isRunning() && !options.start) {
    std::string text = state.complaint(context.places);
    if (state.kind == QVServiceState::Kind::onDemand) text += "; it starts on demand: --start";
    if (state.kind == QVServiceState::Kind::unknown) text += "; --start asks it all the same";
    throw QVToolFailure(QVToolStatus::notRunning, text);
  }
  QVServiceConnection service(context.places);
  std::vector<Session> sessions;
  for (const int64_t reporterID : service.reporters()) {
    Session session;
    session.reporterID = reporterID;
    session.serviceType = service.serviceType(reporterID);
    sessions.push_back(std::move(session));
  }
  std::set<pid_t> owners;
  for (const auto& client : state.clients) owners.insert(client.pid);
  if (owners.size() == 1 && *owners.begin() != 0) {
    for (Session& session : sessions) session.owner = state.clients.front();
  }
  std::ranges::sort(sessions, {}, &Session::reporterID);
  addStored(context, state.since.value_or(0), sessions);
  return sessions;
}

void QVSessionsCommand::addStored(const QVToolContext& context, int64_t serviceStart,
                                  std::vector<Session>& sessions) {
  std::unique_ptr<QVReadOnlyStore> store;
  try {
    store = QVReadOnlyStore::open(context.places.directories.store());
  } catch (const QVToolFailure& failure) {
    QVToolOutput::note(failure.what());
  }
  if (store == nullptr || sessions.empty()) return;
  // The latest first. Rows of before the service's start are of sessions that it left behind when
  // it was killed.
  QVStoreQuery starts(*store,
                      "SELECT session_id, opened_at, user_info FROM beacon_session WHERE id > "
                      "(SELECT max(id) FROM beacon_session) - ?1 AND opened_at >= ?2 AND "
                      "flushed_at IS NULL ORDER BY id DESC");
  starts.bind(1, kMaximumStarts);
  starts.bind(2, serviceStart - kStartTolerance);
  std::set<int64_t> seen;
  while (starts.next()) {
    const int64_t reporterID = starts.integer(0);
    if (!seen.insert(reporterID).second) continue;
    for (Session& session :
         std::ranges::equal_range(sessions, reporterID, {}, &Session::reporterID)) {
      session.since = starts.integer(1);
      session.application = applicationIn(starts.text(2));
    }
  }
}

QVValue QVSessionsCommand::json(const Session& session) {
  std::vector<QVDictionaryEntry> entries;
  const auto add = [&entries](std::string_view key, QVValue value) {
    entries.push_back({key, std::move(value)});
  };
  add("session", session.reporterID);
  add("serviceType", session.serviceType ? QVValue(*session.serviceType) : QVValue());
  add("service",
      session.serviceType ? QVValue(QVServiceTypeText(*session.serviceType)) : QVValue());
  add("since", session.since ? QVValue(QVUniversalTimeText(*session.since)) : QVValue());
  add("started", session.since.has_value());
  add("application", session.application.empty() ? QVValue() : QVValue(session.application));
  add("owner", session.owner ? QVValue(QVDictionary{{"pid", session.owner->pid},
                                                    {"name", session.owner->name}})
                             : QVValue());
  return QVDictionary::assemble(entries);
}
