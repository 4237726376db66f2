#pragma once

#include <filesystem>
#include <string>

// Who may do with a file what its permissions refuse to this user, for the end of a message:
// "; members of the group quietvox-client may", "; the user root may". `mode` is what was wanted,
// as for access(). Where a directory on the way cannot be searched, it is who may do that. Empty
// where it is not to be seen, or nobody's. Threads: one at a time.
std::string QVWhoMay(const std::filesystem::path& path, int mode);
