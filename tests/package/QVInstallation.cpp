#include "tests/package/QVInstallation.h"

#include <sstream>
#include <stdexcept>

QVInstallation::QVInstallation(const std::vector<std::string>& components) {
  for (const std::string& component : components) {
    const auto installed =
        QVSubprocess::run({"cmake", "--install", QV_BUILD_DIRECTORY, "--component", component,
                           "--prefix", prefix().string()});
    if (installed.status != 0) throw std::runtime_error(installed.text);
  }
}

std::vector<std::string> QVInstallation::pkgConfig(const std::vector<std::string>& options) const {
  std::vector<std::string> command{"env", "PKG_CONFIG_PATH=" + (libraries() / "pkgconfig").string(),
                                   "pkg-config",
                                   // Where it was built for is not where it is.
                                   "--define-variable=prefix=" + prefix().string()};
  command.insert(command.end(), options.begin(), options.end());
  command.emplace_back("quietvox-client");
  const auto answer = QVSubprocess::run(command);
  if (answer.status != 0) throw std::runtime_error(answer.text);
  std::istringstream words(answer.text);
  return {std::istream_iterator<std::string>(words), {}};
}

std::vector<std::string> QVInstallation::compiler(Language language) {
  std::vector<std::string> command{language == Language::c ? QV_C_COMPILER : QV_CXX_COMPILER,
                                   language == Language::c ? "-std=c99" : "-std=c++20",
                                   "-Wall",
                                   "-Wextra",
                                   "-Wpedantic",
                                   "-Werror"};
  if (*QV_SANITIZE != '\0') command.emplace_back("-fsanitize=" QV_SANITIZE);
  return command;
}
