#include "tests/support/QVTestSensor.h"

#include <sstream>
#include <stdexcept>
#include <utility>

namespace {

constexpr const char* kName = "net.hadess.SensorProxy";
constexpr const char* kPath = "/net/hadess/SensorProxy";
constexpr const char* kMockInterface = "org.freedesktop.DBus.Mock";
// Debian's own, which has the packages.
constexpr const char* kPython = "/usr/bin/python3";

std::string run(const std::vector<std::string>& arguments) {
  const auto output = QVSubprocess::run(arguments);
  if (output.status != 0) throw std::runtime_error(arguments[0] + ": " + output.text);
  return output.text;
}

}  // namespace

QVTestSensor QVTestSensor::turned(const std::string& busAddress, const std::string& orientation) {
  return {busAddress,
          {"--template", "iio-sensors-proxy", "--parameters",
           R"({"has_accelerometer": true, "accelerometer_orientation": ")" + orientation + "\"}"}};
}

QVTestSensor QVTestSensor::scripted(const std::string& busAddress) {
  return {busAddress, {"--system", kName, kPath, kName}};
}

QVTestSensor::QVTestSensor(std::string busAddress, const std::vector<std::string>& arguments)
    : busAddress_(std::move(busAddress)) {
  std::vector<std::string> command{kPython, "-m", "dbusmock"};
  command.insert(command.end(), arguments.begin(), arguments.end());
  process_ = std::make_unique<QVSubprocess>(
      QVSubprocess::Options{.arguments = command,
                            .environment = {{"DBUS_SYSTEM_BUS_ADDRESS", busAddress_}},
                            .standardOutputFile = "/dev/null"});
  // It answers calls that come before it is ready once it is.
  run({"gdbus", "wait", "--address", busAddress_, "--timeout", "60", kName});
}

void QVTestSensor::turn(const std::string& orientation) const {
  call("SetInternalProperty", {"ssv", kName, "AccelerometerOrientation", "s", orientation});
}

std::vector<std::string> QVTestSensor::claimants() const {
  std::istringstream answer(call("GetInternalProperty", {"s", "AccelerometerOwners"}));
  std::string signature;
  std::size_t count = 0;
  answer >> signature;
  if (signature == "v") answer >> signature;
  answer >> count;
  std::vector<std::string> names;
  for (std::string name; answer >> name;) names.push_back(name.substr(1, name.size() - 2));
  if (names.size() != count) throw std::runtime_error("not a list: " + answer.str());
  return names;
}

void QVTestSensor::addMethod(const std::string& name, const std::string& body) const {
  call("AddMethod", {"sssss", kName, name, "", "", body});
}

void QVTestSensor::addProperty(const std::string& name, const std::string& signature,
                               const std::string& value) const {
  call("AddProperty", {"ssv", kName, name, signature, value});
}

void QVTestSensor::changeProperty(const std::string& name, const std::string& signature,
                                  const std::string& value) const {
  call("UpdateProperties", {"sa{sv}", kName, "1", name, signature, value});
}

std::string QVTestSensor::call(const std::string& member,
                               const std::vector<std::string>& arguments) const {
  std::vector<std::string> command{
      "busctl", "--address=" + busAddress_, "call", kName, kPath, kMockInterface, member};
  command.insert(command.end(), arguments.begin(), arguments.end());
  return run(command);
}
