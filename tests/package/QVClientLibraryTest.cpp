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

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::IsEmpty;
using ::testing::IsSupersetOf;
using ::testing::Not;

constexpr const char* kLibrary = QV_BUILD_DIRECTORY "/lib/libquietvox-client.so";
constexpr const char* kHeaders = QV_BUILD_DIRECTORY "/include/quietvox";

// Of the symbols of C++: programs run with this release's library alone.
constexpr const char* kCxxVersion = "QUIETVOX_CLIENT_CXX_" QV_VERSION;

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

std::string textOf(const std::filesystem::path& file) {
  std::ostringstream text;
  text << std::ifstream(file).rdbuf();
  return text.str();
}

// What the public headers mark as offered to programs: names of classes and functions.
std::set<std::string> offeredNames() {
  static const std::regex kPreprocessor(R"(#[^\n]*)");
  static const std::regex kAfterTheName(R"(\bfinal\b|[^:]:[^:].*)");
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(kHeaders)) {
    const std::string code = std::regex_replace(textOf(entry.path()), kPreprocessor, "");
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
    if (!name.starts_with("QUIETVOX_CLIENT_")) names.insert(name);
  }
  return names;
}

// The library's symbols as "name@version", without those that stand for a version itself.
std::set<std::string> exportedSymbols() {
  std::set<std::string> symbols;
  for (const std::string& symbol :
       matches(outputOf({"nm", "-D", "--defined-only", kLibrary}), R"([B-Zu] (\S+))")) {
    const std::size_t at = symbol.find('@');
    if (at == std::string::npos) {
      symbols.insert(symbol);
    } else {
      symbols.insert(symbol.substr(0, at) + symbol.substr(symbol.rfind('@')));
    }
  }
  return symbols;
}

bool isOfC(const std::string& symbol) {
  return symbol.starts_with("quietvox_");
}

std::string nameOf(const std::string& symbol) {
  return symbol.substr(0, symbol.find('@'));
}

TEST(QVClientLibraryTest, ExportsWhatItsHeadersOfferAndNothingElse) {
  const auto exported = exportedNames(outputOf({"nm", "-DC", "--defined-only", kLibrary}));
  EXPECT_THAT(exported, IsSupersetOf({std::string("QVClient"), std::string("QVClientPayload"),
                                      std::string("quietvox_reporter_open")}));
  EXPECT_EQ(exported, offeredNames());
}

TEST(QVClientLibraryTest, GivesCStableVersionsAndCxxThatOfTheRelease) {
  static const std::regex kStable(R"(\w+@QUIETVOX_CLIENT_\d\w*)");
  const std::string ofTheRelease = std::string("@").append(kCxxVersion);
  for (const std::string& symbol : exportedSymbols()) {
    if (isOfC(symbol)) {
      EXPECT_TRUE(std::regex_match(symbol, kStable)) << symbol;
    } else {
      EXPECT_THAT(symbol, EndsWith(ofTheRelease));
    }
  }
}

// Where these differ, the packages do not build, or let programs run with a library that lacks what
// they need.
TEST(QVClientLibraryTest, HasItsCFunctionsListedForPackages) {
  std::set<std::string> exported;
  std::set<std::string> offered;
  for (const std::string& symbol : exportedSymbols())
    if (isOfC(symbol)) exported.insert(symbol);
  for (const std::string& name : offeredNames())
    if (isOfC(name)) offered.insert(name);
  const std::string list = textOf(QV_SOURCE_DIRECTORY "/debian/libquietvox-client0.symbols");
  std::set<std::string> listed;
  std::set<std::string> listedNames;
  for (const std::string& symbol : matches(list, R"(\n (quietvox_\w+@\w+) [0-9.]+~(?=\n))")) {
    listed.insert(symbol);
    listedNames.insert(nameOf(symbol));
  }
  EXPECT_EQ(listed, exported);
  EXPECT_EQ(listedNames, offered);
  EXPECT_THAT(matches(list, R"(\n \(symver\)(\S+ \S+ \S+))"),
              ElementsAre(std::string(kCxxVersion) + " " QV_VERSION "~ 1"));
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
