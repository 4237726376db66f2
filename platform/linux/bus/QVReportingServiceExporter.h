#pragma once

#include "platform/linux/bus/QVBusCall.h"
#include "platform/linux/bus/QVBusStandardInterfaces.h"
#include "platform/linux/bus/QVBusValueDecoder.h"
#include "platform/linux/bus/QVReportingServiceInterface.h"

// Exports QVReportingServiceProtocol: finds the operation that a call names, checks and unmarshals
// its arguments, calls the object, and gives the reply callbacks that marshal the results. Calls of
// other interfaces go to the standard ones.
//
// Threads: the IPC thread; reply callbacks run anywhere.
class QVReportingServiceExporter {
 public:
  // Carries the call out. Null, or the rule of the protocol that its body breaks; then nothing has
  // been done.
  [[nodiscard]] const char* handle(const QVBusCall& call);

 private:
  const char* perform(QVReportingServiceOperation operation, const QVBusCall& call);
  const char* performOnReporter(QVReportingServiceOperation operation, const QVBusCall& call);
  const char* setServiceType(const QVBusCall& call);
  const char* setConfiguration(const QVBusCall& call);
  const char* sendMessage(const QVBusCall& call);

  QVBusValueDecoder decoder_;
  QVBusStandardInterfaces standardInterfaces_;
};
