#pragma once

#include <filesystem>
#include <fstream>
#include <string>

// Puts a file where readers look for it, whole and at once, in place of an earlier one: as a
// publisher does.
inline void QVPublishBytes(const std::filesystem::path& file, const std::string& bytes) {
  const std::filesystem::path made = file.parent_path() / ("." + file.filename().string());
  std::ofstream(made, std::ios::binary) << bytes;
  std::filesystem::rename(made, file);
}
