#pragma once

#include "tests/support/QVSubprocess.h"

#include <memory>
#include <string>
#include <vector>

// A sensor daemon, net.hadess.SensorProxy, on a test's bus; gone with the object. Another one that
// is made meanwhile takes its place.
//
// Threads: one at a time.
class QVTestSensor {
 public:
  // One that behaves, with an accelerometer that says `orientation`.
  static QVTestSensor turned(const std::string& busAddress, const std::string& orientation);
  // One that does as it is told: it has neither methods nor properties.
  static QVTestSensor scripted(const std::string& busAddress);

  // The behaving one: what its accelerometer says from now on. Whoever claimed it is told.
  void turn(const std::string& orientation) const;
  // The behaving one: the names on the bus of those that have claimed it.
  std::vector<std::string> claimants() const;

  // The scripted one: a method without arguments whose body is this Python.
  void addMethod(const std::string& name, const std::string& body) const;
  // The scripted one: the property, of a signature and a value in busctl's notation, and a change
  // of it that all are told of.
  void addProperty(const std::string& name, const std::string& signature,
                   const std::string& value) const;
  void changeProperty(const std::string& name, const std::string& signature,
                      const std::string& value) const;

  void signal(int number) const { process_->signal(number); }

 private:
  QVTestSensor(std::string busAddress, const std::vector<std::string>& arguments);
  std::string call(const std::string& member, const std::vector<std::string>& arguments) const;

  std::string busAddress_;
  std::unique_ptr<QVSubprocess> process_;
};
