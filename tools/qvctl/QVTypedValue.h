#pragma once

#include "client/QVClientPayload.h"
#include "platform/QVValue.h"

#include <string>
#include <string_view>
#include <vector>

// A message's or configuration's entries as they are typed on a command line:
//
//   frames=480 gain=1.5 flag=true route=speaker     an integer, a double, a boolean, a string
//   name:string=5 gain:double=1 device:json={"a":[1,2]}     the kind is given: int, uint, double,
//                                                           bool, string, json
//
// Without a kind, an integer in decimal, a double, "true" and "false" are what they look like, all
// else is a string. The first "=" ends the key; a ":" in it begins the kind.
//
// Threads: any; plain functions. Failures: QVToolFailure, wrongUsage, naming the entry.
struct QVTypedValue {
  std::string key;
  QVValue value;

  static QVTypedValue parse(std::string_view entry);
};

// What a payload is for, in the texts of failures.
enum class QVPayloadOf { message, configuration };

// The entries in the form in which they are sent, with those of `json` before them: a JSON object's
// text, or "-" for what standard input holds, or "@FILE"; empty for none. Of equal keys the last
// one counts.
QVClientPayload QVMakePayload(QVPayloadOf use, const std::string& json,
                              const std::vector<std::string>& entries);
