#pragma once

#include <string>
#include <string_view>

// The reporting switch as the service's preference file says it: {"disable_reporting": true}. Read
// as the service reads it: true, a number other than 0, and "true", "yes" and "1" in any case
// switch reporting off; every other value, no file, one that is no JSON object, no regular file or
// larger than 4 MiB leaves it on.
//
// Threads: any; plain functions.
bool QVReportingIsSwitchedOff(std::string_view text);
bool QVReportingIsSwitchedOffByFile(const std::string& path);
