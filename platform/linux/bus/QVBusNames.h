#pragma once

#include <string_view>

// Are these what the protocol allows as names? Pure; any thread.

// "/" or "/element/element": elements of letters, digits and "_".
bool QVBusIsValidObjectPath(std::string_view path) noexcept;
// Two elements or more between dots, of letters, digits and "_", none beginning with a digit; at
// most 255 characters. Error names follow the same rule.
bool QVBusIsValidInterfaceName(std::string_view name) noexcept;
// One such element.
bool QVBusIsValidMemberName(std::string_view name) noexcept;
// A unique name (":1.42") or a well-known one; "-" is allowed here.
bool QVBusIsValidBusName(std::string_view name) noexcept;
