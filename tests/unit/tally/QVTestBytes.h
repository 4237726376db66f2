#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>

// The cell that holds a number.
template <class Number>
uint64_t QVTestCell(Number number) {
  uint64_t cell = 0;
  std::memcpy(&cell, &number, sizeof number);
  return cell;
}

template <class Number>
void QVPatch(std::string& bytes, std::size_t offset, Number number) {
  std::memcpy(bytes.data() + offset, &number, sizeof number);
}
