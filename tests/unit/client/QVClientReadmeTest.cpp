// The example that people read is the one that is compiled.

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

namespace {

std::string contentsOf(const std::string& path) {
  std::ifstream file(std::filesystem::path(QV_SOURCE_DIRECTORY) / path);
  EXPECT_TRUE(file) << path;
  std::ostringstream contents;
  contents << file.rdbuf();
  return contents.str();
}

TEST(QVClientReadme, ShowsTheExampleThatIsCompiled) {
  const std::string readme = contentsOf("client/README.md");
  const std::string example = contentsOf("client/examples/QVClientExample.cpp");
  const std::size_t main = example.find("int main()");
  ASSERT_NE(main, std::string::npos);
  EXPECT_NE(readme.find("```cpp\n" + example.substr(main) + "```"), std::string::npos);
}

}  // namespace
