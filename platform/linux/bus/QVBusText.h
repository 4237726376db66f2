#pragma once

#include <string_view>

// Is `text` what a string on the bus may be: UTF-8 in shortest form, no surrogates, nothing above
// U+10FFFF, no NUL? Pure; any thread.
bool QVBusIsValidText(std::string_view text) noexcept;
