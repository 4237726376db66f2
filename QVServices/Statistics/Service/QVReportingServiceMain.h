#pragma once

// The service's entry point: makes the delegate, gives it to the installed platform's listener and
// serves clients on the calling thread until the platform ends the service. Answers the exit
// status.
int QVReportingServiceMain();
