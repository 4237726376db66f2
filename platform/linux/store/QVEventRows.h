#pragma once

#include "platform/QVBeacon.h"
#include "platform/QVCountwise.h"
#include "platform/linux/store/QVEventSession.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

// What is handed to the event store's writer: rows, in lanes by table, in their order of arrival.
// Times are microseconds since the epoch. Plain data; a row belongs to one thread at a time.

struct QVBeaconSessionRow {
  int64_t time = 0;
  std::shared_ptr<QVEventSession> session;
  QVDictionary userInfo;

  std::size_t footprint() const { return sizeof *this + userInfo.footprint(); }
};

struct QVBeaconMessageRow {
  int64_t time = 0;
  std::shared_ptr<QVEventSession> session;
  uint16_t category = 0;
  uint16_t type = 0;
  QVDictionary payload;

  std::size_t footprint() const { return sizeof *this + payload.footprint(); }
};

struct QVCountwiseRow {
  enum class State : uint8_t { unasked, wanted, unwanted };

  int64_t time = 0;
  std::string name;
  QVCountwise::PayloadCallback callback;  // until it is asked
  QVDictionary payload{};                 // from then on
  State state = State::unasked;

  std::size_t footprint() const { return sizeof *this + name.size() + payload.footprint(); }
};

struct QVJoulewellRow {
  int64_t time = 0;
  int32_t agent = 0;
  std::string name;
  QVDictionary payload;

  std::size_t footprint() const { return sizeof *this + name.size() + payload.footprint(); }
};

// A session's flush: sets its flushed_at, and is answered once everything before it is stored.
struct QVFlushRow {
  int64_t time = 0;
  std::shared_ptr<QVEventSession> session;
  QVBeaconSession::FlushCompletion completion;

  std::size_t footprint() const { return sizeof *this; }
};

template <class Row>
struct QVEventLane {
  std::vector<Row> rows;
  std::size_t head = 0;  // rows before it were given up

  bool empty() const { return head == rows.size(); }
  std::size_t size() const { return rows.size() - head; }
  void clear() {
    rows.clear();
    head = 0;
  }
};

struct QVEventRows {
  QVEventLane<QVBeaconSessionRow> sessions;
  QVEventLane<QVBeaconMessageRow> messages;
  QVEventLane<QVCountwiseRow> countwise;
  QVEventLane<QVJoulewellRow> joulewell;
  QVEventLane<QVFlushRow> flushes;
  bool urgent = false;  // to be committed at once

  void add(QVBeaconSessionRow&& row) { sessions.rows.push_back(std::move(row)); }
  void add(QVBeaconMessageRow&& row) { messages.rows.push_back(std::move(row)); }
  void add(QVCountwiseRow&& row) { countwise.rows.push_back(std::move(row)); }
  void add(QVJoulewellRow&& row) { joulewell.rows.push_back(std::move(row)); }
  void add(QVFlushRow&& row) { flushes.rows.push_back(std::move(row)); }

  std::size_t size() const {
    return sessions.size() + messages.size() + countwise.size() + joulewell.size() + flushes.size();
  }
  template <class Visitor>
  void forEachLane(Visitor&& visit) {
    visit(sessions);
    visit(messages);
    visit(countwise);
    visit(joulewell);
    visit(flushes);
  }
  void clear() {
    forEachLane([](auto& lane) { lane.clear(); });
    urgent = false;
  }
};
