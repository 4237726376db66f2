// The examples that people read are those that are compiled.

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

TEST(QVClientReadme, ShowsTheExamplesThatAreCompiled) {
  const std::string readme = contentsOf("client/README.md");
  for (const char* file : {"qv_ten_lines.cpp", "QVClientExample.cpp"}) {
    const std::string example = contentsOf(std::string("client/examples/").append(file));
    const std::size_t main = example.find("int main()");
    ASSERT_NE(main, std::string::npos);
    EXPECT_NE(readme.find("```cpp\n" + example.substr(main) + "```"), std::string::npos) << file;
  }
}

}  // namespace
