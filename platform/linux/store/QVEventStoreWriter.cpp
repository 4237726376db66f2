#include "platform/linux/store/QVEventStoreWriter.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/store/QVEventStoreError.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <ctime>
#include <new>
#include <system_error>
#include <type_traits>
#include <utility>

#include <fcntl.h>
#include <malloc.h>
#include <sqlite3.h>
#include <unistd.h>

namespace {

// The preferences' domains and keys, and the largest limit of the file that is taken, in MiB.
constexpr const char* kBeaconDomain = "net.quillon.beacon";
constexpr const char* kLimitKey = "store_limit_mib";
constexpr const char* kCountwiseDomain = "net.quillon.countwise";
constexpr const char* kUnwantedKey = "unwanted";
constexpr int64_t kLargestLimit = int64_t{1024} * 1024;

// A disk that damages each new file must not be filled with them.
constexpr std::chrono::seconds kSetAsideInterval{60};

constexpr const char* kBackend = "store";

// Rows of one transaction when many wait, and up to a batch more: what one transaction changes
// should stay near what SQLite's page cache and one checkpoint hold.
constexpr std::size_t kTransactionRows = 4096;

// Payloads in flight, and what a session collected until it stopped, leave holes in the heap that
// the allocator keeps. After so many bytes of payload text, the next moment without work is used to
// give the free pages back; after fewer once a session has ended, as nothing may follow.
constexpr uint64_t kTextBytesBetweenTrims = uint64_t{4} * 1024 * 1024;
constexpr uint64_t kTextBytesBeforeLastTrim = uint64_t{128} * 1024;

const char* causeOf(int result) {
  switch (result & 0xFF) {
    case SQLITE_FULL:
      return kLossFull;
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
      return kLossBusy;
    case SQLITE_IOERR:
    case SQLITE_CANTOPEN:
    case SQLITE_READONLY:
      return kLossInputOutput;
    default:
      return kLossFailed;
  }
}

// For file names: 20261120T235634Z.
std::string timeText(QVDate date) {
  const std::time_t seconds = std::chrono::system_clock::to_time_t(date);
  std::tm parts{};
  gmtime_r(&seconds, &parts);
  std::array<char, 32> text{};
  const std::size_t length = std::strftime(text.data(), text.size(), "%Y%m%dT%H%M%SZ", &parts);
  return {text.data(), length};
}

// What keeps files from being made beside `path`; empty where nothing does. SQLite does not tell a
// directory that may not be written to from a missing one.
std::string directoryObstacle(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  const std::string directory = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  if (faccessat(AT_FDCWD, directory.c_str(), W_OK | X_OK, AT_EACCESS) == 0) return {};
  return QVText("its directory: ", std::generic_category().message(errno));
}

// Rows that are events: what is counted when they are lost.
bool isEvent(const QVBeaconSessionRow&) {
  return false;
}
bool isEvent(const QVBeaconMessageRow&) {
  return true;
}
bool isEvent(const QVCountwiseRow& row) {
  return row.state != QVCountwiseRow::State::unwanted;
}
bool isEvent(const QVJoulewellRow&) {
  return true;
}
bool isEvent(const QVFlushRow&) {
  return false;
}

}  // namespace

QVEventStoreWriter::QVEventStoreWriter(Services services, QVEventStoreOptions options,
                                       QVEventStoreQueue& queue)
    : log_(services.log),
      clock_(services.clock),
      preferences_(services.preferences),
      options_(std::move(options)),
      queue_(queue),
      tables_(options_.fileBytes) {}

void QVEventStoreWriter::run() {
  bool stop = false;
  while (!stop) {
    const bool retries = !outageCause_.empty() && hasSomethingToStore();
    QVEventStoreQueue::Work work = queue_.take(retries ? std::optional(retryAt_) : std::nullopt);
    stop = work.stop;
    answer(std::move(work.searches));
    for (QVEventRows& batch : work.batches) pending_.push_back(std::move(batch));
    if (stop) retryAt_ = {};
    store();
    giveMemoryBack();
  }
  closeStore();
}

void QVEventStoreWriter::hold(const char* reason) {
  const SteadyTime moment = std::chrono::steady_clock::now();
  if (outageCause_.empty() || moment - preferencesReadAt_ >= options_.retryInterval) {
    readPreferences();
  }
  static_cast<void>(queue_.takeWaiting(pending_));
  failure_ = QVText("no thread for its writer: ", reason);
  beginOutage(kLossFailed);
  // By the thread, as soon as there is one.
  retryAt_ = {};
}

