#include "platform/fake/QVFakeBeacon.h"

#include "platform/QVText.h"
#include "platform/fake/QVFakeMisuse.h"

#include <algorithm>
#include <atomic>
#include <deque>
#include <iterator>
#include <mutex>
#include <set>
#include <utility>

struct QVFakeBeacon::State {
  QVFakeMisuse misuse{"QVFakeBeacon"};
  std::mutex mutex;
  // Guarded by the mutex.
  std::vector<QVFakeBeaconEvent> events;
  Backends backends = Backends::atOnce;
  std::deque<QVBeaconSession::BackendsCompletion> waitingSearches;
  std::vector<QVBeaconSession::BackendsCompletion> unansweredSearches;
  bool refusing = false;
  std::optional<QVError> refusal;
  std::optional<QVError> flushError;
  std::set<std::string, std::less<>> tokens;  // every text ever given out
  int sessionsMade = 0;
  int liveSessions = 0;
  int liveTokens = 0;

  // With the mutex held.
  void checkToken(const QVDictionary& sessionInfo) {
    const QVValue* token = sessionInfo.find(kBeaconSessionInfoHierarchyToken);
    if (token != nullptr && !(token->isString() && tokens.contains(token->string()))) {
      misuse.note(QVText("the token \"", *token, "\" was not made here"));
    }
  }
  bool take(QVFakeBeaconEvent event, std::optional<QVError>& error) {
    event.accepted = !refusing;
    if (refusing) error = refusal;
    events.push_back(std::move(event));
    return !refusing;
  }
};

class QVFakeBeacon::Token : public BeaconSecureHierarchyToken {
 public:
  Token(std::shared_ptr<State> state, std::string text)
      : state_(std::move(state)), text_(std::move(text)) {}
  ~Token() override {
    const std::lock_guard lock(state_->mutex);
    --state_->liveTokens;
  }
  std::string description() const override { return text_; }

 private:
  const std::shared_ptr<State> state_;
  const std::string text_;
};

class QVFakeBeacon::Session : public QVBeaconSession {
 public:
  Session(std::shared_ptr<State> state, int number) : state_(std::move(state)), number_(number) {}

  ~Session() override {
    const std::lock_guard lock(state_->mutex);
    --state_->liveSessions;
    state_->events.push_back({.kind = Kind::sessionEnd, .session = number_});
  }

  std::string description() const override { return QVText("session ", number_); }

  void startConfigurationWithCompletionHandler(BackendsCompletion completion) override {
    const Use use(*this);
    if (!completion) state_->misuse.note("a search for backends without a completion");
    if (search_ != nullptr) state_->misuse.note("a session configured twice");
    search_ = std::make_shared<std::atomic<bool>>(false);
    // A session may be dropped while its search is open, so the search's state is shared.
    BackendsCompletion answer =
        [ended = search_, done = std::move(completion)](std::optional<QVArray> list) mutable {
          ended->store(true);
          if (done) done(std::move(list));
        };
    Backends backends{};
    {
      const std::lock_guard lock(state_->mutex);
      state_->events.push_back({.kind = Kind::configuration, .session = number_});
      backends = state_->backends;
      if (backends == Backends::whenTold) {
        state_->waitingSearches.push_back(std::move(answer));
        return;
      }
      if (backends == Backends::never) {
        state_->unansweredSearches.push_back(std::move(answer));
        return;
      }
    }
    answer(backends == Backends::atOnce ? std::optional(defaultBackends()) : std::nullopt);
  }

  [[nodiscard]] bool sendMessageWithCategory(uint16_t category, uint16_t type,
                                             const QVDictionary& payload,
                                             std::optional<QVError>& error) override {
    const Use use(*this);
    if (search_ != nullptr && !search_->load()) {
      state_->misuse.note("a message to a session that is still looking for backends");
    }
    const std::lock_guard lock(state_->mutex);
    return state_->take({.kind = Kind::message,
                         .session = number_,
                         .category = category,
                         .type = type,
                         .payload = payload},
                        error);
  }

  void flushMessagesWithCompletion(FlushCompletion completion) override {
    const Use use(*this);
    if (!completion) state_->misuse.note("a flush without a completion");
    std::optional<QVError> error;
    {
      const std::lock_guard lock(state_->mutex);
      error = state_->flushError;
      state_->events.push_back(
          {.kind = Kind::flush, .session = number_, .accepted = !error.has_value()});
    }
    if (completion) completion(std::move(error));
  }

 private:
  // Notes when two threads are inside of one session.
  class Use {
   public:
    explicit Use(Session& session) : session_(session) {
      if (session_.users_.fetch_add(1) != 0) {
        session_.state_->misuse.note("a session used by two threads at once");
      }
    }
    ~Use() { session_.users_.fetch_sub(1); }
    Use(const Use&) = delete;
    Use& operator=(const Use&) = delete;

