#pragma once

#include <cstddef>
#include <string>
#include <string_view>

// Text for people. What comes from the store, from files and from other processes is hostile: it
// may hold anything that makes a terminal do something. Pure functions; any thread.

// The text with everything that is not to be seen written out: control characters as \n, \t or
// \x1B, characters that change the direction of text as \u202E, bytes that are no UTF-8 as \xFF.
// One line stays one line.
std::string QVDisplayText(std::string_view text);

// The same for JSON text, which stays JSON with the same contents: the control characters above
// 0x7F and those that change the direction of text become \u escapes. (JSON text holds such
// characters in its strings alone, and those below 0x20 not at all.)
std::string QVDisplayJSON(std::string_view text);

// Bytes of the text but for a last character of which the end is missing: where text that comes in
// parts can be cut.
std::size_t QVWholeCharacters(std::string_view text);

// Columns that a text takes on a terminal: wide characters two, combining ones none.
std::size_t QVDisplayWidth(std::string_view text);

// The text's beginning that fits into so many columns, with "…" in place of what is left out.
std::string QVClippedText(std::string_view text, std::size_t columns);
