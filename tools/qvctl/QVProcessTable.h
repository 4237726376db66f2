#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <sys/types.h>

// What /proc says about processes. Of other users' processes an ordinary user sees the names, and
// not what they have open. Plain functions; any thread.
struct QVProcessTable {
  static std::vector<pid_t> all();
  // "quietvoxd"; empty where there is no such process.
  static std::string name(pid_t pid);
  // Whose rights it has; nothing where there is no such process.
  static std::optional<uid_t> user(pid_t pid);
  // In microseconds since 1970.
  static std::optional<int64_t> startTime(pid_t pid);

  // Which processes have the sockets open, by the sockets' inodes; those that this user may look
  // into. `hidden` is set to the others.
  static std::map<uint32_t, std::vector<pid_t>> holders(const std::set<uint32_t>& sockets,
                                                        std::vector<pid_t>& hidden);
};
