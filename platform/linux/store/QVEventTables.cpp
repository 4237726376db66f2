#include "platform/linux/store/QVEventTables.h"

#include "platform/linux/store/QVEventStoreSchema.h"

#include <array>
#include <utility>

#include <sqlite3.h>

namespace {

// Losses of one cause are added up in one row for so long, in microseconds: a store at its limit
// loses rows with every transaction.
constexpr int64_t kLossRowLife = 3'600'000'000;

}  // namespace

QVEventTables::QVEventTables(int64_t limit) : retention_(limit) {}

QVEventTables::Opening QVEventTables::open(const std::string& path, const std::string& vfs,
                                           int64_t now, std::string& reason) {
  close();
  if (database_.open(path, vfs) != SQLITE_OK) {
    reason = database_.message();
    close();
    return Opening::refused;
  }
  const QVEventStoreSchema::Result schema = QVEventStoreSchema::prepare(database_, reason);
  if (schema != QVEventStoreSchema::Result::ready) {
    close();
    return schema == QVEventStoreSchema::Result::damaged ? Opening::damaged : Opening::refused;
  }
  int result = prepareStatements();
  if (result == SQLITE_OK) result = retention_.prepare(database_, now);
  if (result != SQLITE_OK) {
    reason = database_.message();
    close();
    // Tables that do not fit the statements are not ours, whatever their version says.
    const bool damaged = QVSQLiteDatabase::isDamage(result) || (result & 0xFF) == SQLITE_ERROR;
    return damaged ? Opening::damaged : Opening::refused;
  }
  ++number_;
  return Opening::opened;
}

void QVEventTables::close() {
  for (QVSQLiteStatement* statement : {&begin_, &commit_, &rollback_, &session_, &message_,
                                       &countwise_, &joulewell_, &flush_, &newLoss_, &moreLoss_}) {
    statement->finalize();
  }
  retention_.release();
  lossRows_.clear();
  database_.close();
}

int QVEventTables::prepareStatements() {
  const std::array<std::pair<QVSQLiteStatement*, const char*>, 10> statements{{
      {&begin_, "BEGIN IMMEDIATE"},
      {&commit_, "COMMIT"},
      {&rollback_, "ROLLBACK"},
      {&session_,
       "INSERT INTO beacon_session(id, opened_at, session_id, token, client_type, client_version,"
       " batch_event, contains_realtime_events, user_info) VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?)"},
      {&message_,
       "INSERT INTO beacon_message(sent_at, session, session_id, client_name, service_name,"
       " category, type, payload) VALUES(?, ?, ?, ?, ?, ?, ?, ?)"},
      {&countwise_, "INSERT INTO countwise_event(sent_at, name, payload) VALUES(?, ?, ?)"},
      {&joulewell_,
       "INSERT INTO joulewell_event(sent_at, agent, name, payload) VALUES(?, ?, ?, ?)"},
      {&flush_, "UPDATE beacon_session SET flushed_at = ? WHERE id = ?"},
      {&newLoss_, "INSERT INTO loss(at, cause, count) VALUES(?, ?, ?)"},
      {&moreLoss_, "UPDATE loss SET at = ?, count = count + ? WHERE id = ?"},
  }};
  for (const auto& [statement, text] : statements) {
    if (const int result = statement->prepare(database_, text); result != SQLITE_OK) return result;
  }
  QVSQLiteStatement lastSession;
  nextSession_ = 0;
  int result = lastSession.prepare(database_, "SELECT max(id) FROM beacon_session");
  if (result == SQLITE_OK) result = lastSession.read(nextSession_);
  ++nextSession_;
  return result;
}

int QVEventTables::begin() {
  const int result = begin_.run();
  return result == SQLITE_OK ? retention_.begin() : result;
}

int QVEventTables::insert(const QVBeaconSessionRow& row) {
  return insertSessionRow(row.session, row.time, text(row.userInfo));
}

int QVEventTables::insert(const QVBeaconMessageRow& row) {
  const QVEventSession& session = *row.session;
  if (!session.single && session.database != number_) {
    if (const int result = insertBareSession(row.session, row.time); result != SQLITE_OK)
      return result;
  }
  const std::string_view payload = text(row.payload);
  int result =
      retention_.makeRoom(payload.size() + session.clientName.size() + session.serviceName.size());
  if (result != SQLITE_OK) return result;
  message_.bind(1, row.time);
  if (session.single) {
    message_.bindNull(2);
  } else {
    message_.bind(2, session.row);
  }
  message_.bind(3, session.sessionID);
  message_.bind(4, session.clientName);
  message_.bind(5, session.serviceName);
  message_.bind(6, int64_t{row.category});
  message_.bind(7, int64_t{row.type});
  message_.bind(8, payload);
  result = message_.run();
  if (result == SQLITE_OK) retention_.noteRow(QVEventRetention::kMessages, database_.lastRow());
  return result;
}