void QVEventStoreWriter::giveMemoryBack() {
  const uint64_t enough = sessionEnded_ ? kTextBytesBeforeLastTrim : kTextBytesBetweenTrims;
  if (tables_.textBytes() < enough || !pending_.empty() || !queue_.isEmpty()) return;
  sessionEnded_ = false;
  tables_.giveMemoryBack();
  queue_.giveMemoryBack();
  ::malloc_trim(0);
}

void QVEventStoreWriter::answer(std::vector<QVEventStoreQueue::Search> searches) {
  if (searches.empty()) return;
  if (hasFile()) {
    readPreferences();
  } else {
    openStore();
  }
  for (QVEventStoreQueue::Search& search : searches) {
    std::optional<QVArray> backends;
    if (tables_.isOpen()) backends = QVArray{QVValue(kBackend)};
    guarded([&] { search(std::move(backends)); });
  }
}

// Is the store open, and its file the one at its path? One that is not is let go.
bool QVEventStoreWriter::hasFile() {
  if (!tables_.isOpen()) return false;
  if (!tables_.hasMoved()) return true;
  log_.error(nullptr, "-[QVEventStoreWriter hasFile]", "the event store ", options_.path,
             " was moved or removed; opening it anew");
  tables_.close();
  return false;
}

bool QVEventStoreWriter::openStore() {
  readPreferences();
  std::string reason;
  QVEventTables::Opening opening = openFile(reason);
  if (opening == QVEventTables::Opening::damaged && setAside(reason)) opening = openFile(reason);
  if (opening == QVEventTables::Opening::opened) {
    if (!openFailure_.empty()) {
      log_.standard(nullptr, "-[QVEventStoreWriter openStore]", "the event store ", options_.path,
                    " is open again");
    }
    openFailure_.clear();
    return true;
  }
  if (std::string obstacle = directoryObstacle(options_.path); !obstacle.empty()) {
    reason = std::move(obstacle);
  }
  if (reason != openFailure_) {
    log_.error(nullptr, "-[QVEventStoreWriter openStore]", "the event store ", options_.path,
               " cannot be opened: ", reason);
    openFailure_ = reason;
  }
  retryAt_ = std::chrono::steady_clock::now() + options_.retryInterval;
  return false;
}

QVEventTables::Opening QVEventStoreWriter::openFile(std::string& reason) {
  if (access(options_.path.c_str(), F_OK) != 0 && errno == ENOENT) {
    // Of a file that was moved or removed while other programs had it open: a new one with these
    // could not be opened.
    for (const char* const suffix : {"-wal", "-shm"}) {
      std::remove((options_.path + suffix).c_str());
    }
  }
  return tables_.open(options_.path, options_.vfs, now(), reason);
}

bool QVEventStoreWriter::setAside(const std::string& reason) {
  const SteadyTime moment = std::chrono::steady_clock::now();
  if (setAsideAt_ && moment - *setAsideAt_ < kSetAsideInterval) return false;
  setAsideAt_ = moment;
  tables_.close();
  const std::string wanted = options_.path + ".corrupt-" + timeText(clock_.currentDate());
  std::string target = wanted;
  for (int i = 2; access(target.c_str(), F_OK) == 0; ++i) target = QVText(wanted, '-', i);
  if (std::rename(options_.path.c_str(), target.c_str()) != 0) {
    log_.error(nullptr, "-[QVEventStoreWriter setAside]", "the damaged event store ", options_.path,
               " cannot be set aside: ", std::generic_category().message(errno));
    return false;
  }
  // The write-ahead log belongs to the damaged file; what is not there needs no moving.
  std::rename((options_.path + "-wal").c_str(), (target + "-wal").c_str());
  unlink((options_.path + "-shm").c_str());
  log_.error(nullptr, "-[QVEventStoreWriter setAside]", "the event store ", options_.path,
             " is damaged (", reason, "), set aside as ", target);
  return true;
}

void QVEventStoreWriter::readPreferences() {
  preferencesReadAt_ = std::chrono::steady_clock::now();
  const QVDictionary beacon = preferences_.valuesInDomain(kBeaconDomain);
  const QVValue* limit = beacon.find(kLimitKey);
  int64_t bytes = options_.fileBytes;
  if (limit != nullptr && limit->isNumber() && limit->integerValue() > 0) {
    bytes = std::min(limit->integerValue(), kLargestLimit) * 1024 * 1024;
  }
  tables_.setLimit(bytes);

  unwanted_.clear();
  const QVDictionary countwise = preferences_.valuesInDomain(kCountwiseDomain);
  const QVValue* unwanted = countwise.find(kUnwantedKey);
  if (unwanted == nullptr || unwanted->kind() != QVValue::Kind::array) return;
  for (const QVValue& name : unwanted->array()) {
    if (name.isString()) unwanted_.emplace(name.string());
  }
}

