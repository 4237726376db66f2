#pragma once

#include "platform/QVLog.h"
#include "platform/QVRunLoop.h"

#include <memory>
#include <string>

class QVAsioRunLoopWaits;

// A run loop on an Asio io_context. Made by QVAsioRunLoopThreads for each of its threads.
class QVAsioRunLoop final : public QVRunLoop {
 public:
  QVAsioRunLoop(std::string threadName, QVLog& log);
  ~QVAsioRunLoop() override;
  QVAsioRunLoop(const QVAsioRunLoop&) = delete;
  QVAsioRunLoop& operator=(const QVAsioRunLoop&) = delete;

  void attach(std::shared_ptr<QVRunLoopTimer> timer) override;
  void run() override;

 private:
  const std::string threadName_;
  QVLog& log_;
  const std::shared_ptr<QVAsioRunLoopWaits> waits_;
};