int QVEventTables::insert(const QVCountwiseRow& row) {
  const std::string_view payload = text(row.payload);
  int result = retention_.makeRoom(payload.size() + row.name.size());
  if (result != SQLITE_OK) return result;
  countwise_.bind(1, row.time);
  countwise_.bind(2, row.name);
  countwise_.bind(3, payload);
  result = countwise_.run();
  if (result == SQLITE_OK) retention_.noteRow(QVEventRetention::kCountwise, database_.lastRow());
  return result;
}

int QVEventTables::insert(const QVJoulewellRow& row) {
  const std::string_view payload = text(row.payload);
  int result = retention_.makeRoom(payload.size() + row.name.size());
  if (result != SQLITE_OK) return result;
  joulewell_.bind(1, row.time);
  joulewell_.bind(2, int64_t{row.agent});
  joulewell_.bind(3, row.name);
  joulewell_.bind(4, payload);
  result = joulewell_.run();
  if (result == SQLITE_OK) retention_.noteRow(QVEventRetention::kJoulewell, database_.lastRow());
  return result;
}

int QVEventTables::insert(const QVFlushRow& row) {
  if (row.session->database != number_) return SQLITE_OK;
  flush_.bind(1, row.time);
  flush_.bind(2, row.session->row);
  return flush_.run();
}

int QVEventTables::insertSessionRow(const std::shared_ptr<QVEventSession>& session, int64_t time,
                                    std::string_view userInfo) {
  int result = retention_.makeRoom(userInfo.size() + session->token.size());
  if (result != SQLITE_OK) return result;
  session_.bind(1, nextSession_);
  session_.bind(2, time);
  session_.bind(3, session->sessionID);
  session_.bind(4, session->token);
  session_.bind(5, session->clientType);
  session_.bind(6, session->clientVersion);
  session_.bind(7, int64_t{session->batchEvent ? 1 : 0});
  session_.bind(8, int64_t{session->containsRealtimeEvents ? 1 : 0});
  session_.bind(9, userInfo);
  result = session_.run();
  if (result == SQLITE_OK) {
    session->row = nextSession_++;
    session->database = number_;
    newSessions_.push_back(session);
  }
  return result;
}

// A session that is not in this database, because its row was lost or went with a damaged file,
// gets a row with what is still known of it.
int QVEventTables::insertBareSession(const std::shared_ptr<QVEventSession>& session, int64_t time) {
  const QVDictionary userInfo{{kBeaconUserInfoClientName, session->clientName},
                              {kBeaconUserInfoServiceName, session->serviceName}};
  return insertSessionRow(session, time, text(userInfo));
}

int QVEventTables::commit(QVEventLosses& losses, int64_t now) {
  for (const auto& [cause, count] : losses) {
    if (const int result = insertLoss(cause, count, now); result != SQLITE_OK) return result;
  }
  if (retention_.removed() > 0) {
    const int result = insertLoss(kLossLimit, retention_.removed(), now);
    if (result != SQLITE_OK) return result;
  }
  const int result = commit_.run();
  if (result == SQLITE_OK) {
    losses.clear();
    newSessions_.clear();
  }
  return result;
}

int QVEventTables::insertLoss(std::string_view cause, int64_t count, int64_t now) {
  const auto known = lossRows_.find(cause);
  if (known != lossRows_.end() && now - known->second.since < kLossRowLife) {
    moreLoss_.bind(1, now);
    moreLoss_.bind(2, count);
    moreLoss_.bind(3, known->second.id);
    const int result = moreLoss_.run();
    // Somebody may have removed the row.
    if (result != SQLITE_OK || database_.changes() > 0) return result;
  }
  newLoss_.bind(1, now);
  newLoss_.bind(2, cause);
  newLoss_.bind(3, count);
  const int result = newLoss_.run();
  if (result == SQLITE_OK) {
    lossRows_.insert_or_assign(std::string(cause),
                               LossRow{.id = database_.lastRow(), .since = now});
  }
  return result;
}

void QVEventTables::rollback() {
  for (const auto& session : newSessions_) session->database = 0;
  newSessions_.clear();
  lossRows_.clear();
  retention_.noteRollback();
  // SQLite has rolled back by itself after some failures. What fails here shows at the next begin.
  if (database_.inTransaction()) static_cast<void>(rollback_.run());
}

void QVEventTables::giveMemoryBack() {
  json_.clear();
  database_.giveMemoryBack();
  textBytesGivenBack_ = textBytes_;
}

std::string_view QVEventTables::text(const QVDictionary& payload) {
  const std::string_view written = json_.write(payload);
  textBytes_ += written.size();
  return written;
}
