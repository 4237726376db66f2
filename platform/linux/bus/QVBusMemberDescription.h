#pragma once

#include <string_view>

// One method of an interface: its name, the signatures of its arguments and results, and their
// names, separated by blanks, for introspection.
struct QVBusMemberDescription {
  std::string_view interface;
  std::string_view member;
  std::string_view in;
  std::string_view inNames;
  std::string_view out;
  std::string_view outNames;
};
