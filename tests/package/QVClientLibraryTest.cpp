// The shared client library: what it exports, and what it needs.

#include "tests/support/QVSubprocess.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <regex>
#include <set>
#include <sstream>
#include <string>

#include <gmock/gmock.h>

namespace {

using ::testing::IsEmpty;
using ::testing::IsSupersetOf;
using ::testing::Not;

constexpr const char* kLibrary = QV_BUILD_DIRECTORY "/lib/libquietvox-client.so";
constexpr const char* kHeaders = QV_BUILD_DIRECTORY "/include/quietvox";

std::string outputOf(const std::vector<std::string>& command) {
  const auto output = QVSubprocess::run(command);
  EXPECT_EQ(output.status, 0) << output.text;
  return output.text;
}

// The first group of each match in a text.
std::vector<std::string> matches(const std::string& text, const char* pattern) {
  const std::regex expression(pattern);
  std::vector<std::string> found;
  for (std::sregex_iterator match(text.begin(), text.end(), expression), end; match != end;
       ++match) {
    found.push_back((*match)[1].str());
  }
  return found;
}

// What the public headers mark as offered to programs: names of classes and functions.
std::set<std::string> offeredNames() {
  static const std::regex kPreprocessor(R"(#[^\n]*)");
  static const std::regex kAfterTheName(R"(\bfinal\b|[^:]:[^:].*)");
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(kHeaders)) {
    std::ostringstream text;
    text << std::ifstream(entry.path()).rdbuf();
    const std::string code = std::regex_replace(text.str(), kPreprocessor, "");
    for (const std::string& declaration : matches(code, R"(QV_CLIENT_API\s+([^;{(]*))")) {
      // Its last word: "class Name final : Base", "std::string_view name(".
      const auto words = matches(std::regex_replace(declaration, kAfterTheName, ""), R"((\w+))");
      if (!words.empty()) names.insert(words.back());
    }
  }
  return names;
}

// What the library exports: the first name of each symbol, as in "QVClient::flush()".
std::set<std::string> exportedNames(const std::string& symbols) {
  std::set<std::string> names;
  for (const std::string& name : matches(
           symbols,
           R"((?:^|\n)[0-9a-f]* *[A-Z] (?:typeinfo for |typeinfo name for |vtable for )?(\w+))")) {
    names.insert(name);
  }
  names.erase("QUIETVOX_CLIENT_0");
  return names;
}

TEST(QVClientLibraryTest, ExportsWhatItsHeadersOfferAndNothingElse) {
  const auto exported = exportedNames(outputOf({"nm", "-DC", "--defined-only", kLibrary}));
  EXPECT_THAT(exported, IsSupersetOf({std::string("QVClient"), std::string("QVClientPayload")}));
  EXPECT_EQ(exported, offeredNames());
}

TEST(QVClientLibraryTest, GivesEachSymbolTheVersionOfTheInterface) {
  std::istringstream symbols(outputOf({"nm", "-D", "--defined-only", kLibrary}));
  std::vector<std::string> without;
  std::string line;
  int count = 0;
  while (std::getline(symbols, line)) {
    ++count;
    if (line.find("@@QUIETVOX_CLIENT_") == std::string::npos &&
        line.find(" A QUIETVOX_CLIENT_") == std::string::npos) {
      without.push_back(line);
    }
  }
  EXPECT_GT(count, 1);
  EXPECT_THAT(without, IsEmpty());
}

TEST(QVClientLibraryTest, NeedsNothingButTheLanguagesLibraries) {
  const auto dynamic = outputOf({"readelf", "-d", kLibrary});
  EXPECT_EQ(matches(dynamic, R"(SONAME\).*\[(.*)\])"),
            std::vector<std::string>{"libquietvox-client.so.0"});
  const auto needed = matches(dynamic, R"(NEEDED\).*\[(.*)\])");
  EXPECT_THAT(needed, Not(IsEmpty()));
  // Those of a sanitizer belong to its build.
  static const std::regex kAllowed(
      R"((libstdc\+\+|libgcc_s|libc|libm|ld-linux\S*|lib\w*san)\.so\.\d+)");
  for (const std::string& library : needed)
    EXPECT_TRUE(std::regex_match(library, kAllowed)) << library;
}

}  // namespace