   private:
    Session& session_;
  };

  const std::shared_ptr<State> state_;
  const int number_;
  std::atomic<int> users_{0};
  std::shared_ptr<std::atomic<bool>> search_;  // null before the search; true once it has ended
};

QVFakeBeacon::QVFakeBeacon() : state_(std::make_shared<State>()) {}

QVFakeBeacon::~QVFakeBeacon() {
  // Open searches end unanswered; a completion may hold a session, which holds the state.
  std::deque<QVBeaconSession::BackendsCompletion> waiting;
  std::vector<QVBeaconSession::BackendsCompletion> unanswered;
  const std::lock_guard lock(state_->mutex);
  waiting.swap(state_->waitingSearches);
  unanswered.swap(state_->unansweredSearches);
}

std::shared_ptr<BeaconSecureHierarchyToken> QVFakeBeacon::newSecureHierarchyTokenFromParentToken(
    const std::shared_ptr<BeaconSecureHierarchyToken>& parent) {
  const std::lock_guard lock(state_->mutex);
  if (parent != nullptr && !state_->tokens.contains(parent->description())) {
    state_->misuse.note("a parent token that was not made here");
  }
  std::string text = QVText("token ", state_->tokens.size() + 1);
  state_->tokens.insert(text);
  ++state_->liveTokens;
  return std::make_shared<Token>(state_, std::move(text));
}

std::shared_ptr<QVBeaconSession> QVFakeBeacon::initWithSessionInfo(
    const QVDictionary& sessionInfo, const QVDictionary& userInfo,
    const QVArray& frameworksToCheck) {
  const std::lock_guard lock(state_->mutex);
  state_->checkToken(sessionInfo);
  const int number = ++state_->sessionsMade;
  ++state_->liveSessions;
  state_->events.push_back({.kind = Kind::session,
                            .session = number,
                            .sessionInfo = sessionInfo,
                            .userInfo = userInfo,
                            .frameworksToCheck = frameworksToCheck});
  return std::make_shared<Session>(state_, number);
}

bool QVFakeBeacon::sendOneMessageWithSessionInfo(const QVDictionary& sessionInfo,
                                                 const QVDictionary& userInfo, uint16_t category,
                                                 uint16_t type, const QVDictionary& payload,
                                                 std::optional<QVError>& error) {
  const std::lock_guard lock(state_->mutex);
  state_->checkToken(sessionInfo);
  return state_->take({.kind = Kind::singleMessage,
                       .sessionInfo = sessionInfo,
                       .userInfo = userInfo,
                       .category = category,
                       .type = type,
                       .payload = payload},
                      error);
}

void QVFakeBeacon::setBackends(Backends backends) {
  const std::lock_guard lock(state_->mutex);
  state_->backends = backends;
}

void QVFakeBeacon::answerBackends(const std::optional<QVArray>& backends) {
  std::deque<QVBeaconSession::BackendsCompletion> searches;
  {
    const std::lock_guard lock(state_->mutex);
    searches.swap(state_->waitingSearches);
  }
  for (auto& completion : searches) completion(backends);
}

QVArray QVFakeBeacon::defaultBackends() {
  return {QVValue("backend")};
}

void QVFakeBeacon::refuseMessages(std::optional<QVError> error) {
  const std::lock_guard lock(state_->mutex);
  state_->refusing = true;
  state_->refusal = std::move(error);
}

void QVFakeBeacon::setFlushError(std::optional<QVError> error) {
  const std::lock_guard lock(state_->mutex);
  state_->flushError = std::move(error);
}

std::vector<QVFakeBeaconEvent> QVFakeBeacon::events() const {
  const std::lock_guard lock(state_->mutex);
  return state_->events;
}

std::vector<QVFakeBeaconEvent> QVFakeBeacon::events(Kind kind) const {
  const std::lock_guard lock(state_->mutex);
  std::vector<QVFakeBeaconEvent> found;
  std::ranges::copy_if(state_->events, std::back_inserter(found),
                       [kind](const QVFakeBeaconEvent& event) { return event.kind == kind; });
  return found;
}

std::size_t QVFakeBeacon::count(Kind kind) const {
  return events(kind).size();
}

void QVFakeBeacon::forgetEvents() {
  const std::lock_guard lock(state_->mutex);
  state_->events.clear();
}

int QVFakeBeacon::liveSessions() const {
  const std::lock_guard lock(state_->mutex);
  return state_->liveSessions;
}

int QVFakeBeacon::liveTokens() const {
  const std::lock_guard lock(state_->mutex);
  return state_->liveTokens;
}

std::vector<std::string> QVFakeBeacon::takeMisuses() {
  return state_->misuse.take();
}
