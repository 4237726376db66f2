#pragma once

#include <memory>
#include <optional>
#include <string>

// One audio driver as its statistics channels are published: a group and a subgroup, either of
// which may be absent. Immutable; any thread.
class QVReportingDriver {
 public:
  using Name = std::optional<std::string>;

  static std::shared_ptr<const QVReportingDriver> driverWithGroupName(Name groupName,
                                                                      Name subGroupName);

  const Name& groupName() const { return groupName_; }
  const Name& subGroupName() const { return subGroupName_; }

  // "GROUP-SUBGROUP", an absent name being "(null)". Names the driver in a snapshot.
  std::string description() const;

 private:
  QVReportingDriver(Name groupName, Name subGroupName);

  const Name groupName_;
  const Name subGroupName_;
};
