#pragma once

#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/store/QVEventRows.h"

#include <array>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <optional>
#include <vector>

// Hands rows from any thread to the event store's writer.
//
// A row costs its sender a move under a short lock. The writer is woken when rows begin to wait
// (it then sleeps for the rest of the commit interval), when enough of them wait to be committed,
// and for what is urgent; with nothing waiting it sleeps without a time-out.
//
// Threads: add() and search() any; take() and its like the writer only. Bounded by what the
// service accepts, not here.
class QVEventStoreQueue {
 public:
  using SteadyTime = std::chrono::steady_clock::time_point;

  // So many waiting rows are written without waiting for the interval's end.
  static constexpr std::size_t kCommitRows = 500;
  // Rows of one batch: few enough for the memory of a lane to come from the heap, which has it from
  // an earlier batch, and not page by page from the system.
  static constexpr std::size_t kBatchRows = 512;
  // Batches kept for their memory: some fill while those of a transaction are written.
  static constexpr std::size_t kSpareBatches = 8;

  // A search for backends: is the store there?
  using Search = QVBeaconSession::BackendsCompletion;
  struct Work {
    std::vector<Search> searches;
    std::deque<QVEventRows> batches;
    bool stop = false;
  };

  explicit QVEventStoreQueue(std::chrono::nanoseconds commitInterval)
      : commitInterval_(commitInterval) {}

  // Takes the row's contents; false, with the row untouched, once the queue is stopped.
  template <class Row>
  [[nodiscard]] bool add(Row& row, bool urgent) {
    bool wake = false;
    {
      const QVMutexLock lock(mutex_);
      if (stopped_) return false;
      if (waiting_.empty() || waiting_.back().size() >= kBatchRows) beginBatch();
      if (waitingRows_ == 0) firstRowAt_ = std::chrono::steady_clock::now();
      waiting_.back().add(std::move(row));
      ++waitingRows_;
      wake = waitingRows_ == 1 || waitingRows_ == kCommitRows || (urgent && !urgent_);
      if (urgent) waiting_.back().urgent = urgent_ = true;
    }
    if (wake) wake_.notify_one();
    return true;
  }
  // As add().
  [[nodiscard]] bool search(Search& search);
  // Everything waiting is handed out once more; nothing is taken in any longer.
  void stop();

  // Sleeps until there is something to do: a search, rows that are due, `retryAt`, the stop.
  Work take(std::optional<SteadyTime> retryAt);
  // The searches that came since, without sleeping.
  std::vector<Search> takeSearches();
  // Appends what waits to `batches`, due or not; false where nothing does.
  bool takeWaiting(std::deque<QVEventRows>& batches);
  bool isEmpty();
  // Gives a batch's memory back for later ones.
  void recycle(QVEventRows&& batch) noexcept;
  // Frees what is kept for later batches.
  void giveMemoryBack() noexcept;

 private:
  void beginBatch() QV_REQUIRES(mutex_);
  void moveWaiting(std::deque<QVEventRows>& batches) QV_REQUIRES(mutex_);

  const std::chrono::nanoseconds commitInterval_;

  QVMutex mutex_;
  std::condition_variable wake_;
  std::vector<Search> searches_ QV_GUARDED_BY(mutex_);
  std::deque<QVEventRows> waiting_ QV_GUARDED_BY(mutex_);
  std::array<QVEventRows, kSpareBatches> spare_ QV_GUARDED_BY(mutex_);
  std::size_t spareCount_ QV_GUARDED_BY(mutex_) = 0;
  std::size_t waitingRows_ QV_GUARDED_BY(mutex_) = 0;
  SteadyTime firstRowAt_ QV_GUARDED_BY(mutex_){};
  bool urgent_ QV_GUARDED_BY(mutex_) = false;
  bool stopped_ QV_GUARDED_BY(mutex_) = false;
};
