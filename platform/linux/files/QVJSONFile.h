#pragma once

#include "platform/QVValue.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

// Reads configuration files and other JSON text into values. Such text is foreign: it is taken in
// without recursion, and its size and nesting are limited. Numbers keep their kind (12 is an
// integer, 12.0 a double); of equal keys the later wins.
//
// Threads: any; plain functions.

// Why a text or a file could not be read. Where the text itself is at fault, line and column say
// where, from 1; the column counts bytes.
struct QVJSONFailure {
  std::string reason;
  std::size_t line = 0;
  std::size_t column = 0;
  bool missing = false;  // there is no such file
  bool passing = false;  // descriptors or memory are short: it may be read later

  // "line 3, column 7: reason", or the reason alone.
  std::string description() const;
};

struct QVJSONFile {
  // Bytes of a file, far above any configuration a person writes.
  static constexpr std::size_t kMaximumBytes = std::size_t{4} * 1024 * 1024;
  // Arrays and objects within one another.
  static constexpr std::size_t kMaximumDepth = 64;

  // The text's value; nothing, with `failure` filled, where it is no JSON or breaks a limit.
  [[nodiscard]] static std::optional<QVValue> parse(std::string_view text, QVJSONFailure& failure);
  // The same for a file, which has to be a regular one.
  [[nodiscard]] static std::optional<QVValue> read(const std::string& path, QVJSONFailure& failure);
  // The same where the value has to be an object.
  [[nodiscard]] static std::optional<QVDictionary> readDictionary(const std::string& path,
                                                                  QVJSONFailure& failure);
};
