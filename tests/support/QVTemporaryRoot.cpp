#include "tests/support/QVTemporaryRoot.h"

#include <cstdlib>
#include <fstream>
#include <stdexcept>

QVTemporaryRoot::QVTemporaryRoot() {
  std::string name = (std::filesystem::temp_directory_path() / "quietvox-XXXXXX").string();
  if (::mkdtemp(name.data()) == nullptr) throw std::runtime_error("cannot make " + name);
  path_ = name;
  for (const auto& folder : {runtime(), state(), logs(), configuration()}) {
    std::filesystem::create_directory(folder);
  }
}

QVTemporaryRoot::~QVTemporaryRoot() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

void QVTemporaryRoot::configure(const std::filesystem::path& file, const std::string& text) const {
  const std::filesystem::path target = configuration() / file;
  std::filesystem::create_directories(target.parent_path());
  std::ofstream(target) << text;
}
