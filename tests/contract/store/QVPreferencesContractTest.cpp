#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/settings/QVJSONPreferences.h"
#include "tests/support/QVDescriptorLimit.h"
#include "tests/support/QVTemporaryRoot.h"

#include <filesystem>
#include <thread>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kDomain = "net.quillon.quietvox";

class FakePreferencesHarness {
 public:
  QVPreferences& preferences() { return preferences_; }
  // Makes the domain hold what this JSON object says.
  void setDomain(const std::string& domain, const std::string& text) {
    QVJSONFailure failure;
    preferences_.setValues(domain, QVJSONFile::parse(text, failure).value().dictionary());
  }
  void removeDomain(const std::string& domain) { preferences_.setValues(domain, {}); }

 private:
  QVFakePreferences preferences_;
};

class JSONPreferencesHarness {
 public:
  QVJSONPreferences& preferences() { return preferences_; }
  void setDomain(const std::string& domain, const std::string& text) {
    root_.configure(file(domain), text);
  }
  void removeDomain(const std::string& domain) {
    std::filesystem::remove(root_.configuration() / file(domain));
  }
  std::string path(const std::string& domain) const {
    return (root_.configuration() / file(domain)).string();
  }
  std::vector<std::string> lines() const { return log_.renderings(); }

 private:
  static std::filesystem::path file(const std::string& domain) {
    return "preferences/" + domain + ".json";
  }

  QVTemporaryRoot root_;
  QVFakeLog log_;
  QVJSONPreferences preferences_{log_, (root_.configuration() / "preferences").string()};
};

template <class Harness>
class QVPreferencesContract : public testing::Test {
 protected:
  QVDictionary values(const std::string& domain) {
    return harness_.preferences().valuesInDomain(domain);
  }
  Harness harness_;
};

using Harnesses = testing::Types<FakePreferencesHarness, JSONPreferencesHarness>;
TYPED_TEST_SUITE(QVPreferencesContract, Harnesses);

TYPED_TEST(QVPreferencesContract, HasNoDomainAtFirst) {
  EXPECT_TRUE(this->values(kDomain).isAbsent());
  EXPECT_TRUE(this->values("").isAbsent());
}

TYPED_TEST(QVPreferencesContract, AnswersEverythingInTheDomain) {
  this->harness_.setDomain(kDomain, R"({"device_name": "kitchen", "disable_reporting": true,
                                        "list": ["a", 1], "rate": 44100.0})");
  this->harness_.setDomain("other", R"({"device_name": "other"})");
  EXPECT_EQ(this->values(kDomain), (QVDictionary{{"device_name", "kitchen"},
                                                 {"disable_reporting", true},
                                                 {"list", QVArray{"a", 1}},
                                                 {"rate", 44100.0}}));
}

TYPED_TEST(QVPreferencesContract, TellsAnEmptyDomainFromNone) {
  this->harness_.setDomain(kDomain, "{}");
  EXPECT_FALSE(this->values(kDomain).isAbsent());
  EXPECT_TRUE(this->values(kDomain).empty());
}

TYPED_TEST(QVPreferencesContract, ShowsAChangeAtTheNextReading) {
  this->harness_.setDomain(kDomain, R"({"a": 1})");
  const QVDictionary before = this->values(kDomain);
  this->harness_.setDomain(kDomain, R"({"b": 2})");
  EXPECT_EQ(this->values(kDomain), (QVDictionary{{"b", 2}}));
  this->harness_.removeDomain(kDomain);
  EXPECT_TRUE(this->values(kDomain).isAbsent());
  EXPECT_EQ(before, (QVDictionary{{"a", 1}}));
}

TYPED_TEST(QVPreferencesContract, IsReadByManyThreads) {
  this->harness_.setDomain(kDomain, R"({"a": 1})");
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this] {
      for (int i = 0; i < 200; ++i) EXPECT_EQ(this->values(kDomain), (QVDictionary{{"a", 1}}));
    });
  }
  for (std::thread& thread : threads) thread.join();
}

// What only files have.

class QVJSONPreferencesTest : public testing::Test {
 protected:
  QVDictionary values(std::string_view domain) {
    return harness_.preferences().valuesInDomain(domain);
  }
  // While this process gets no descriptor.
  QVDictionary valuesForWantOfDescriptors(std::string_view domain) {
    const QVDescriptorLimit noMore;
    return values(domain);
  }
  JSONPreferencesHarness harness_;
};