void QVEventStoreWriter::store() {
  if (!hasSomethingToStore()) return;
  const SteadyTime moment = std::chrono::steady_clock::now();
  if (!tables_.isOpen()) {
    if (moment < retryAt_ || !openStore()) {
      giveUpAll(kLossUnavailable);
      return;
    }
  } else if (moment - preferencesReadAt_ >= options_.retryInterval) {
    readPreferences();
  }
  if (!outageCause_.empty() && moment < retryAt_) {
    holdWithinLimit();
    return;
  }
  while (hasSomethingToStore()) {
    // What is written to a file that is gone, nobody finds.
    if (!hasFile() && !openStore()) {
      giveUpAll(kLossUnavailable);
      return;
    }
    std::size_t batches = 0;
    const int result = writeTransaction(batches);
    if (result == SQLITE_OK) {
      finishBatches(batches);
      endOutage();
      // Rows may come as fast as they are stored; who waits for the store is not to wait for a gap.
      answer(queue_.takeSearches());
    } else if (QVSQLiteDatabase::isDamage(result) && setAside(failure_) && openStore()) {
      continue;
    } else if (tables_.isOpen()) {
      beginOutage(causeOf(result));
      return;
    } else {
      giveUpAll(kLossUnavailable);
      return;
    }
  }
}

int QVEventStoreWriter::writeTransaction(std::size_t& batches) {
  std::size_t rows = 0;
  tooLarge_ = 0;
  bool urgent = false;
  int result = tables_.begin();
  bool isOutOfMemory = false;
  try {
    while (result == SQLITE_OK && rows < kTransactionRows) {
      // Rows that came meanwhile go along: larger transactions write fewer half-filled pages.
      if (batches == pending_.size() && (urgent || !queue_.takeWaiting(pending_))) break;
      QVEventRows& batch = pending_[batches];
      urgent = urgent || batch.urgent;
      result = insertBatch(batch);
      rows += batch.size();
      if (result == SQLITE_OK) ++batches;
    }
  } catch (const std::bad_alloc&) {
    // As where SQLite says so: the transaction is taken back and tried again.
    result = SQLITE_NOMEM;
    isOutOfMemory = true;
  }
  if (result == SQLITE_OK) {
    if (tooLarge_ > 0) losses_[kLossTooLarge] += tooLarge_;
    result = tables_.commit(losses_, now());
    if (result != SQLITE_OK && tooLarge_ > 0) {
      int64_t& counted = losses_[kLossTooLarge];
      counted -= tooLarge_;
      if (counted == 0) losses_.erase(kLossTooLarge);
    }
  }
  if (result != SQLITE_OK) {
    failure_ = isOutOfMemory ? "out of memory" : tables_.message();
    tables_.rollback();
  }
  return result;
}

int QVEventStoreWriter::insertBatch(QVEventRows& batch) {
  int result = SQLITE_OK;
  batch.forEachLane([&](auto& lane) {
    if (result == SQLITE_OK) result = insertLane(lane);
  });
  return result;
}

template <class Lane>
int QVEventStoreWriter::insertLane(Lane& lane) {
  for (std::size_t i = lane.head; i < lane.rows.size(); ++i) {
    auto& row = lane.rows[i];
    if constexpr (std::is_same_v<decltype(row), QVCountwiseRow&>) {
      askForPayload(row);
      if (row.state == QVCountwiseRow::State::unwanted) continue;
    }
    const int result = tables_.insert(row);
    if (result == SQLITE_TOOBIG) {
      if (isEvent(row)) ++tooLarge_;
    } else if (result != SQLITE_OK) {
      return result;
    }
  }
  return SQLITE_OK;
}

void QVEventStoreWriter::finishBatches(std::size_t count) {
  for (std::size_t i = 0; i < count; ++i) {
    QVEventRows batch = std::move(pending_.front());
    pending_.pop_front();
    sessionEnded_ = sessionEnded_ || !batch.flushes.empty();
    answerFlushes(batch, std::nullopt);
    queue_.recycle(std::move(batch));
  }
  heldBytes_ = 0;
  countedBatches_ = 0;
}

void QVEventStoreWriter::beginOutage(const char* cause) {
  retryAt_ = std::chrono::steady_clock::now() + options_.retryInterval;
  if (outageCause_.empty()) {
    lostInOutage_ = 0;
    log_.error(nullptr, "-[QVEventStoreWriter store]", "the event store ", options_.path,
               " cannot be written: ", failure_);
  }
  outageCause_ = cause;
  holdWithinLimit();
}

