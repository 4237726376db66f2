#pragma once

#include <string>
#include <string_view>

// Text as pairs of hexadecimal digits, as authentication and server IDs are written. Pure; any
// thread.
std::string QVBusToHexadecimal(std::string_view bytes);
// Appends the bytes to `out`; false where the text is no row of pairs of digits.
[[nodiscard]] bool QVBusFromHexadecimal(std::string_view text, std::string& out);
