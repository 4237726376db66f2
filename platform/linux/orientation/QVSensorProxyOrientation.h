#pragma once

#include "platform/QVLog.h"
#include "platform/linux/orientation/QVOrientationRegistrations.h"

#include <chrono>
#include <optional>
#include <string>

struct sd_bus;
struct sd_bus_message;
struct sd_bus_slot;

struct QVSensorProxyOptions {
  std::string busAddress;
  // After the connection to the bus failed or was lost, or a claim was refused or not answered;
  // doubles with each failure in a row.
  std::chrono::milliseconds firstRetry = std::chrono::seconds(1);
  // For an answer of the daemon, which the bus may have to start first.
  std::chrono::milliseconds answerLimit = std::chrono::seconds(25);
};

// The device's orientation, as the daemon net.hadess.SensorProxy tells it on the system bus. The
// bus is connected, and the accelerometer claimed, only while somebody is registered.
//
// While there is no answer to the claim yet, nothing is known. Where there is no bus, no daemon, or
// it refuses the claim or says something that names no orientation, the value is "undefined". A
// daemon that appears (again) is claimed (again); after a pause, one that refused or did not answer
// is claimed again, and a lost bus is connected again. Only the daemon that granted the claim is
// listened to, and only the bus about who that is.
//
// Made and worked by QVLinuxOrientation, on its thread, which sleeps in between until there is
// something to do. Nothing here waits. The registrations outlive it.
//
//                 demand                    granted
//   disconnected --------> claiming <----+ ---------> claimed
//        ^                  |  refused   | daemon, pause | daemon leaves
//        |                  +-------> unclaimed <--------+
//        | answered                      |               |
//        +--------- releasing <----------+---------------+ demand ends
//
// (Unclaimed, there is nothing to release: the connection is closed at once. A lost bus leads to
// disconnected from everywhere.)
class QVSensorProxyOrientation {
 public:
  static constexpr std::chrono::minutes kLongestRetry{1};

  QVSensorProxyOrientation(QVLog& log, QVSensorProxyOptions options,
                           QVOrientationRegistrations& registrations);
  // Releases the claim.
  ~QVSensorProxyOrientation();
  QVSensorProxyOrientation(const QVSensorProxyOrientation&) = delete;
  QVSensorProxyOrientation& operator=(const QVSensorProxyOrientation&) = delete;

  // Where the machine's own bus is. Asked before there are other threads.
  static std::string systemBusAddress();

  // Until when, and for what, the thread may rest.
  struct Rest {
    int descriptor = -1;  // none
    short events = 0;
    std::optional<std::chrono::steady_clock::time_point> end;
  };
  Rest rest() const;
  // Follows the demand and the bus.
  void work();

 private:
  enum class State { disconnected, claiming, claimed, unclaimed, releasing };
  struct Dispatch;

  void followDemand();
  void retry();
  void retryLater();
  int open();
  void process();
  void close();
  void lose(int error);
  int claim();
  void release();
  void finishClaim(sd_bus_message* reply);
  void finishReading(sd_bus_message* reply);
  void finishRelease(sd_bus_message* reply);
  void handleOwner(sd_bus_message* signal);
  void handleChange(sd_bus_message* signal);
  void forgetCall();
  void tell();
  void note(const std::string& trouble);

  QVLog& log_;
  const QVSensorProxyOptions options_;
  QVOrientationRegistrations& registrations_;
  QVOrientationRegistrations::Period period_ = QVOrientationRegistrations::kNoDemand;
  State state_ = State::disconnected;
  sd_bus* bus_ = nullptr;
  sd_bus_slot* call_ = nullptr;      // the call under way
  std::string owner_;                // the daemon's own name on the bus, once it granted the claim
  std::optional<int32_t> value_;     // where something is known
  std::string trouble_;              // what was noted last
  bool isOutOfMemory_ = false;       // since the handling of a message
  std::chrono::milliseconds pause_;  // before the next attempt that fails is repeated
  // When to connect, or where that is done to claim, again.
  std::optional<std::chrono::steady_clock::time_point> retryAt_;
};
