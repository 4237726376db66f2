#pragma once

#include "platform/QVClock.h"
#include "platform/QVLog.h"
#include "platform/QVPreferences.h"
#include "platform/linux/store/QVEventLosses.h"
#include "platform/linux/store/QVEventStoreOptions.h"
#include "platform/linux/store/QVEventStoreQueue.h"
#include "platform/linux/store/QVEventTables.h"

#include <cstddef>
#include <deque>
#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

// The event store's writer: takes rows from the queue and stores them, until the queue is stopped.
//
// States of the store:
//   closed        at first, and whenever the file could not be opened. Rows that come are counted
//                 as lost. Each search for backends tries to open it; so do rows, but not more
//                 often than the retry interval.
//   open          rows are stored as they come.
//   out of order  a transaction failed. Rows are held and tried again at the retry interval; above
//                 the limit of held bytes the oldest are given up and counted.
// closed -> open; open <-> out of order; open, out of order -> closed where the file is damaged (it
// is set aside and a new one begun) or no longer at its path, which is looked at before each
// transaction and each search.
// The first failure of an outage is one error line, its end one line. While there is no thread to
// write, which hold() is told, the store is out of order whatever state its file is in.
//
// The preferences (limit of the file, unwanted Countwise events) are read when the store is opened,
// at each search for backends, and before rows are stored when the last reading is a retry interval
// old.
//
// Threads: one at a time, its own as soon as that can be had. Everything in here happens on the
// thread of run() or hold(): payload callbacks and completions, too, with no lock held.
class QVEventStoreWriter {
 public:
  // What the writer works with; all of it outlives the writer.
  struct Services {
    QVLog& log;
    QVClock& clock;
    QVPreferences& preferences;
  };

  QVEventStoreWriter(Services services, QVEventStoreOptions options, QVEventStoreQueue& queue);

  void run();
  // Takes what waits and holds it, instead of run() for as long as there is no thread for that,
  // because of `reason`. Does not wait for the disk, but may read the preferences.
  void hold(const char* reason);

 private:
  using SteadyTime = QVEventStoreQueue::SteadyTime;

  // Looks for the store once for all of them.
  void answer(std::vector<QVEventStoreQueue::Search> searches);
  bool hasFile();
  bool openStore();
  QVEventTables::Opening openFile(std::string& reason);
  bool setAside(const std::string& reason);
  void readPreferences();

  void store();
  int writeTransaction(std::size_t& batches);
  int insertBatch(QVEventRows& batch);
  template <class Lane>
  int insertLane(Lane& lane);
  void finishBatches(std::size_t count);

  bool hasSomethingToStore() const { return !pending_.empty() || !losses_.empty(); }
  void beginOutage(const char* cause);
  void endOutage();
  void holdWithinLimit();
  void giveUpOldest();
  void giveUpAll(const char* cause);
  void askForPayload(QVCountwiseRow& row);
  void answerFlushes(QVEventRows& batch, const std::optional<QVError>& error);
  void giveMemoryBack();
  void closeStore();
  template <class Callable>
  void guarded(Callable&& callable);
  int64_t now() const;

  QVLog& log_;
  QVClock& clock_;
  QVPreferences& preferences_;
  const QVEventStoreOptions options_;
  QVEventStoreQueue& queue_;

  QVEventTables tables_;
  std::deque<QVEventRows> pending_;  // taken from the queue and not yet stored, oldest first
  QVEventLosses losses_;             // not yet stored
  std::set<std::string, std::less<>> unwanted_;

  std::string failure_;   // what the last transaction failed of
  int64_t tooLarge_ = 0;  // events left out of the current transaction

  std::string openFailure_;  // the reason that was logged; empty while the store is open
  std::string outageCause_;  // of losses while it is out of order; empty while it is not
  int64_t lostInOutage_ = 0;
  std::size_t heldBytes_ = 0;       // of pending_, kept while the store is out of order
  std::size_t countedBatches_ = 0;  // of pending_, those that heldBytes_ includes
  bool sessionEnded_ = false;       // since memory was given back
  SteadyTime retryAt_{};
  SteadyTime preferencesReadAt_{};
  std::optional<SteadyTime> setAsideAt_;
};
