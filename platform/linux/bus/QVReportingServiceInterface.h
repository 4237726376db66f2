#pragma once

#include "platform/linux/bus/QVBusMemberDescription.h"

#include <array>
#include <cstddef>
#include <string_view>

// QVReportingServiceProtocol as it is seen on the wire. Shared by service and client library.

inline constexpr std::string_view kReportingServicePath = "/net/quillon/quietvox/ReportingService";
inline constexpr std::string_view kReportingServiceInterface =
    "net.quillon.quietvox.ReportingService";

// The text of the error of a message that is refused because reporting is switched off.
inline constexpr std::string_view kReportingSwitchedOffText = "reporting is switched off";

enum class QVReportingServiceOperation : std::size_t {
  createReportingSession,
  setServiceType,
  getServiceNameForReporterID,
  setConfiguration,
  startReportingSessionForID,
  sendMessage,
  stopReportingSessionForID,
  destroyReportingSession,
  reporterIDValid,
  getAllReporters,
  killService
};

// In the order of QVReportingServiceOperation.
inline constexpr std::array<QVBusMemberDescription, 11> kReportingServiceMembers{{
    {kReportingServiceInterface, "CreateReportingSession", "x", "reporterID", "b", "handled"},
    {kReportingServiceInterface, "SetServiceType", "qx", "serviceType reporterID", "b", "handled"},
    {kReportingServiceInterface, "GetServiceNameForReporterID", "x", "reporterID", "q",
     "serviceType"},
    {kReportingServiceInterface, "SetConfiguration", "a{sv}x", "configuration reporterID", "b",
     "handled"},
    {kReportingServiceInterface, "StartReportingSessionForID", "x", "reporterID", "b", "handled"},
    {kReportingServiceInterface, "SendMessage", "a{sv}uqbax",
     "message category type everySession reporterIDs", "", ""},
    {kReportingServiceInterface, "StopReportingSessionForID", "x", "reporterID", "b", "handled"},
    {kReportingServiceInterface, "DestroyReportingSession", "x", "reporterID", "b", "handled"},
    {kReportingServiceInterface, "ReporterIDValid", "x", "reporterID", "a{sv}", "validity"},
    {kReportingServiceInterface, "GetAllReporters", "", "", "ax", "reporterIDs"},
    {kReportingServiceInterface, "KillService", "", "", "b", "handled"},
}};
