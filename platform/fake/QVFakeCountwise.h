#pragma once

#include "platform/QVCountwise.h"
#include "platform/fake/QVFakeMisuse.h"

#include <cstddef>
#include <deque>
#include <mutex>
#include <set>
#include <string>
#include <vector>

// A Countwise for tests: keeps the events and asks for their payloads at once or when told.
//
// Payload callbacks run with no lock held, on the thread of the call that brings them about, and
// are destroyed right after. Checks that every event has a callback.
//
// Threads: any.
class QVFakeCountwise : public QVCountwise {
 public:
  enum class Delivery { atOnce, whenTold };

  struct Event {
    std::string name;
    QVDictionary payload;
  };

  void sendEventLazily(std::string name, PayloadCallback payload) override;

  // When later events' payloads are asked for; at once to begin with.
  void setDelivery(Delivery delivery);
  // Later events of this name are dropped and their callbacks not called.
  void addUnwanted(std::string name);
  // Asks for the payloads of the events that wait, in their order.
  void deliver();

  // Names of all events that were sent, wanted or not, in order.
  std::vector<std::string> sentNames() const;
  // Events whose payload was asked for, in order.
  std::vector<Event> events() const;
  std::size_t waitingEvents() const;
  void forgetEvents();
  std::vector<std::string> takeMisuses();

 private:
  struct Waiting {
    std::string name;
    PayloadCallback payload;
  };

  QVFakeMisuse misuse_{"QVFakeCountwise"};
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  Delivery delivery_ = Delivery::atOnce;
  std::set<std::string> unwanted_;
  std::vector<std::string> sentNames_;
  std::deque<Waiting> waiting_;
  std::vector<Event> events_;
};
