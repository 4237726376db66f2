#pragma once

#include "tests/support/QVSubprocess.h"
#include "tests/support/QVTemporaryRoot.h"

#include <filesystem>
#include <string>
#include <vector>

// The project's installed files, in a temporary directory of their own; removed with it.
//
// Threads: the test's.
class QVInstallation {
 public:
  enum class Language { c, cxx };

  // Installs these components. Throws where that fails.
  explicit QVInstallation(const std::vector<std::string>& components);

  std::filesystem::path prefix() const { return root_.path() / "usr"; }
  std::filesystem::path headers() const { return prefix() / "include" / "quietvox"; }
  std::filesystem::path libraries() const { return prefix() / QV_LIBRARY_DIRECTORY; }
  // A place for what a test builds.
  std::filesystem::path work() const { return root_.path(); }

  // What pkg-config answers about the library, as arguments of a compiler.
  std::vector<std::string> pkgConfig(const std::vector<std::string>& options) const;

  // A compiler's command line, strict about warnings, up to what it is to compile.
  static std::vector<std::string> compiler(Language language);

 private:
  QVTemporaryRoot root_;
};
