#pragma once

#include <string>
#include <string_view>

// Adds entries of a payload to those that there are, of equal keys the later one alone, as the
// service adds a configuration to the one that it has. Both as QVClientPayload::entries() gives
// them. Pure; any thread.
std::string QVReporterMergedConfiguration(std::string_view earlier, std::string_view later);
