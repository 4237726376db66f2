#pragma once

#include <cstddef>
#include <string>
#include <string_view>

// Bytes of encoded entries that one configuration of a session, and what is kept for the session's
// restoration, may have. The service keeps as many bytes, counted as it keeps them.
inline constexpr std::size_t kQVReporterMaximumConfigurationBytes = std::size_t{64} << 10;

// Adds entries of a payload to those that there are, of equal keys the later one alone, as the
// service adds a configuration to the one that it has. Both as QVClientPayload::entries() gives
// them. Pure; any thread.
std::string QVReporterMergedConfiguration(std::string_view earlier, std::string_view later);
