#include "tools/qvctl/QVSessionEnd.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVWaitNotice.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include <poll.h>
#include <sys/eventfd.h>

namespace {

using Clock = std::chrono::steady_clock;

enum class Event { answered, interrupted, nothing };

// Waits for one of them; an interruption of -1 never comes.
Event waitFor(int answered, int interruption, Clock::time_point until) {
  std::array<pollfd, 2> entries{{{answered, POLLIN, 0}, {interruption, POLLIN, 0}}};
  int count = -1;
  do {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(until - Clock::now()).count();
    count = ::poll(entries.data(), entries.size(), static_cast<int>(std::max<int64_t>(left, 0)));
  } while (count < 0 && errno == EINTR);
  if (entries[0].revents != 0) return Event::answered;
  return entries[1].revents != 0 ? Event::interrupted : Event::nothing;
}

}  // namespace

QVSessionEnd::QVSessionEnd(QVServiceConnection& service, int64_t reporterID,
                           const QVClientPayload& message, QVClientCategory category)
    : answers_(new Answers{.over = QVDescriptor(::eventfd(0, EFD_CLOEXEC))}) {
  if (!answers_->over.isOpen()) throw QVToolFailure::ofSystem("an answer", errno);
  service.send(&QVClient::sendMessage, message, category, QVClientMessageType::stop, reporterID,
               [answers = answers_](const QVClientError& error) { note(*answers, error); });
  // The service keeps the order: this answer is the last.
  service.send(&QVClient::stopReportingSessionForID, reporterID,
               [answers = answers_](const QVClientResult<bool>& handled) {
                 if (!handled) note(*answers, handled.error());
                 answers->isOver.store(true, std::memory_order_release);
                 ::eventfd_write(answers->over.get(), 1);
               });
}

void QVSessionEnd::note(Answers& answers, const QVClientError& error) {
  if (error && answers.problem.empty()) answers.problem = "not reported: " + error.text();
}

std::string QVSessionEnd::await(int interruption, Patience patience) const {
  const QVWaitNotice notice(QVServiceConnection::kMoment);
  const auto began = Clock::now();
  const int answered = answers_->over.get();
  Event event = waitFor(answered, -1, began + std::min(patience.undisturbed, patience.limit));
  if (event == Event::nothing) event = waitFor(answered, interruption, began + patience.limit);
  if (answers_->isOver.load(std::memory_order_acquire)) return answers_->problem;
  const std::string text = "not known to be reported: ";
  if (event == Event::interrupted) return text + "a signal ended the wait for the service";
  return text + QVText("the service has said nothing for ",
                       std::chrono::duration<double>(patience.limit).count(), " s");
}
