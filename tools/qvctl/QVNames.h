#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Names of service types, categories and message types, for people: those of the service's
// vocabulary, with "." between a category's component and kind. What has no name is its number.
// Every name is accepted in any case, and every number, decimal or 0x. Pure; any thread.

std::string QVServiceTypeText(uint16_t serviceType);
std::optional<uint16_t> QVParseServiceType(std::string_view text);

// "Session.Playback", "Playback", "0x12340003".
std::string QVCategoryText(uint32_t category);
// A message's category as it is sent: "Session.Playback", "session_playback", "Playback" for one
// without a component.
std::optional<uint32_t> QVParseCategory(std::string_view text);

// The low half of a category, which is all that the store keeps of a message's: "Playback",
// "Summary" for the message that a session ends with, 4711.
std::string QVKindText(uint16_t kind);

std::string QVMessageTypeText(uint16_t type);
std::optional<uint16_t> QVParseMessageType(std::string_view text);

// Which categories are meant by a name in a filter: a kind, whatever the component ("Playback"); a
// component, whatever the kind ("Session"); or both ("Session.Playback").
struct QVCategoryPattern {
  uint32_t word = 0;
  uint32_t mask = 0;

  bool matches(uint32_t category) const { return (category & mask) == word; }
  // For where the component is not known.
  bool matchesKind(uint16_t kind) const;

  static std::optional<QVCategoryPattern> parse(std::string_view text);
};
