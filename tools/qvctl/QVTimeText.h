#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Times and durations as they are typed and shown. Times are microseconds since 1970, UTC, as the
// event store has them. Pure but for the time zone; any thread.

// "250ms", "90s", "10m", "2h", "1d", "1h30m", "1.5s"; a number alone is seconds. Nothing for
// anything else, and for what is longer than a century.
std::optional<std::chrono::microseconds> QVParseDuration(std::string_view text);

// "2026-11-21 06:20:01.5" or with "T" between, shorter forms down to the date alone, local unless a
// "Z" follows; "06:20" and "06:20:01" today; "now", "today", "yesterday"; "@1795242001" since 1970;
// and a duration, "10m", for that long before `now`. Nothing for anything else.
std::optional<int64_t> QVParseTime(std::string_view text, int64_t now);

// "20261121-062001+0100", as the names of summaries begin. Nothing for anything else.
std::optional<int64_t> QVParseStamp(std::string_view text);

// The time of the system's clock.
int64_t QVTimeNow();

// "2026-11-21 06:20:01.123456" in local time, for people; without the fraction for `precise` false.
std::string QVLocalTimeText(int64_t time, bool precise = true);
// "2026-11-21T06:20:01.123456Z", for programs.
std::string QVUniversalTimeText(int64_t time);
// "3 d 4 h", "12 min", "5 s": how long something has been.
std::string QVElapsedText(std::chrono::microseconds elapsed);
