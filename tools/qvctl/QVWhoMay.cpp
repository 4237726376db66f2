#include "tools/qvctl/QVWhoMay.h"

#include <cerrno>

#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Bits that a file's mode has for the group and for the owner, above those for others.
constexpr unsigned kGroupShift = 3;
constexpr unsigned kOwnerShift = 6;

// The names of the system; there is one thread that asks.
// NOLINTBEGIN(concurrency-mt-unsafe)
std::string groupName(gid_t number) {
  const group* const found = ::getgrgid(number);
  return found == nullptr ? std::to_string(number) : found->gr_name;
}

std::string userName(uid_t number) {
  const passwd* const found = ::getpwuid(number);
  return found == nullptr ? std::to_string(number) : found->pw_name;
}
// NOLINTEND(concurrency-mt-unsafe)

// The first directory on the way that this user may not search; else the file itself.
std::filesystem::path obstacle(const std::filesystem::path& path, int& mode) {
  std::filesystem::path above;
  for (const auto& part : path.parent_path()) {
    above /= part;
    if (::access(above.c_str(), X_OK) == 0 || errno != EACCES) continue;
    mode = X_OK;
    return above;
  }
  return path;
}

}  // namespace

std::string QVWhoMay(const std::filesystem::path& path, int mode) {
  struct stat file {};
  const std::filesystem::path refused = obstacle(path, mode);
  if (::stat(refused.c_str(), &file) != 0) return {};
  const auto wanted = static_cast<unsigned>(mode);
  const auto has = [&](unsigned shift) { return (file.st_mode >> shift & wanted) == wanted; };
  if (has(kGroupShift)) return "; members of the group " + groupName(file.st_gid) + " may";
  if (has(kOwnerShift)) return "; the user " + userName(file.st_uid) + " may";
  return {};
}
