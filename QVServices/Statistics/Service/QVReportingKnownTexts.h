#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_set>

// The texts that the payloads of one session repeat in message after message (routes, codecs,
// devices), so that each is kept once. Bounded: what a session says later, when there is no more
// room, is written out wherever it occurs.
//
// Not locked: whoever owns it does that. A text stays as it is and where it is as long as this, so
// reading it takes no lock.
class QVReportingKnownTexts {
 public:
  // Shorter ones take hardly more room than the reference to them; longer ones are rarely repeated.
  static constexpr std::size_t kShortest = 12;
  static constexpr std::size_t kLongest = 256;
  static constexpr std::size_t kMaximumTexts = 1024;

  // The one copy of the text, made where it is new; null where the text has to be written out.
  const std::string* keep(std::string_view text);

  // Bytes of memory that the texts take.
  std::size_t footprint() const { return footprint_; }
  // Bytes that they would take if each were written out as often as it was kept: what whoever
  // spells out a whole record has to reckon with.
  std::size_t writtenOut() const { return writtenOut_; }

 private:
  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>{}(text);
    }
  };

  std::unordered_set<std::string, Hash, std::equal_to<>> texts_;
  std::size_t footprint_ = 0;
  std::size_t writtenOut_ = 0;
};