TEST_F(QVJSONPreferencesTest, CountsAFileThatIsNoJSONAsEmptyAndSaysWhy) {
  harness_.setDomain(kDomain, "{\n  \"a\": 1\n  \"b\": 2\n}");
  EXPECT_FALSE(values(kDomain).isAbsent());
  EXPECT_TRUE(values(kDomain).empty());
  EXPECT_THAT(
      harness_.lines(),
      ElementsAre("3[default] -[QVJSONPreferences valuesInDomain:]: cannot read preferences " +
                  harness_.path(kDomain) +
                  ": line 3, column 3: Missing a comma or '}' after an object member."));
}

TEST_F(QVJSONPreferencesTest, SaysTheSameOfTheSameFileOnlyOnce) {
  harness_.setDomain(kDomain, "[]");
  values(kDomain);
  values(kDomain);
  EXPECT_THAT(harness_.lines(), testing::SizeIs(1));
  harness_.setDomain(kDomain, "{}");
  values(kDomain);
  harness_.setDomain(kDomain, "[]");
  values(kDomain);
  EXPECT_THAT(harness_.lines(), testing::SizeIs(2));
  harness_.setDomain(kDomain, "{");
  values(kDomain);
  EXPECT_THAT(harness_.lines(), testing::SizeIs(3));
}

TEST_F(QVJSONPreferencesTest, LooksForDomainsInItsDirectoryOnly) {
  harness_.setDomain(".._secret", R"({"a": 1})");
  EXPECT_EQ(values("../secret"), (QVDictionary{{"a", 1}}));
  EXPECT_EQ(values(std::string_view("..\0secret", 9)), (QVDictionary{{"a", 1}}));
  EXPECT_TRUE(values("../../etc/passwd").isAbsent());
  EXPECT_THAT(harness_.lines(), IsEmpty());
}

TEST_F(QVJSONPreferencesTest, SaysThatADomainIsADirectory) {
  std::filesystem::create_directories(harness_.path(kDomain));
  EXPECT_TRUE(values(kDomain).empty());
  EXPECT_THAT(harness_.lines(), ElementsAre(testing::EndsWith(": not a regular file")));
}

TEST_F(QVJSONPreferencesTest, KeepsToWhatItReadWhileDescriptorsAreShort) {
  if (kObjectsNeedDescriptors) GTEST_SKIP() << "the sanitizer needs the descriptors";
  harness_.setDomain(kDomain, R"({"disable_reporting": true})");
  harness_.setDomain("other", R"({"a": 1})");
  values(kDomain);
  EXPECT_EQ(values("other"), (QVDictionary{{"a", 1}}));
  EXPECT_EQ(valuesForWantOfDescriptors(kDomain), (QVDictionary{{"disable_reporting", true}}));
  EXPECT_EQ(valuesForWantOfDescriptors(kDomain), (QVDictionary{{"disable_reporting", true}}));
  EXPECT_THAT(
      harness_.lines(),
      ElementsAre("3[default] -[QVJSONPreferences valuesInDomain:]: cannot read preferences " +
                  harness_.path(kDomain) + ": Too many open files"));
  harness_.setDomain(kDomain, R"({"disable_reporting": false})");
  EXPECT_EQ(values(kDomain), (QVDictionary{{"disable_reporting", false}}));
  EXPECT_EQ(valuesForWantOfDescriptors(kDomain), (QVDictionary{{"disable_reporting", false}}));
}

TEST_F(QVJSONPreferencesTest, KeepsToNothingOfAFileThatIsNotReadYetOrGoneOrBroken) {
  if (kObjectsNeedDescriptors) GTEST_SKIP() << "the sanitizer needs the descriptors";
  harness_.setDomain(kDomain, R"({"a": 1})");
  EXPECT_EQ(valuesForWantOfDescriptors(kDomain), QVDictionary::assemble({}));
  EXPECT_EQ(values(kDomain), (QVDictionary{{"a", 1}}));
  harness_.removeDomain(kDomain);
  EXPECT_TRUE(values(kDomain).isAbsent());
  EXPECT_EQ(valuesForWantOfDescriptors(kDomain), QVDictionary::assemble({}));
  harness_.setDomain(kDomain, R"({"a": 1})");
  EXPECT_EQ(values(kDomain), (QVDictionary{{"a", 1}}));
  harness_.setDomain(kDomain, R"({"a": )");
  values(kDomain);
  EXPECT_EQ(valuesForWantOfDescriptors(kDomain), QVDictionary::assemble({}));
}

}  // namespace
