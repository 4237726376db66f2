#include "platform/fake/QVFakeCountwise.h"

#include <utility>

void QVFakeCountwise::sendEventLazily(std::string name, PayloadCallback payload) {
  if (!payload) {
    misuse_.note("an event without a payload callback: " + name);
    return;
  }
  bool atOnce = false;
  {
    const std::lock_guard lock(mutex_);
    sentNames_.push_back(name);
    if (unwanted_.contains(name)) return;
    waiting_.push_back({std::move(name), std::move(payload)});
    atOnce = delivery_ == Delivery::atOnce;
  }
  if (atOnce) deliver();
}

void QVFakeCountwise::setDelivery(Delivery delivery) {
  const std::lock_guard lock(mutex_);
  delivery_ = delivery;
}

void QVFakeCountwise::addUnwanted(std::string name) {
  const std::lock_guard lock(mutex_);
  unwanted_.insert(std::move(name));
}

void QVFakeCountwise::deliver() {
  std::deque<Waiting> waiting;
  {
    const std::lock_guard lock(mutex_);
    waiting.swap(waiting_);
  }
  for (Waiting& event : waiting) {
    QVDictionary payload = event.payload();
    event.payload = nullptr;
    const std::lock_guard lock(mutex_);
    events_.push_back({std::move(event.name), std::move(payload)});
  }
}

std::vector<std::string> QVFakeCountwise::sentNames() const {
  const std::lock_guard lock(mutex_);
  return sentNames_;
}

std::vector<QVFakeCountwise::Event> QVFakeCountwise::events() const {
  const std::lock_guard lock(mutex_);
  return events_;
}

std::size_t QVFakeCountwise::waitingEvents() const {
  const std::lock_guard lock(mutex_);
  return waiting_.size();
}

void QVFakeCountwise::forgetEvents() {
  const std::lock_guard lock(mutex_);
  sentNames_.clear();
  events_.clear();
}

std::vector<std::string> QVFakeCountwise::takeMisuses() {
  return misuse_.take();
}