void QVEventStoreWriter::endOutage() {
  if (outageCause_.empty()) return;
  outageCause_.clear();
  log_.standard(nullptr, "-[QVEventStoreWriter store]", "the event store ", options_.path,
                " can be written again; events lost meanwhile: ", lostInOutage_);
}

void QVEventStoreWriter::holdWithinLimit() {
  const QVError error = QVMakeEventStoreError(QVEventStoreErrorCode::outOfOrder, failure_);
  for (; countedBatches_ < pending_.size(); ++countedBatches_) {
    QVEventRows& batch = pending_[countedBatches_];
    heldBytes_ += sizeof batch;
    for (QVCountwiseRow& row : batch.countwise.rows) askForPayload(row);
    batch.forEachLane([this](const auto& lane) {
      for (std::size_t i = lane.head; i < lane.rows.size(); ++i) {
        heldBytes_ += lane.rows[i].footprint();
      }
    });
    answerFlushes(batch, error);
  }
  while (heldBytes_ > options_.heldBytes && !pending_.empty()) giveUpOldest();
}

void QVEventStoreWriter::giveUpOldest() {
  QVEventRows& batch = pending_.front();
  int64_t oldest = INT64_MAX;
  batch.forEachLane([&oldest](const auto& lane) {
    if (!lane.empty()) oldest = std::min(oldest, lane.rows[lane.head].time);
  });
  bool done = false;
  batch.forEachLane([&](auto& lane) {
    if (done || lane.empty() || lane.rows[lane.head].time > oldest) return;
    auto row = std::move(lane.rows[lane.head++]);
    heldBytes_ -= row.footprint();
    if (isEvent(row)) {
      ++losses_[outageCause_];
      ++lostInOutage_;
    }
    done = true;
  });
  if (batch.size() > 0) return;
  heldBytes_ -= sizeof batch;
  pending_.pop_front();
  --countedBatches_;
}

void QVEventStoreWriter::giveUpAll(const char* cause) {
  const QVError error = QVMakeEventStoreError(QVEventStoreErrorCode::unavailable, openFailure_);
  for (QVEventRows& batch : pending_) {
    for (QVCountwiseRow& row : batch.countwise.rows) {
      if (unwanted_.contains(row.name)) row.state = QVCountwiseRow::State::unwanted;
    }
    int64_t events = 0;
    batch.forEachLane([&events](const auto& lane) {
      for (std::size_t i = lane.head; i < lane.rows.size(); ++i) {
        if (isEvent(lane.rows[i])) ++events;
      }
    });
    if (events > 0) losses_[cause] += events;
    lostInOutage_ += events;
    answerFlushes(batch, error);
    queue_.recycle(std::move(batch));
  }
  pending_.clear();
  heldBytes_ = 0;
  countedBatches_ = 0;
}

void QVEventStoreWriter::askForPayload(QVCountwiseRow& row) {
  if (row.state != QVCountwiseRow::State::unasked) return;
  row.state = QVCountwiseRow::State::wanted;
  if (!unwanted_.empty() && unwanted_.contains(row.name)) {
    row.state = QVCountwiseRow::State::unwanted;
  } else {
    guarded([&row] { row.payload = row.callback(); });
  }
  row.callback = nullptr;
}

void QVEventStoreWriter::answerFlushes(QVEventRows& batch, const std::optional<QVError>& error) {
  QVEventLane<QVFlushRow>& lane = batch.flushes;
  for (std::size_t i = lane.head; i < lane.rows.size(); ++i) {
    // Answered once, also where the row is tried again.
    QVBeaconSession::FlushCompletion completion = std::move(lane.rows[i].completion);
    if (completion) guarded([&] { completion(error); });
  }
}

void QVEventStoreWriter::closeStore() {
  if (!pending_.empty()) {
    giveUpAll(outageCause_.empty() ? kLossUnavailable : outageCause_.c_str());
  }
  int64_t lost = 0;
  for (const auto& [cause, count] : losses_) lost += count;
  if (lost > 0) {
    log_.error(nullptr, "-[QVEventStoreWriter closeStore]", "the event store ", options_.path,
               " was out of order to the end; events lost and not counted in it: ", lost);
  }
  tables_.close();
}

template <class Callable>
void QVEventStoreWriter::guarded(Callable&& callable) {
  try {
    callable();
  } catch (...) {
    QVLogException(log_, "-[QVEventStoreWriter run]", "a callback");
  }
}

int64_t QVEventStoreWriter::now() const {
  return QVEventStoreTime(clock_);
}
