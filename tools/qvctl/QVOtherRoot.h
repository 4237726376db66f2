#pragma once

#include "platform/linux/QVDescriptor.h"

#include <filesystem>

// The files of a system whose root directory is another one (--root). Whoever has a say in that
// system lays its links, and one of an image would lead into this system: none is followed. The way
// is gone part by part, from descriptor to descriptor, so that one that is laid meanwhile is not
// followed either. The root directory itself may be reached by links; they are this system's.
//
// Plain functions; any thread. Failures: QVToolFailure, that names the link.
struct QVOtherRoot {
  // The directory, to be used with openat() and the like; where it is not open, errno says why.
  // The path begins with that of the root.
  static QVDescriptor open(const std::filesystem::path& root,
                           const std::filesystem::path& directory);
  // The same, and makes what is missing of it.
  static QVDescriptor make(const std::filesystem::path& root,
                           const std::filesystem::path& directory);
  // Fails where the file is a link, or lies behind one; it need not be there, nor be this user's to
  // look at.
  static void refuseLinks(const std::filesystem::path& root, const std::filesystem::path& file);
};
