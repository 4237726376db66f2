#pragma once

#include "platform/QVValue.h"
#include "platform/linux/bus/QVBusWriter.h"
#include "platform/linux/bus/QVReportingServiceInterface.h"

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

// A call that a peer makes, by default of the service's own interface.
struct QVPeerCall {
  std::string member;
  std::string signature = {};
  std::function<void(QVBusWriter&)> body = nullptr;
  uint8_t flags = 0;
  std::string path = std::string(kReportingServicePath);
  std::string interface { kReportingServiceInterface };

  std::string bytes(uint32_t serial) const;
};

// The calls of the standard interface that the IPC thread answers at once.
QVPeerCall pingCall();

// The calls of the service's interface.
QVPeerCall createCall(int64_t reporterID);
QVPeerCall setServiceTypeCall(uint16_t serviceType, int64_t reporterID);
QVPeerCall getServiceTypeCall(int64_t reporterID);
QVPeerCall configureCall(const QVDictionary& configuration, int64_t reporterID);
QVPeerCall startCall(int64_t reporterID);
QVPeerCall sendCall(const QVDictionary& message, std::vector<int64_t> reporterIDs,
                    uint32_t category, uint16_t type);
QVPeerCall sendToAllCall(const QVDictionary& message, uint32_t category, uint16_t type);
QVPeerCall stopCall(int64_t reporterID);
QVPeerCall destroyCall(int64_t reporterID);
QVPeerCall validateCall(int64_t reporterID);
QVPeerCall listCall();
QVPeerCall killCall();
